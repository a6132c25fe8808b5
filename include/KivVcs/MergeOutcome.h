#pragma once

/// @file
/// Merges that say what they did.

#include "KivVcs/Conflicts.h"
#include "KivVcs/IRepository.h"

#include <vector>

namespace KivVcs {

/// What became of the current branch.
enum class MergeResult : std::int32_t {
    /// The branch has the commit in its history already; nothing was done.
    UpToDate = 0,
    /// The branch moved forward to the commit; no new commit was needed.
    Forwarded = 1,
    /// A new commit has the changes of both sides, even if its tree is that of one of them.
    Merged = 2,
    /// Conflicts are left undecided; nothing was committed.
    GaveUp = 3,
    /// There is no commit to merge, or the merge leaves no tree to commit.
    NothingToCommit = 4,
    /// The repository did not take the result: it has no storage, or no such branch.
    Refused = 5,
};

struct MergeOutcome {
    MergeResult result = MergeResult::NothingToCommit;
    /// Every conflict that a resolver settled, in the order of asking; after a merge that gave up also all that are
    /// left, undecided, after them.
    std::vector<MergeConflict> conflicts;

    /// Whether the current branch has the commit's changes now.
    [[nodiscard]] bool Succeeded() const noexcept { return result <= MergeResult::Merged; }
};

/// `IRepository::Merge`, with an account of what was done. Nothing is committed if the branch has @p commit already.
/// Calls `GetHead` and `GetCommonBase` of @p repository first, and `GetHead` again afterwards.
///
/// An empty tree resolver merges directories entry by entry; an empty blob resolver leaves every conflict undecided.
/// Once a resolver has not decided, none is asked again: the other conflicts, against the common base, are only listed.
/// @throws what resolvers and @p repository throw
[[nodiscard]] KIVVCS_EXPORT MergeOutcome MergeWithOutcome(IRepository& repository, cow_ptr<Commit> const& commit,
                                                          Resolvers resolvers);

} // namespace KivVcs
