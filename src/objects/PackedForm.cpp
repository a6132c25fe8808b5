#include "objects/PackedForm.h"

#include "foundation/HexDigits.h"

#include <algorithm>
#include <array>
#include <charconv>

namespace KivVcs {

namespace {

/// The part of a header after the type word.
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
    return KivUtils::WriteHexDigits(digest, out);
}

Id ReadId(KivStringViewT<char> text) {
    Id::Digest digest;
    if (static_cast<std::size_t>(text.GetLength()) == 2 * digest.size() &&
        KivUtils::ReadHexDigits(text.GetString(), digest))
        return Id::FromDigest(digest);
    return Id(KivStringT<char16_t>(text.ToString()));
}

void AppendPackedHeader(Buffer& packed, KivStringViewT<char> word, std::uint64_t size) {
    const SizeField field(size);
    packed.Append(word.GetString(), static_cast<std::uint64_t>(word.GetLength()));
    packed.Append(field.Data(), field.Size());
}

char* WritePackedHeader(KivStringViewT<char> word, std::uint64_t size, char* out) noexcept {
    const SizeField field(size);
    out = std::copy(word.begin(), word.end(), out);
    return std::copy_n(field.Data(), field.Size(), out);
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
