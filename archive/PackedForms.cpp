#include "PackedForms.h"

#include <KivUtils/Utf8.h>

#include <algorithm>
#include <charconv>
#include <stdexcept>
#include <string>

namespace KivArchive {

namespace {

/// Takes @p expected from the front of @p text. @return false, taking nothing, if it begins with something else
bool Take(std::string_view& text, std::string_view expected) noexcept {
    if (text.substr(0, expected.size()) != expected)
        return false;
    text.remove_prefix(expected.size());
    return true;
}

bool TakeIdentifierLine(std::string_view& text, KivVcs::Id& id) noexcept {
    KivVcs::Id::Digest digest{};
    if (text.size() <= digitCount || text[digitCount] != '\n' ||
        !ReadDigits(text.data(), std::as_writable_bytes(std::span(digest)).data()))
        return false;
    text.remove_prefix(digitCount + 1);
    id = KivVcs::Id::FromDigest(digest);
    return true;
}

/// Takes the rest of the author's line, the committer's equal line and an empty line from the front of @p text.
/// @return what the author's line says; nothing if they are not there. Names may hold anything, also what looks like
/// the committer's line
std::optional<std::string_view> TakeSignature(std::string_view& text) noexcept {
    constexpr std::string_view committer = "\ncommitter ";
    constexpr std::string_view end = "\n\n";
    constexpr int maximumTries = 16;
    std::size_t at = text.find(committer);
    for (int tried = 0; tried < maximumTries && at != std::string_view::npos;
         ++tried, at = text.find(committer, at + 1)) {
        std::string_view const signature = text.substr(0, at);
        std::string_view rest = text.substr(at + committer.size());
        if (Take(rest, signature) && Take(rest, end)) {
            text = rest;
            return signature;
        }
    }
    return std::nullopt;
}

/// The number that @p digits stand for; nothing if it is not written so, or with needless zeros or signs.
template <class Number>
std::optional<Number> NumberOf(std::string_view digits) noexcept {
    Number number = 0;
    auto const [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    bool const isNegative = digits.substr(0, 1) == "-";
    std::string_view const magnitude = digits.substr(isNegative ? 1 : 0);
    if (error != std::errc() || end != digits.data() + digits.size() ||
        (magnitude.front() == '0' && (isNegative || magnitude.size() > 1)))
        return std::nullopt;
    return number;
}

/// The minutes that an offset such as "-0530" stands for.
std::optional<std::int64_t> MinutesOf(std::string_view offset) noexcept {
    constexpr std::size_t shortest = 5;
    // No `TimeDelta` holds more.
    constexpr std::int64_t maximumHours = 256'000'000;
    bool const isNegative = offset.substr(0, 1) == "-";
    if (offset.size() < shortest || (!isNegative && offset.front() != '+'))
        return std::nullopt;
    auto const number = [](std::string_view twoDigits) {
        return NumberOf<std::int64_t>(twoDigits.substr(twoDigits.size() == 2 && twoDigits.front() == '0' ? 1 : 0));
    };
    auto const hours = number(offset.substr(1, offset.size() - 3));
    auto const minutes = number(offset.substr(offset.size() - 2));
    // Negative offsets of less than an hour are packed with "+".
    if (!hours || !minutes || *hours < 0 || *hours > maximumHours || *minutes < 0 || *minutes >= 60 ||
        (isNegative && *hours == 0))
        return std::nullopt;
    return (isNegative ? -1 : 1) * (*hours * 60 + *minutes);
}

/// Takes the last word off @p text, and the space before it.
std::string_view TakeLastWord(std::string_view& text) noexcept {
    std::size_t const space = text.rfind(' ');
    if (space == std::string_view::npos)
        return {};
    std::string_view const word = text.substr(space + 1);
    text = text.substr(0, space);
    return word;
}

bool ReadSignature(std::string_view signature, PackedCommit& commit) noexcept {
    auto const minutes = MinutesOf(TakeLastWord(signature));
    auto const seconds = NumberOf<std::int32_t>(TakeLastWord(signature));
    // If there are several, it does not matter at which one the name ends: all ways are packed to the same bytes.
    std::size_t const begin = signature.rfind(" <");
    if (!minutes || !seconds || signature.empty() || signature.back() != '>' || begin == std::string_view::npos)
        return false;
    commit.authorName = signature.substr(0, begin);
    commit.authorEmail = signature.substr(begin + 2, signature.size() - begin - 3);
    commit.seconds = *seconds;
    commit.biasMinutes = *minutes;
    return true;
}

bool IsAscii(std::string_view text) noexcept {
    // Without a branch for each byte, so that compilers read several at once.
    unsigned char all = 0;
    for (char const byte : text)
        all |= static_cast<unsigned char>(byte);
    return all < 0x80;
}

unsigned ByteAt(std::string_view text, std::size_t at) noexcept {
    return at < text.size() ? static_cast<unsigned char>(text[at]) : 0U;
}

/// The first UTF-16 code unit of the character that the three or four bytes at @p at encode.
unsigned FirstUnit(std::string_view text, std::size_t at) noexcept {
    unsigned const lead = ByteAt(text, at);
    unsigned const codePoint =
        (lead & 0x0FU) << 12U | (ByteAt(text, at + 1) & 0x3FU) << 6U | (ByteAt(text, at + 2) & 0x3FU);
    if (lead < 0xF0)
        return codePoint;
    unsigned const beyond = (codePoint << 6U | (ByteAt(text, at + 3) & 0x3FU)) - 0x10000U;
    return 0xD800U + (beyond >> 10U);
}

} // namespace

std::optional<PackedCommit> ReadPackedCommit(std::span<const std::byte> data) {
    std::string_view text(reinterpret_cast<const char*>(data.data()), data.size());
    PackedCommit commit;
    if (!IsExactText(text) || text.find('\0') != std::string_view::npos || !Take(text, "tree "))
        return std::nullopt;
    if (!Take(text, "\n") && !TakeIdentifierLine(text, commit.tree))
        return std::nullopt;
    if (Take(text, "parent ") && !TakeIdentifierLine(text, commit.parent))
        return std::nullopt;
    if (!Take(text, "author "))
        return std::nullopt;
    auto const signature = TakeSignature(text);
    if (!signature || !ReadSignature(*signature, commit) || text.empty() || text.back() != '\n')
        return std::nullopt;
    commit.description = text.substr(0, text.size() - 1);
    return commit;
}

bool PackedEntries::Next() {
    std::string_view rest = rest_;
    if (rest.empty())
        return false;
    bool const isTree = Take(rest, "40000 tree ");
    std::size_t const end = isTree || Take(rest, "100644 blob ") ? rest.find('\0') : std::string_view::npos;
    KivVcs::Id::Digest digest{};
    if (end == std::string_view::npos || rest.size() - end - 1 < digitCount ||
        !ReadDigits(rest.data() + end + 1, std::as_writable_bytes(std::span(digest)).data())) {
        areSound_ = false;
        return false;
    }
    std::string_view const name = rest.substr(0, end);
    bool const isFirst = entry_.digits.empty();
    areSound_ = areSound_ && !name.empty() && name.find('/') == std::string_view::npos && IsExactText(name) &&
                (isFirst || CompareNames(entry_.name, name) < 0);
    entry_ = {isTree, name, rest.substr(end + 1, digitCount)};
    rest_ = rest.substr(end + 1 + digitCount);
    return true;
}

int CompareNames(std::string_view left, std::string_view right) noexcept {
    std::size_t const shorter = std::min(left.size(), right.size());
    std::size_t at = 0;
    while (at < shorter && left[at] == right[at])
        ++at;
    if (at == shorter)
        return left.size() < right.size() ? -1 : static_cast<int>(left.size() > right.size());
    unsigned const one = ByteAt(left, at);
    unsigned const other = ByteAt(right, at);
    // Characters beyond U+FFFF take two units, which come before the units from U+E000 on.
    constexpr unsigned leadOfPairs = 0xF0;
    constexpr unsigned leadOfSurrogates = 0xED;
    bool const isOnePair = one >= leadOfPairs;
    if (isOnePair == (other >= leadOfPairs) || std::min(one, other) < leadOfSurrogates)
        return one < other ? -1 : 1;
    std::string_view const pair = isOnePair ? left : right;
    std::string_view const single = isOnePair ? right : left;
    unsigned const unit = FirstUnit(single, at);
    unsigned const first = FirstUnit(pair, at);
    // After a lone surrogate, only units from U+E000 on come after the second unit of a pair.
    unsigned const next = ByteAt(single, at + 3);
    bool const isPairLess = unit == first ? next > leadOfSurrogates && next < leadOfPairs : first < unit;
    return isPairLess == isOnePair ? -1 : 1;
}

bool IsExactText(std::string_view text) {
    if (IsAscii(text))
        return true;
    try {
        return KivUtils::ToUtf8(KivUtils::FromUtf8(text)) == text;
    } catch (std::length_error const&) {
        return false;
    }
}

} // namespace KivArchive
