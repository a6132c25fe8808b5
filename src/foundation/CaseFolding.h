#pragma once

#include "KivPlatform/String.h"

namespace KivUtils {

/// The text with every letter replaced by the one that stands for both cases: two texts that differ in case only give the
/// same. Unicode's simple case folding (14.0), the same in every locale; a lone surrogate stays.
[[nodiscard]] KivPlatform::KivStringT<char16_t> FoldCase(KivPlatform::KivStringViewT<char16_t> text);

} // namespace KivUtils
