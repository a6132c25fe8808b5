#pragma once

#include "Trees.h"

#include <sys/stat.h>

namespace vault {

/// What says whether a file has changed since it was read.
struct FileState {
    std::uint64_t size = 0;
    /// In nanoseconds since 1970.
    std::int64_t modified = 0;
    std::int64_t changed = 0;
    std::uint64_t inode = 0;
    std::uint32_t mode = 0;

    friend bool operator==(FileState const&, FileState const&) noexcept = default;
};

[[nodiscard]] FileState StateOf(struct stat const& status) noexcept;

/// What the last save of a directory found: the states of its files, and the identifiers that they had. Kept as a record of
/// the archive, so that a save reads only what has changed.
class StatIndex {
public:
    struct File {
        std::string name;
        FileState state;
        Id id;
    };
    struct IndexedDirectory {
        /// The tree that the directory had; null if one of its files is left out here.
        Id tree;
        /// In the order of the tree; without directories, and without files that may have changed since unnoticed.
        std::vector<File> files;
    };

    /// What is not an index is an empty one.
    [[nodiscard]] static StatIndex Read(std::string_view bytes);
    [[nodiscard]] std::string Write() const;

    /// The directory at @p path, which ends with "/" unless it is empty; null if there is none.
    [[nodiscard]] IndexedDirectory const* Find(std::string const& path) const;
    void Add(std::string path, IndexedDirectory directory) {
        directories_.push_back({std::move(path), std::move(directory)});
    }

private:
    std::vector<std::pair<std::string, IndexedDirectory>> directories_;
    std::unordered_map<std::string, std::size_t> positions_;
};

/// Reads the index of the directory at @p top from the records of @p archive; an empty one if there is none.
[[nodiscard]] std::string ReadIndex(IArchive& archive, std::string const& top);
/// Adds to @p change what replaces the index @p before by @p after.
void WriteIndex(KivArchive::Change& change, std::string const& top, std::string const& before,
                std::string const& after);

} // namespace vault
