#include "postgres/Parameters.h"

#include "Changes.h"

namespace KivArchive::Postgres {

namespace {

// The numbers of the server's types.
constexpr std::uint32_t typeBytes = 17;
constexpr std::uint32_t typeLong = 20;
constexpr std::uint32_t typeShort = 21;

/// Numbers travel with their highest byte first.
template <class Number>
void AppendBigEndian(Bytes& bytes, Number number) {
    for (std::size_t shift = sizeof(Number) * 8; shift > 0; shift -= 8)
        Append(bytes, static_cast<std::byte>(number >> (shift - 8) & 0xFFU));
}

/// The header of an array with one dimension, which begins at 1.
void AppendArrayHeader(Bytes& bytes, std::uint32_t type, std::size_t count) {
    AppendBigEndian(bytes, std::uint32_t{count == 0 ? 0U : 1U});
    AppendBigEndian(bytes, std::uint32_t{0});
    AppendBigEndian(bytes, type);
    if (count == 0)
        return;
    AppendBigEndian(bytes, static_cast<std::uint32_t>(count));
    AppendBigEndian(bytes, std::uint32_t{1});
}

template <class Values, class View>
Bytes ArrayOfBytes(Values const& values, View view) {
    constexpr std::size_t headerSize = 20;
    constexpr std::size_t lengthSize = 4;
    std::size_t size = headerSize;
    for (auto const& value : values)
        size += lengthSize + view(value).size();
    Bytes array;
    array.reserve(size);
    AppendArrayHeader(array, typeBytes, values.size());
    for (auto const& value : values) {
        ByteView const bytes = view(value);
        AppendBigEndian(array, static_cast<std::uint32_t>(bytes.size()));
        Append(array, bytes);
    }
    return array;
}

template <class Unsigned, class Number>
Bytes ArrayOfNumbers(std::uint32_t type, std::span<const Number> numbers) {
    Bytes array;
    AppendArrayHeader(array, type, numbers.size());
    for (Number const number : numbers) {
        AppendBigEndian(array, static_cast<std::uint32_t>(sizeof(Number)));
        AppendBigEndian(array, static_cast<Unsigned>(number));
    }
    return array;
}

ByteView ViewOf(Id const& id) {
    return id.IsEmpty() ? ByteView() : std::as_bytes(std::span(DigestOf(id)));
}

} // namespace

Parameters& Parameters::With(ByteView bytes) {
    values_.emplace_back(bytes.begin(), bytes.end());
    return *this;
}

Parameters& Parameters::With(Id const& id) {
    return With(ViewOf(id));
}

Parameters& Parameters::With(std::int64_t number) {
    AppendBigEndian(values_.emplace_back(), static_cast<std::uint64_t>(number));
    return *this;
}

Parameters& Parameters::With(std::string const& text) {
    return With(std::as_bytes(std::span(text)));
}

Parameters& Parameters::With(std::span<const Id> ids) {
    values_.push_back(ArrayOfBytes(ids, ViewOf));
    return *this;
}

Parameters& Parameters::With(std::span<const ByteView> values) {
    values_.push_back(ArrayOfBytes(values, [](ByteView value) { return value; }));
    return *this;
}

Parameters& Parameters::With(std::span<const Bytes> values) {
    values_.push_back(ArrayOfBytes(values, [](Bytes const& value) { return ByteView(value); }));
    return *this;
}

Parameters& Parameters::With(std::span<const std::int16_t> numbers) {
    values_.push_back(ArrayOfNumbers<std::uint16_t>(typeShort, numbers));
    return *this;
}

Parameters& Parameters::With(std::span<const std::int64_t> numbers) {
    values_.push_back(ArrayOfNumbers<std::uint64_t>(typeLong, numbers));
    return *this;
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
