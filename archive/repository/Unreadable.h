#pragma once

/// @file
/// What a repository says about an object that it cannot have.

#include "KivArchive/IArchive.h"

namespace KivArchive {

/// @param what such as "version" or "file"
[[noreturn]] void ThrowUnreadable(Failure kind, const char* what, Id const& id);

} // namespace KivArchive
