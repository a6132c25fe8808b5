#pragma once

/// @file
/// Merges that say what they did, and the conflicts that they met.

#include "KivVcs/Differences.h"
#include "KivVcs/Merge.h"

#include <vector>

namespace KivVcs {

class Commit;
class IRepository;

/// What became of the current branch.
enum class MergeResult : std::int32_t {
    /// The branch has the commit in its history already; nothing was done.
    UpToDate = 0,
    /// The branch moved forward to the commit; no new commit was needed.
    Forwarded = 1,
    /// A new commit has what both sides did, also where that equals one of them.
    Merged = 2,
    /// Conflicts are left undecided; nothing was committed.
    GaveUp = 3,
    /// There is no commit to merge, or the merge leaves no tree to commit.
    NothingToCommit = 4,
    /// The repository did not take the result: it has no storage, or no such branch.
    Refused = 5,
};

/// How a conflict was settled.
enum class ConflictSettlement : std::int32_t {
    Undecided = 0,
    Left = 1,
    Right = 2,
    /// As it was before either side changed it.
    Root = 3,
    /// By something that neither side had: merged content, or both kept under two names. Resolvers of this library cannot
    /// answer so; merges that stand on it may.
    Combined = 4,
};

/// A path that both sides changed differently.
struct MergeConflict {
    /// Empty for the whole tree.
    KivStringT<char16_t> path;
    /// Whether it is about a directory as a whole, and the identifiers are those of directories.
    bool isDirectory = false;
    /// What each side did since the root: `Unchanged` only for a directory.
    ChangeKind leftChange = ChangeKind::Unchanged;
    ChangeKind rightChange = ChangeKind::Unchanged;
    /// What the root and each side hold there; null for nothing.
    Id rootId;
    Id leftId;
    Id rightId;
    ConflictSettlement settlement = ConflictSettlement::Undecided;
};

struct MergeOutcome {
    MergeResult result = MergeResult::NothingToCommit;
    /// Every conflict that a resolver settled, in the order of asking; after a merge that gave up also all that are left,
    /// undecided, behind them.
    std::vector<MergeConflict> conflicts;

    /// Whether the current branch has the commit's changes now.
    [[nodiscard]] bool Succeeded() const noexcept { return result <= MergeResult::Merged; }
};

/// The conflict at @p path, given as components counted from the top of @p trees: what a resolver that is asked about it
/// looks at. An empty path means the trees themselves.
[[nodiscard]] KIVVCS_EXPORT MergeConflict DescribeConflict(array_view<KivStringViewT<char16_t> const> path,
                                                           MergeTrees const& trees, bool isDirectory,
                                                           ConflictSettlement settlement);

/// The paths about which `ThreeWayMerge` would ask its blob resolver if its tree resolver always answered `Merge`, in that
/// order, undecided. Merges, stores and fetches nothing: for a look before a merge.
/// @complexity as of the merge @throws std::bad_alloc, and what hosts' objects throw
[[nodiscard]] KIVVCS_EXPORT std::vector<MergeConflict> FindConflicts(MergeTrees trees);

/// `IRepository::Merge`, with an account of what was done. Nothing is committed if the branch has @p commit already; @p
/// repository is asked with `GetHead` and `GetCommonBase` first, and with `GetHead` again afterwards.
///
/// An empty tree resolver merges directories entry by entry; an empty blob resolver leaves every conflict undecided. Once a
/// resolver has not decided, none is asked again: the other conflicts, against the common base, are only listed.
/// @throws what resolvers and @p repository throw
[[nodiscard]] KIVVCS_EXPORT MergeOutcome MergeWithOutcome(IRepository& repository, cow_ptr<Commit> const& commit,
                                                          Resolvers resolvers);

} // namespace KivVcs
