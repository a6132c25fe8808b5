#pragma once

/// @file
/// The archive that a benchmark is run on.

#include <KivArchive/IArchive.h>

#include <memory>
#include <string>

namespace ArchiveBench {

/// Opens or makes the archive of this name: a file, or what a program of its own says.
[[nodiscard]] std::unique_ptr<KivArchive::IArchive> OpenArchive(std::string const& name, unsigned workers);

} // namespace ArchiveBench
