#include "postgres/Parameters.h"

#include "Changes.h"

#include <algorithm>
#include <string_view>

namespace KivArchive::Postgres {

namespace {

// The numbers of the server's types.
constexpr std::uint32_t typeBytes = 17;
constexpr std::uint32_t typeLong = 20;
constexpr std::uint32_t typeShort = 21;

/// Numbers travel with their highest byte first.
template <class Number>
void AppendBigEndian(Bytes& bytes, Number number) {
    std::array<std::byte, sizeof(Number)> written{};
    for (std::size_t i = 0; i < written.size(); ++i)
        written[i] = static_cast<std::byte>(number >> (8 * (written.size() - 1 - i)) & 0xFFU);
    Append(bytes, written);
}

/// The header of an array with one dimension, which begins at 1.
void AppendArrayHeader(Bytes& bytes, std::uint32_t type, std::size_t count, bool mayHaveNull = false) {
    AppendBigEndian(bytes, std::uint32_t{count == 0 ? 0U : 1U});
    AppendBigEndian(bytes, std::uint32_t{mayHaveNull ? 1U : 0U});
    AppendBigEndian(bytes, type);
    if (count == 0)
        return;
    AppendBigEndian(bytes, static_cast<std::uint32_t>(count));
    AppendBigEndian(bytes, std::uint32_t{1});
}

/// Makes room as vectors grow, so that appending many takes no time that grows with their number.
void MakeRoom(Bytes& bytes, std::size_t more) {
    constexpr std::size_t least = 1024;
    if (bytes.capacity() - bytes.size() < more)
        bytes.reserve(std::max({least, 2 * bytes.capacity(), bytes.size() + more}));
}

/// @param view returns the bytes of a value, or an optional of them
template <class Values, class View>
void AppendArrayOfBytes(Bytes& array, Values const& values, View view) {
    constexpr std::size_t headerSize = 20;
    constexpr std::size_t lengthSize = 4;
    constexpr std::uint32_t lengthOfNull = UINT32_MAX;
    constexpr bool mayHaveNull = !std::is_same_v<decltype(view(*values.begin())), ByteView>;
    std::size_t size = headerSize;
    for (auto const& value : values)
        size += lengthSize + std::optional<ByteView>(view(value)).value_or(ByteView()).size();
    MakeRoom(array, size);
    AppendArrayHeader(array, typeBytes, values.size(), mayHaveNull);
    for (auto const& value : values) {
        std::optional<ByteView> const bytes = view(value);
        AppendBigEndian(array, bytes ? static_cast<std::uint32_t>(bytes->size()) : lengthOfNull);
        if (bytes)
            Append(array, *bytes);
    }
}

template <class Unsigned, class Number>
void AppendArrayOfNumbers(Bytes& array, std::uint32_t type, std::span<const Number> numbers) {
    AppendArrayHeader(array, type, numbers.size());
    for (Number const number : numbers) {
        AppendBigEndian(array, static_cast<std::uint32_t>(sizeof(Number)));
        AppendBigEndian(array, static_cast<Unsigned>(number));
    }
}

ByteView ViewOf(Id const& id) {
    return id.IsEmpty() ? ByteView() : std::as_bytes(std::span(DigestOf(id)));
}

} // namespace

Parameters& Parameters::EndOne() {
    constexpr std::size_t mostUsual = 16;
    if (ends_.empty())
        ends_.reserve(mostUsual);
    ends_.push_back(bytes_.size());
    return *this;
}

Parameters& Parameters::With(ByteView bytes) {
    MakeRoom(bytes_, bytes.size());
    Append(bytes_, bytes);
    return EndOne();
}

Parameters& Parameters::With(Id const& id) {
    return With(ViewOf(id));
}

Parameters& Parameters::With(std::int64_t number) {
    AppendBigEndian(bytes_, static_cast<std::uint64_t>(number));
    return EndOne();
}

Parameters& Parameters::With(std::string const& text) {
    return With(std::as_bytes(std::span(text)));
}

Parameters& Parameters::With(std::span<const Id> ids) {
    AppendArrayOfBytes(bytes_, ids, ViewOf);
    return EndOne();
}

Parameters& Parameters::With(std::span<const ByteView> values) {
    AppendArrayOfBytes(bytes_, values, [](ByteView value) { return value; });
    return EndOne();
}

Parameters& Parameters::With(std::span<const Bytes> values) {
    AppendArrayOfBytes(bytes_, values, [](Bytes const& value) { return ByteView(value); });
    return EndOne();
}

Parameters& Parameters::With(std::span<const std::optional<ByteView>> values) {
    AppendArrayOfBytes(bytes_, values, [](std::optional<ByteView> const& value) { return value; });
    return EndOne();
}

Parameters& Parameters::With(std::span<const std::int16_t> numbers) {
    AppendArrayOfNumbers<std::uint16_t>(bytes_, typeShort, numbers);
    return EndOne();
}

Parameters& Parameters::With(std::span<const std::int64_t> numbers) {
    AppendArrayOfNumbers<std::uint64_t>(bytes_, typeLong, numbers);
    return EndOne();
}

bool Rows::HasChanged() const noexcept {
    const char* const count = PQcmdTuples(result_.get());
    return *count != '\0' && std::string_view(count) != "0";
}

ByteView Rows::Value(int row, int column) const noexcept {
    return {reinterpret_cast<const std::byte*>(PQgetvalue(result_.get(), row, column)),
            static_cast<std::size_t>(PQgetlength(result_.get(), row, column))};
}

std::int64_t Rows::Number(int row, int column) const {
    ByteView const bytes = Value(row, column);
    if (bytes.size() != sizeof(std::int64_t))
        throw Malformed();
    std::uint64_t number = 0;
    for (std::byte const byte : bytes)
        number = number << 8U | std::to_integer<std::uint64_t>(byte);
    return static_cast<std::int64_t>(number);
}

Id Rows::Identifier(int row, int column) const {
    ByteView const bytes = Value(row, column);
    if (bytes.empty())
        return {};
    Id::Digest digest{};
    if (bytes.size() != digest.size())
        throw Malformed();
    std::copy(bytes.begin(), bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
    return Id::FromDigest(digest);
}

} // namespace KivArchive::Postgres
