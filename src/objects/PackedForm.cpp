#include "objects/PackedForm.h"

#include <array>
#include <charconv>
#include <cstring>

namespace KivVcs {

namespace {

/// The part of a header behind the type word.
class SizeField {
public:
    explicit SizeField(std::uint64_t size) noexcept {
        text_[0] = ' ';
        end_ = std::to_chars(text_.data() + 1, text_.data() + text_.size() - 1, size).ptr;
        *end_++ = '\0';
    }
    [[nodiscard]] const char* Data() const noexcept { return text_.data(); }
    [[nodiscard]] std::size_t Size() const noexcept { return static_cast<std::size_t>(end_ - text_.data()); }

private:
    std::array<char, 22> text_;
    char* end_;
};

} // namespace

char* WriteDigits(Id::Digest const& digest, char* out) noexcept {
    // Plain arithmetic in two loops of fixed length, which compilers turn into a few vector instructions.
    std::array<std::uint8_t, 2 * std::tuple_size_v<Id::Digest>> digits;
    for (std::size_t index = 0; index < digest.size(); ++index) {
        digits[2 * index] = static_cast<std::uint8_t>(digest[index] >> 4);
        digits[2 * index + 1] = static_cast<std::uint8_t>(digest[index] & 15);
    }
    for (std::uint8_t& digit : digits)
        digit = static_cast<std::uint8_t>(digit + (digit > 9 ? 'a' - 10 : '0'));
    std::memcpy(out, digits.data(), digits.size());
    return out + digits.size();
}

Id ReadId(KivStringViewT<char> text) {
    Id::Digest digest;
    if (static_cast<std::size_t>(text.GetLength()) != 2 * digest.size())
        return Id(KivStringT<char16_t>(text.ToString()));
    // As in `WriteDigits`: every digit is taken, and a wrong one noticed at the end.
    std::array<std::uint8_t, 2 * std::tuple_size_v<Id::Digest>> digits;
    std::memcpy(digits.data(), text.GetString(), digits.size());
    std::uint8_t wrong = 0;
    for (std::uint8_t& digit : digits) {
        const auto number = static_cast<std::uint8_t>(digit - '0');
        const auto letter = static_cast<std::uint8_t>(digit - 'a');
        const auto isNumber = static_cast<std::uint8_t>(number <= 9 ? 0xFF : 0);
        const auto isLetter = static_cast<std::uint8_t>(letter <= 5 ? 0xFF : 0);
        wrong = static_cast<std::uint8_t>(wrong | ~(isNumber | isLetter));
        digit = static_cast<std::uint8_t>((number & isNumber) | ((letter + 10) & isLetter));
    }
    if (wrong != 0)
        return Id(KivStringT<char16_t>(text.ToString()));
    for (std::size_t index = 0; index < digest.size(); ++index)
        digest[index] = static_cast<std::uint8_t>(digits[2 * index] << 4 | digits[2 * index + 1]);
    return Id::FromDigest(digest);
}

void AppendPackedHeader(Buffer& packed, KivStringViewT<char> word, std::uint64_t size) {
    const SizeField field(size);
    packed.Append(word.GetString(), static_cast<std::uint64_t>(word.GetLength()));
    packed.Append(field.Data(), field.Size());
}

IdDigest::IdDigest(KivStringViewT<char> word, std::uint64_t size) noexcept {
    const SizeField field(size);
    Feed(word.GetString(), static_cast<std::size_t>(word.GetLength()));
    Feed(field.Data(), field.Size());
}

void IdDigest::Feed(Buffer const& data) noexcept {
    for (auto const& chunk : data.LockForRead())
        Feed(chunk.data(), chunk.size());
}

Id IdDigest::Finish() noexcept {
    Id::Digest digest;
    digest_.FinalDigest(digest.data());
    return Id::FromDigest(digest);
}

} // namespace KivVcs
