#pragma once

/// @file
/// The failure of a repository that cannot read an object.

#include "KivArchive/IArchive.h"

namespace KivArchive {

/// @param what such as "version" or "file"
[[noreturn]] void ThrowUnreadable(Failure kind, const char* what, Id const& id);

} // namespace KivArchive
