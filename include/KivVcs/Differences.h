#pragma once

/// @file
/// What differs between two versions, and how.

#include "KivVcs/CommitTree.h"

#include <cstddef>
#include <limits>
#include <vector>

namespace KivVcs {

/// What became of a path. Differences show every kind but `Unchanged`, sides of a conflict every kind but `Renamed`.
enum class ChangeKind : std::int32_t {
    Unchanged = 0,
    Added = 1,
    Removed = 2,
    Changed = 3,
    DirectoryBecameFile = 4,
    FileBecameDirectory = 5,
    /// Removed under one path and added, with equal content, under another.
    Renamed = 6,
};

/// One path that differs.
struct Difference {
    ChangeKind kind = ChangeKind::Unchanged;
    KivStringT<char16_t> path;
    /// Where a renamed file was before; empty otherwise.
    KivStringT<char16_t> oldPath;
    /// What the path held before and holds now: a file, or the directory that became one or was one. Null for nothing.
    Id oldId;
    Id newId;
};

struct DifferenceOptions {
    /// Pairs files that were removed with files of equal content that were added: those that kept their name first,
    /// then in the order of their paths.
    bool findRenames = false;
    /// Ends the search after this many differences or entered directories, whichever comes first: versions of unknown
    /// origin can name one directory very many times.
    std::size_t atMost = std::numeric_limits<std::size_t>::max();
};

/// Replaces each pair of a removed file and an added one with equal content by one renamed file, as
/// `DifferenceOptions::findRenames` does, in a list that was made elsewhere.
/// @param differences ordered by path
/// @throws std::bad_alloc, leaving them in any order
KIVVCS_EXPORT void PairRenames(std::vector<Difference>& differences);

/// The files that differ between two trees, ordered by path, each path once:
///
///     for (auto const& difference : Differences(before->GetCommitTree(), after->GetCommitTree()))
///
/// The paths are those of `Tree::GetDeepBlobDiffs`. Where a directory became a file, or a file a directory, the path
/// itself and the files below it are listed. Null trees count as empty. Subtrees with equal identifiers are not
/// entered, and no content is asked for.
class KIVVCS_EXPORT Differences {
public:
    /// @complexity as of `GetLocalBlobDiffs` and `GetLocalTreeDiffs` in every directory that differs
    /// @throws std::bad_alloc; std::length_error for a path that is longer than a text can be
    Differences(cow_ptr<Tree> const& before, cow_ptr<Tree> const& after, DifferenceOptions const& options = {});
    Differences(cow_ptr<CommitTree> const& before, cow_ptr<CommitTree> const& after,
                DifferenceOptions const& options = {});

    [[nodiscard]] std::vector<Difference>::const_iterator begin() const noexcept { return differences_.begin(); }
    [[nodiscard]] std::vector<Difference>::const_iterator end() const noexcept { return differences_.end(); }
    [[nodiscard]] std::size_t GetCount() const noexcept { return differences_.size(); }
    [[nodiscard]] Difference const& operator[](std::size_t index) const noexcept { return differences_[index]; }

    /// False if `DifferenceOptions::atMost` ended the search.
    [[nodiscard]] bool IsComplete() const noexcept { return isComplete_; }

private:
    std::vector<Difference> differences_;
    bool isComplete_ = true;
};

} // namespace KivVcs
