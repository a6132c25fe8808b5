#include "KivVcs/Id.h"

#include "KivVcs/SHADigest256.h"
#include "foundation/HexDigits.h"

#include <algorithm>
#include <cstring>
#include <ostream>

namespace KivVcs {

namespace {

constexpr int digitCount = 64;

/// The code unit at @p position of an identifier's text, spelled out from its digest or taken from the text itself.
struct DigestDigits {
    Id::Digest const& digest;
    [[nodiscard]] int GetLength() const noexcept { return digitCount; }
    char16_t operator[](int position) const noexcept {
        const std::uint8_t byte = digest[static_cast<std::size_t>(position / 2)];
        return KivUtils::HexDigit<char16_t>(position % 2 == 0 ? byte >> 4U : byte & 15U);
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

bool ParseDigest(KivStringViewT<char16_t> text, Id::Digest& digest) noexcept {
    return text.GetLength() == digitCount && KivUtils::ReadHexDigits(text.GetString(), digest);
}

template <class Left, class Right>
std::strong_ordering CompareUnits(Left const& left, Right const& right) noexcept {
    const int common = std::min(left.GetLength(), right.GetLength());
    for (int position = 0; position < common; ++position) {
        if (left[position] != right[position])
            return left[position] <=> right[position];
    }
    return left.GetLength() <=> right.GetLength();
}

} // namespace

/// Calls @p use with the code units of the text, without making a text of a digest, which may fail.
template <class Use>
auto Id::WithUnits(Use const& use) const noexcept {
    if (isDigest_)
        return use(DigestDigits{digest_});
    Text const* const text = text_.Get();
    return use(text == nullptr ? KivStringViewT<char16_t>() : KivStringViewT<char16_t>(text->text));
}

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
    static_cast<void>(text_.GetOrMake([&text] { return Text(text); }));
}

std::size_t Id::ComputeHash() const noexcept {
    const std::size_t hash = WithUnits([](auto const& units) { return SampledHash(units); });
    hash_.Publish(hash);
    return hash;
}

KivStringT<char16_t> const& Id::GetText() const {
    static constinit const KivStringT<char16_t> empty;
    if (IsEmpty())
        return empty;
    return text_.GetOrMake([this] { return Text(DataEncoding::HexEncode(digest_.data(), digest_.size())); }).text;
}

optional<Id> Id::Parse(std::string_view digits) noexcept {
    std::array<char16_t, digitCount> lowercase;
    if (digits.size() != lowercase.size())
        return {};
    std::transform(digits.begin(), digits.end(), lowercase.begin(), [](char digit) {
        return static_cast<char16_t>(digit >= 'A' && digit <= 'F' ? digit - 'A' + 'a'
                                                                  : static_cast<unsigned char>(digit));
    });
    Digest digest;
    if (!ParseDigest({lowercase.data(), digitCount}, digest))
        return {};
    return FromDigest(digest);
}

std::strong_ordering Id::Compare(Id const& left, Id const& right) noexcept {
    if (left.isDigest_ && right.isDigest_)
        return std::memcmp(left.digest_.data(), right.digest_.data(), left.digest_.size()) <=> 0;
    return left.WithUnits([&](auto const& mine) {
        return right.WithUnits([&](auto const& theirs) { return CompareUnits(mine, theirs); });
    });
}

std::ostream& operator<<(std::ostream& stream, Id const& id) {
    return stream << id.GetText();
}

bool Id::HaveSameText(Id const& left, Id const& right) noexcept {
    Text const* const mine = left.text_.Get();
    Text const* const theirs = right.text_.Get();
    return mine == theirs || (mine != nullptr && theirs != nullptr && mine->text == theirs->text);
}

} // namespace KivVcs
