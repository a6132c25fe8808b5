#include "KivUtils/Encoding.h"

#include "foundation/HexDigits.h"

#include <algorithm>
#include <limits>
#include <stdexcept>

namespace KivUtils {

using KivPlatform::KivStringT;
using KivPlatform::KivStringViewT;

namespace {

constexpr char16_t replacementCharacter = 0xFFFD;

constexpr bool IsHighSurrogate(char16_t unit) noexcept {
    return unit >= 0xD800 && unit <= 0xDBFF;
}

constexpr bool IsLowSurrogate(char16_t unit) noexcept {
    return unit >= 0xDC00 && unit <= 0xDFFF;
}

/// Hands every code point of @p text to @p take, a lone surrogate as itself.
template <class Take>
void ForEachCodePoint(KivStringViewT<char16_t> text, Take take) {
    const char16_t* const end = text.end();
    for (const char16_t* unit = text.begin(); unit != end; ++unit) {
        char32_t codePoint = *unit;
        if (IsHighSurrogate(*unit) && unit + 1 != end && IsLowSurrogate(unit[1])) {
            codePoint = 0x10000 + ((codePoint - 0xD800) << 10) + (unit[1] - 0xDC00U);
            ++unit;
        }
        take(codePoint);
    }
}

/// Whether every code unit is ASCII, as those of most names are. Looks at all of them, since that is faster than to stop
/// at the first that is not.
template <class C>
bool IsAscii(KivStringViewT<C> text) noexcept {
    unsigned bits = 0;
    for (const C unit : text)
        bits |= static_cast<unsigned>(unit);
    return bits < 0x80;
}

constexpr std::size_t EncodedLength(char32_t codePoint) noexcept {
    if (codePoint < 0x80)
        return 1;
    if (codePoint < 0x800)
        return 2;
    return codePoint < 0x10000 ? 3 : 4;
}

int CheckedLength(std::size_t length) {
    if (length > static_cast<std::size_t>(std::numeric_limits<int>::max()))
        throw std::length_error("text longer than a signed 32-bit length can hold");
    return static_cast<int>(length);
}

/// The sequence that starts at @p byte: its length in bytes and its code point; length 0 if it is ill-formed.
struct Sequence {
    int length = 0;
    char32_t codePoint = 0;
};

Sequence DecodeSequence(const char* byte, const char* end) noexcept {
    const auto lead = static_cast<unsigned char>(*byte);
    if (lead < 0x80)
        return {1, lead};
    const int length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
    if (lead < 0xC2 || lead > 0xF4 || end - byte < length)
        return {};
    char32_t codePoint = lead & (0x7FU >> length);
    for (int index = 1; index < length; ++index) {
        const auto next = static_cast<unsigned char>(byte[index]);
        if ((next & 0xC0) != 0x80)
            return {};
        codePoint = codePoint << 6 | (next & 0x3F);
    }
    const bool shortest = EncodedLength(codePoint) == static_cast<std::size_t>(length);
    return shortest && codePoint <= 0x10FFFF ? Sequence{length, codePoint} : Sequence{};
}

/// Hands every UTF-16 code unit that @p text stands for to @p take.
template <class Take>
void ForEachCodeUnit(KivStringViewT<char> text, Take take) {
    for (const char* byte = text.begin(); byte != text.end();) {
        const Sequence sequence = DecodeSequence(byte, text.end());
        byte += sequence.length == 0 ? 1 : sequence.length;
        if (sequence.length == 0) {
            take(replacementCharacter);
        } else if (sequence.codePoint < 0x10000) {
            take(static_cast<char16_t>(sequence.codePoint));
        } else {
            take(static_cast<char16_t>(0xD800 + ((sequence.codePoint - 0x10000) >> 10)));
            take(static_cast<char16_t>(0xDC00 + ((sequence.codePoint - 0x10000) & 0x3FF)));
        }
    }
}

template <class Number>
Number NumberFromString(KivStringViewT<char16_t> text) noexcept {
    using limits = std::numeric_limits<Number>;
    const bool negative = text.StartsWith(u"-");
    // Counted downwards, since the most negative number has no positive counterpart.
    Number value = 0;
    for (int index = negative || text.StartsWith(u"+") ? 1 : 0; index < text.GetLength(); ++index) {
        const char16_t unit = text[index];
        if (unit < u'0' || unit > u'9')
            break;
        const auto digit = static_cast<Number>(unit - u'0');
        if (value < (limits::min() + digit) / 10)
            return negative ? limits::min() : limits::max();
        value = static_cast<Number>(value * 10 - digit);
    }
    if (negative)
        return value;
    return value == limits::min() ? limits::max() : static_cast<Number>(-value);
}

} // namespace

std::size_t DataEncoding::Utf8Length(KivStringViewT<char16_t> text) noexcept {
    if (IsAscii(text))
        return static_cast<std::size_t>(text.GetLength());
    std::size_t length = 0;
    ForEachCodePoint(text, [&length](char32_t codePoint) { length += EncodedLength(codePoint); });
    return length;
}

char* DataEncoding::Utf8Write(KivStringViewT<char16_t> text, char* destination) noexcept {
    if (IsAscii(text))
        return std::transform(text.begin(), text.end(), destination,
                              [](char16_t unit) { return static_cast<char>(unit); });
    ForEachCodePoint(text, [&destination](char32_t codePoint) {
        const auto continuation = [codePoint](unsigned shift) {
            return static_cast<char>(0x80 | ((codePoint >> shift) & 0x3F));
        };
        if (codePoint < 0x80) {
            *destination++ = static_cast<char>(codePoint);
        } else if (codePoint < 0x800) {
            *destination++ = static_cast<char>(0xC0 | codePoint >> 6);
            *destination++ = continuation(0);
        } else if (codePoint < 0x10000) {
            *destination++ = static_cast<char>(0xE0 | codePoint >> 12);
            *destination++ = continuation(6);
            *destination++ = continuation(0);
        } else {
            *destination++ = static_cast<char>(0xF0 | codePoint >> 18);
            *destination++ = continuation(12);
            *destination++ = continuation(6);
            *destination++ = continuation(0);
        }
    });
    return destination;
}

KivStringT<char> DataEncoding::Utf8Encode(KivStringViewT<char16_t> text) {
    return KivStringT<char>::Build(CheckedLength(Utf8Length(text)), [text](char* bytes) { Utf8Write(text, bytes); });
}

KivStringT<char16_t> DataEncoding::HexEncode(const void* data, std::size_t size) {
    if (data == nullptr || size == 0)
        return {};
    const auto* bytes = static_cast<const unsigned char*>(data);
    return KivStringT<char16_t>::Build(
        CheckedLength(size > std::numeric_limits<std::size_t>::max() / 2 ? size : size * 2),
        [bytes, size](char16_t* digits) {
            for (std::size_t index = 0; index < size; ++index) {
                *digits++ = HexDigit<char16_t>(bytes[index] >> 4U);
                *digits++ = HexDigit<char16_t>(bytes[index] & 15U);
            }
        });
}

KivStringT<char16_t> String::ToStringW(KivStringViewT<char> text) {
    if (IsAscii(text))
        return KivStringT<char16_t>::Build(text.GetLength(),
                                           [text](char16_t* units) { std::copy(text.begin(), text.end(), units); });
    int length = 0;
    ForEachCodeUnit(text, [&length](char16_t) { ++length; });
    return KivStringT<char16_t>::Build(
        length, [text](char16_t* units) { ForEachCodeUnit(text, [&units](char16_t unit) { *units++ = unit; }); });
}

int String::IntFromString(KivStringViewT<char16_t> text) noexcept {
    return NumberFromString<int>(text);
}

std::int64_t String::Int64FromString(KivStringViewT<char16_t> text) noexcept {
    return NumberFromString<std::int64_t>(text);
}

} // namespace KivUtils
