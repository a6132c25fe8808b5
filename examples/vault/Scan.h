#pragma once

#include "StatIndex.h"

#include <deque>
#include <functional>

namespace vault {

struct ScannedEntry {
    enum class Kind : std::uint8_t {
        File,
        Link,
        Directory,
        /// Neither is saved: a device, a socket or a pipe.
        Special,
        /// Could not be looked at; what the last version has of it is kept.
        Unreadable,
        /// Lies on another file system, likewise.
        Elsewhere,
    };

    /// As a tree has it.
    std::string name;
    Kind kind = Kind::File;
    FileState state;
    /// The position of the directory that it is.
    std::size_t directory = 0;
};

struct ScannedDirectory {
    /// From the top, of names as trees have them; ends with "/" unless it is empty.
    std::string path;
    FileState state;
    /// In the order of the tree.
    std::vector<ScannedEntry> entries;
};

struct ScanOptions {
    std::string top;
    /// The vault itself, which is left out with what the database keeps beside it.
    std::string vaultFile;
    /// Patterns of new names that are left out, besides those of the file `.vaultignore` at the top.
    std::vector<std::string> excluded;
    bool oneFileSystem = false;
    /// Whether the last version has this path, which a pattern excludes. Called from several threads.
    std::function<bool(std::string const& path)> isSaved;
};

/// What lies below a directory, as far as it is to be saved.
struct Scan {
    /// The top comes first, and every directory before those in it.
    std::deque<ScannedDirectory> directories;
    /// Paths with what is wrong there, for people.
    std::vector<std::string> problems;
    std::vector<std::string> specials;
    /// Saved paths that patterns exclude; they are among the entries.
    std::vector<std::string> excludedSaved;
};

/// Looks at everything below a directory, on several threads and without following links.
/// @throws Problem if the top is no directory that can be read, or directories are nested too deep
[[nodiscard]] Scan ScanDirectory(ScanOptions const& options);

} // namespace vault
