#include "Names.h"

#include "Text.h"

#include <algorithm>
#include <cstring>

namespace vault {

namespace {

/// What is compared at once.
constexpr std::size_t wordSize = 8;

unsigned char ByteAt(std::string_view bytes, std::size_t at) noexcept {
    return at < bytes.size() ? static_cast<unsigned char>(bytes[at]) : 0;
}

bool IsTrail(unsigned char byte) noexcept {
    return (byte & 0xC0U) == 0x80U;
}

bool IsAscii(std::string_view bytes) noexcept {
    unsigned char all = 0;
    for (const char byte : bytes)
        all |= static_cast<unsigned char>(byte);
    return all < 0x80;
}

/// The length of the UTF-8 character at @p at; 0 if there is none.
std::size_t CharacterLength(std::string_view bytes, std::size_t at) noexcept {
    const auto lead = ByteAt(bytes, at);
    const auto second = ByteAt(bytes, at + 1);
    if (lead < 0x80)
        return 1;
    if (lead >= 0xC2 && lead < 0xE0)
        return IsTrail(second) ? 2 : 0;
    if (lead >= 0xE0 && lead < 0xF0) {
        const bool isFirst = IsTrail(second) && !(lead == 0xE0 && second < 0xA0) && !(lead == 0xED && second >= 0xA0);
        return isFirst && IsTrail(ByteAt(bytes, at + 2)) ? 3 : 0;
    }
    if (lead >= 0xF0 && lead < 0xF5) {
        const bool isFirst = IsTrail(second) && !(lead == 0xF0 && second < 0x90) && !(lead == 0xF4 && second >= 0x90);
        return isFirst && IsTrail(ByteAt(bytes, at + 2)) && IsTrail(ByteAt(bytes, at + 3)) ? 4 : 0;
    }
    return 0;
}

/// The byte that the lone surrogate at @p at stands for, or nothing.
std::optional<char> EscapedByte(std::string_view stored, std::size_t at) noexcept {
    const auto second = ByteAt(stored, at + 1);
    const auto third = ByteAt(stored, at + 2);
    if (ByteAt(stored, at) != 0xED || (second != 0xB2 && second != 0xB3) || !IsTrail(third))
        return std::nullopt;
    return static_cast<char>(((second & 0x03U) << 6U) | (third & 0x3FU));
}

/// Where a character stands among others by its first UTF-16 unit; @p at is where two names begin to differ.
int Rank(std::string_view name, std::size_t at) noexcept {
    const auto lead = ByteAt(name, at);
    if (lead < 0xED)
        return lead;
    if (lead == 0xED)
        return ByteAt(name, at + 1) < 0xB0 ? 0xED : 0xF8;
    // What lies beyond U+FFFF begins with a high surrogate, which comes before U+E000.
    return lead < 0xF0 ? lead + 0x10 : lead;
}

void AppendHex(std::string& text, unsigned value, int digits) {
    for (int shift = (digits - 1) * 4; shift >= 0; shift -= 4)
        text += hexDigits[(value >> static_cast<unsigned>(shift)) & 0xFU];
}

} // namespace

std::string StoredName(std::string_view fileName) {
    if (IsAscii(fileName))
        return std::string(fileName);
    std::string stored;
    stored.reserve(fileName.size());
    for (std::size_t at = 0; at < fileName.size();) {
        if (const auto length = CharacterLength(fileName, at)) {
            stored += fileName.substr(at, length);
            at += length;
            continue;
        }
        const auto byte = ByteAt(fileName, at++);
        stored += {'\xED', static_cast<char>(0xB0U | (byte >> 6U)), static_cast<char>(0x80U | (byte & 0x3FU))};
    }
    return stored;
}

std::string FilePath(std::string_view storedPath) {
    if (storedPath.find('\xED') == std::string_view::npos)
        return std::string(storedPath);
    std::string path;
    for (std::size_t at = 0; at < storedPath.size();) {
        if (const auto byte = EscapedByte(storedPath, at)) {
            path += *byte;
            at += 3;
        } else {
            path += storedPath[at++];
        }
    }
    return path;
}

std::optional<std::string> FileName(std::string_view storedName) {
    auto name = FilePath(storedName);
    if (name.empty() || name == "." || name == ".." || name.find_first_of(std::string_view("/\0", 2)) != name.npos)
        return std::nullopt;
    // Others may have escaped what needs none, or hold other surrogates.
    return StoredName(name) == storedName ? std::optional(std::move(name)) : std::nullopt;
}

bool ComesBefore(std::string_view left, std::string_view right) noexcept {
    const auto size = std::min(left.size(), right.size());
    std::size_t at = 0;
    while (at + wordSize <= size && std::memcmp(left.data() + at, right.data() + at, wordSize) == 0)
        at += wordSize;
    while (at < size && left[at] == right[at])
        ++at;
    return at == size ? left.size() < right.size() : Rank(left, at) < Rank(right, at);
}

std::string PrintableName(std::string_view storedPath) {
    if (std::all_of(storedPath.begin(), storedPath.end(), [](char c) { return c >= 0x20 && c < 0x7F && c != '\\'; }))
        return std::string(storedPath);
    std::string text;
    const auto appendEscaped = [&text](unsigned char byte) {
        text += "\\x";
        AppendHex(text, byte, 2);
    };
    for (std::size_t at = 0; at < storedPath.size();) {
        const auto length = CharacterLength(storedPath, at);
        const auto byte = ByteAt(storedPath, at);
        if (const auto escaped = EscapedByte(storedPath, at)) {
            appendEscaped(static_cast<unsigned char>(*escaped));
            at += 3;
        } else if (length == 0 || byte < 0x20 || byte == 0x7F || (byte == 0xC2 && ByteAt(storedPath, at + 1) < 0xA0)) {
            for (const auto end = at + std::max<std::size_t>(length, 1); at < end; ++at)
                appendEscaped(ByteAt(storedPath, at));
        } else {
            text += byte == '\\' ? "\\" : "";
            text += storedPath.substr(at, length);
            at += length;
        }
    }
    return text;
}

std::string JsonText(std::string_view stored) {
    std::string text = "\"";
    for (std::size_t at = 0; at < stored.size();) {
        const auto length = CharacterLength(stored, at);
        const auto byte = ByteAt(stored, at);
        if (length == 0) {
            // A lone surrogate, or a byte that nobody vouches for.
            const auto escaped = EscapedByte(stored, at);
            text += "\\u";
            AppendHex(text, 0xDC00U + (escaped ? static_cast<unsigned char>(*escaped) : byte), 4);
            at += escaped ? 3 : 1;
        } else if (byte < 0x20 || byte == 0x7F) {
            text += "\\u";
            AppendHex(text, byte, 4);
            ++at;
        } else {
            if (byte == '"' || byte == '\\')
                text += '\\';
            text += stored.substr(at, length);
            at += length;
        }
    }
    return text += '"';
}

} // namespace vault
