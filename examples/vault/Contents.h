#pragma once

#include "Descriptor.h"
#include "Progress.h"
#include "Scan.h"

namespace vault {

/// A file or link whose content is wanted.
struct WantedContent {
    /// Of its directory, as in `ScannedDirectory`.
    std::string const* directory = nullptr;
    ScannedEntry const* entry = nullptr;
    /// The content that it had in the last version; null if there is none.
    Id earlier;

    // What became of it:
    Id id;
    FileState state;
    /// Why it has no identifier, for people.
    std::string problem;
};

/// Reads the contents, identifies them and, if @p archive is not null, stores them, on several threads and with a few MiB
/// of them in memory at a time. A file that changes meanwhile is read again, some times.
/// @return how many contents were stored
std::uint64_t ReadContents(std::string const& top, std::vector<WantedContent>& wanted, IArchive* archive,
                           Progress& progress);

} // namespace vault
