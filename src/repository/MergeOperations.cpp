#include "KivVcs/Repository.h"

#include "repository/RootTree.h"

namespace KivVcs {

bool Repository::Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) {
    if (!commit)
        return false;
    const auto head = GetHead();
    if (!head)
        return false;
    const auto base = GetCommonBase(head, commit);
    auto merged = ThreeWayMerge(this, {RootTreeOf(head), RootTreeOf(base), RootTreeOf(commit)}, std::move(resolvers));
    if (!merged)
        return false;
    Commit mergeCommit(head, false);
    mergeCommit.ReplaceRoot(this, std::move(merged));
    return DoCommit(mergeCommit) != nullptr;
}

bool Repository::Merge(cow_ptr<Commit> commit, Resolvers resolvers) {
    if (!commit)
        return false;
    if (!GetHead())
        return MoveBranchTo(GetCurentBranch(), std::move(commit));
    // Not as virtual calls: a merge does what this class does, even if a host overrides these two operations.
    return Repository::FastForwardMerge(commit) || Repository::Merge3Way(std::move(commit), std::move(resolvers));
}

} // namespace KivVcs
