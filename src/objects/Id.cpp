#include "KivVcs/Object.h"

#include <algorithm>
#include <cstring>

namespace KivVcs {

namespace {

constexpr int digitCount = 64;

/// The code unit at @p position of an identifier's text, spelled out from its digest or taken from the text itself.
struct DigestDigits {
    Id::Digest const& digest;
    [[nodiscard]] int GetLength() const noexcept { return digitCount; }
    char16_t operator[](int position) const noexcept {
        const std::uint8_t byte = digest[static_cast<std::size_t>(position / 2)];
        return u"0123456789abcdef"[position % 2 == 0 ? byte >> 4 : byte & 15];
    }
};

/// Ten of the 64 digits take part: enough to spread digests, and cheap. Every table keyed by identifiers relies on it.
template <class Text>
std::size_t SampledHash(Text const& text) noexcept {
    std::uint64_t hash = 0x42c52834b230ef45;
    const int length = text.GetLength();
    const int step = length / 10 + 1;
    // Counted in 64 bits, since the last step of a very long text may pass the largest int.
    for (std::int64_t position = 0; position < length; position += step)
        hash ^= (hash << 6) + (hash >> 2) + text[static_cast<int>(position)] + 0x0fd258f8f3210c68;
    return static_cast<std::size_t>(hash);
}

/// The value of a lowercase hexadecimal digit, or -1.
constexpr int DigitValue(char16_t unit) noexcept {
    if (unit >= u'0' && unit <= u'9')
        return unit - u'0';
    return unit >= u'a' && unit <= u'f' ? unit - u'a' + 10 : -1;
}

bool ParseDigest(KivStringViewT<char16_t> text, Id::Digest& digest) noexcept {
    if (text.GetLength() != digitCount)
        return false;
    for (int index = 0; index < digitCount; index += 2) {
        const int high = DigitValue(text[index]);
        const int low = DigitValue(text[index + 1]);
        if (high < 0 || low < 0)
            return false;
        digest[static_cast<std::size_t>(index / 2)] = static_cast<std::uint8_t>(high * 16 + low);
    }
    return true;
}

} // namespace

Id::Id(Buffer const& packed) {
    SHADigest256 digest;
    for (auto const& chunk : packed.LockForRead())
        digest.InitData(chunk.data(), chunk.size());
    Digest bytes;
    digest.FinalDigest(bytes.data());
    *this = FromDigest(bytes);
}

Id::Id(KivStringT<char16_t> const& text) {
    if (text.IsEmpty())
        return;
    if (Digest digest; ParseDigest(text, digest)) {
        *this = FromDigest(digest);
        return;
    }
    auto record = immu::make<Record>();
    auto* const writable = record.write();
    writable->hash = SampledHash(KivStringViewT<char16_t>(text));
    writable->text.GetOrMake([&text] { return text; });
    record_ = std::move(record);
}

Id Id::FromDigest(Digest const& digest) {
    auto record = immu::make<Record>();
    auto* const writable = record.write();
    writable->hasDigest = true;
    writable->digest = digest;
    writable->hash = SampledHash(DigestDigits{digest});
    return Id(std::move(record));
}

KivStringT<char16_t> const& Id::GetText() const {
    static constinit const KivStringT<char16_t> empty;
    if (!record_)
        return empty;
    return record_->text.GetOrMake(
        [this] { return DataEncoding::HexEncode(record_->digest.data(), record_->digest.size()); });
}

bool Id::SameText(Record const& left, Record const& right) noexcept {
    // A text that tells a digest is always kept as one, so that the two kinds never have the same text.
    if (left.hasDigest != right.hasDigest || left.hash != right.hash)
        return false;
    if (left.hasDigest)
        return left.digest == right.digest;
    return *left.text.Get() == *right.text.Get();
}

} // namespace KivVcs
