#include "KivVcs/History.h"
#include "KivVcs/Repository.h"

namespace KivVcs {

namespace {

/// The branch heads in a deleted history, newest first.
struct KeptHeads {
    std::vector<cow_ptr<Commit>> former;
    /// Private copies without parents.
    std::vector<cow_ptr<Commit>> commits;
    /// The names of the branches that point at each of them.
    std::vector<std::vector<KivStringT<char16_t>>> branches;
};

/// Takes the history out of the storage. Of the old commits that are no heads, only the one that the walk has reached
/// is held, so that each dies as soon as nobody else holds it.
KeptHeads DeleteChain(IObjectsStorage& storage, cow_ptr<Commit> newest) {
    KeptHeads kept;
    for (auto position = History(std::move(newest)).begin(); position != History::Iterator(); ++position) {
        cow_ptr<Commit> const& commit = *position;
        if (auto branches = storage.GetCommitBranches(commit); !branches.empty()) {
            kept.former.push_back(commit);
            kept.commits.push_back(commit);
            kept.commits.back().write()->SetParent(nullptr);
            kept.branches.push_back(std::move(branches));
        }
        storage.DeleteCommit(commit);
    }
    return kept;
}

} // namespace

bool Repository::DeleteCommits(cow_ptr<Commit> commit) {
    if (storage_ == nullptr)
        return false;
    if (!commit || !commit->GetParent())
        return true;
    KeptHeads kept = DeleteChain(*storage_, std::move(commit));
    if (kept.commits.empty())
        return true;
    if (!Commit::MakeCommitLinksInOrder(kept.commits, this))
        return false;
    for (std::size_t index = 0; index < kept.commits.size(); ++index) {
        AnnounceRewrite(kept.former[index], kept.commits[index]);
        for (auto const& branch : kept.branches[index]) {
            if (!MoveBranchTo(branch, kept.commits[index]))
                break;
        }
    }
    // The purge must remove the old commits, and so nothing here may hold them. It must not remove those that were
    // stored anew, even where a branch did not move.
    kept.former.clear();
    UpdateStorage();
    return true;
}

} // namespace KivVcs
