#pragma once

#include "Trees.h"

namespace vault {

/// A path that differs between two versions.
struct PathChange {
    enum class Kind : std::uint8_t { Added, Removed, Changed, Mode, DirectoryBecameFile, FileBecameDirectory };

    Kind kind = Kind::Changed;
    /// As trees have it; that of an empty directory ends with "/".
    std::string path;
    Id oldId;
    Id newId;
    /// A directory in which the same is different as in this one is not listed again.
    std::string sameAs;
};

[[nodiscard]] std::string_view WordFor(PathChange::Kind kind) noexcept;

/// The files that differ between two trees, the empty directories that came and went, and what else has other permission
/// bits, ordered by path.
/// @param path only what lies there; empty for everything
/// @throws Problem if a directory is damaged or missing
[[nodiscard]] std::vector<PathChange> FindChanges(IArchive& archive, Id const& before, Id const& after,
                                                  std::string_view path = {});

} // namespace vault
