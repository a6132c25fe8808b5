#pragma once

#include "Progress.h"
#include "Trees.h"

namespace vault {

struct RestoreOptions {
    std::string target;
    /// Writes into a directory that exists, file by file.
    bool force = false;
    /// With `force`: removes what the version does not have.
    bool removesOthers = false;
    /// Restores setuid, setgid and sticky bits.
    bool specialModes = false;
};

/// Writes an entry of a version, a directory with all below it or one file, to a place on the disk.
///
/// A new place appears whole, by being renamed. In a directory that exists each file is the old or the new one at every
/// moment, whatever interrupts this. Writes nowhere else, and through no link.
/// @return what could not be restored, for people; the rest is
/// @throws Problem if the place cannot be written to
[[nodiscard]] std::vector<std::string> Restore(IArchive& archive, Entry const& entry, RestoreOptions const& options,
                                               Progress& progress);

} // namespace vault
