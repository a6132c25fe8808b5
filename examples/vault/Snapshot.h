#pragma once

#include "Progress.h"
#include "Scan.h"

namespace vault {

/// The name of the files in which a directory's version stores when it last changed: seconds since 1970 in decimal.
inline constexpr std::string_view stampName = ".vault-stamp";

struct SnapshotOptions {
    ScanOptions scan;
    /// The tree of the last version; null if there is none.
    Id previous;
    /// Seconds since 1970 that every directory gets that differs from the last version.
    std::optional<std::int64_t> stamp;
    /// Whether contents are stored while they are read; otherwise nothing is.
    bool stores = true;
    /// Whether to read files again that have not changed since the last time.
    bool readsAll = false;
    /// Asks whether saved paths that patterns exclude are to go from the version. Empty: they stay.
    std::function<bool(std::vector<std::string> const& paths)> removesExcluded;
};

/// A directory as a version would have it.
struct Snapshot {
    Id tree;
    std::uint64_t files = 0;
    /// How many objects were stored on the way.
    std::uint64_t stored = 0;
    /// What is still to be stored, children first: trees and contents of attributes; with what they rely on.
    KivArchive::Change change;
    /// What keeps the state of the last version, or is left out, and why.
    std::vector<std::string> problems;
    std::vector<std::string> specials;
    /// The directory itself, and the new `StatIndex` of it; empty if that is as before.
    std::string top;
    std::string index;
};

/// Reads a directory, as far as it has changed since it was read last.
/// @throws Problem if the directory itself cannot be read
[[nodiscard]] Snapshot TakeSnapshot(IArchive& archive, SnapshotOptions const& options, Progress& progress);

} // namespace vault
