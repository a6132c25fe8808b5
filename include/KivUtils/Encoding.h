#pragma once

/// @file
/// Conversions between texts, bytes and numbers.

#include "KivPlatform/String.h"

#include <cstddef>
#include <cstdint>

namespace KivUtils {

namespace DataEncoding {

/// The UTF-8 encoding of @p text, NULs included where the view holds them. A lone surrogate is written as its
/// three-byte form, so that no two texts share an encoding.
/// @throws std::bad_alloc; std::length_error if the result is longer than a string can be
[[nodiscard]] KIVVCS_EXPORT KivPlatform::KivStringT<char> Utf8Encode(KivPlatform::KivStringViewT<char16_t> text);
/// The same for NUL-terminated text, and for a string up to its first NUL.
[[nodiscard]] inline KivPlatform::KivStringT<char> Utf8Encode(const char16_t* text) {
    return Utf8Encode(KivPlatform::KivStringViewT<char16_t>(text));
}
[[nodiscard]] inline KivPlatform::KivStringT<char> Utf8Encode(KivPlatform::KivStringT<char16_t> const& text) {
    return Utf8Encode(text.GetString());
}

/// The number of bytes that `Utf8Encode` writes for @p text.
[[nodiscard]] KIVVCS_EXPORT std::size_t Utf8Length(KivPlatform::KivStringViewT<char16_t> text) noexcept;

/// Writes the UTF-8 encoding of @p text, `Utf8Length(text)` bytes, and returns the end of what was written.
KIVVCS_EXPORT char* Utf8Write(KivPlatform::KivStringViewT<char16_t> text, char* destination) noexcept;

/// Two lowercase hexadecimal digits for each of @p size bytes, in byte order.
/// @throws std::bad_alloc; std::length_error if the result is longer than a string can be
[[nodiscard]] KIVVCS_EXPORT KivPlatform::KivStringT<char16_t> HexEncode(const void* data, std::size_t size);

} // namespace DataEncoding

namespace String {

/// The text that a UTF-8 encoding stands for; the inverse of `DataEncoding::Utf8Encode` for every text. The three-byte
/// form of a surrogate decodes to that surrogate; every other byte that is not part of a well-formed sequence decodes
/// to U+FFFD.
[[nodiscard]] KIVVCS_EXPORT KivPlatform::KivStringT<char16_t> ToStringW(KivPlatform::KivStringViewT<char> text);

/// The number that @p text begins with: an optional sign and decimal digits. No digits give 0; a number out of range
/// gives the nearest one in range.
[[nodiscard]] KIVVCS_EXPORT int IntFromString(KivPlatform::KivStringViewT<char16_t> text) noexcept;
[[nodiscard]] KIVVCS_EXPORT std::int64_t Int64FromString(KivPlatform::KivStringViewT<char16_t> text) noexcept;

} // namespace String

} // namespace KivUtils
