#pragma once

/// @file
/// UTF-8 in and out, for hosts that keep their texts in standard strings.

#include "KivPlatform/String.h"

#include <string>
#include <string_view>

namespace KivUtils {

/// The text whose UTF-8 encoding is @p bytes; zero bytes are kept. What is not UTF-8 becomes U+FFFD, so that `ToUtf8` of
/// the result gives the bytes back exactly if they are UTF-8 (or the three-byte form of a lone surrogate).
/// @throws std::bad_alloc; std::length_error for 2 GiB or more
[[nodiscard]] KIVVCS_EXPORT KivPlatform::KivStringT<char16_t> FromUtf8(std::string_view bytes);

/// The UTF-8 encoding of @p text, zeros included. A lone surrogate is written in its three-byte form, which strict UTF-8
/// does not have, so that no two texts share an encoding.
/// @throws std::bad_alloc
[[nodiscard]] KIVVCS_EXPORT std::string ToUtf8(KivPlatform::KivStringViewT<char16_t> text);

} // namespace KivUtils
