#include "KivVcs/Repository.h"

namespace KivVcs {

namespace {

/// The branch heads of a deleted chain, newest first.
struct KeptHeads {
    /// Private copies without parents.
    std::vector<cow_ptr<Commit>> commits;
    /// The names of the branches that point at each of them.
    std::vector<std::vector<KivStringT<char16_t>>> branches;
};

/// Takes the chain out of the storage. The only reference to the old commits that this holds is @p newest, and only to
/// one at a time, so that they die as soon as nobody else holds them.
KeptHeads DeleteChain(IObjectsStorage& storage, cow_ptr<Commit> newest) {
    KeptHeads kept;
    for (auto commit = std::move(newest); commit; commit = commit->GetParent()) {
        if (auto branches = storage.GetCommitBranches(commit); !branches.empty()) {
            kept.commits.push_back(commit);
            kept.commits.back().write()->SetParent(nullptr);
            kept.branches.push_back(std::move(branches));
        }
        storage.DeleteCommit(commit);
    }
    return kept;
}

void MoveBranches(IRepository& repository, KeptHeads const& kept) {
    for (std::size_t index = 0; index < kept.commits.size(); ++index) {
        for (auto const& branch : kept.branches[index]) {
            if (!repository.MoveBranchTo(branch, kept.commits[index]))
                break;
        }
    }
}

} // namespace

bool Repository::DeleteCommits(cow_ptr<Commit> commit) {
    if (storage_ == nullptr)
        return false;
    if (!commit || !commit->GetParent())
        return true;
    {
        // Gone before the purge: whatever is held here would survive it.
        auto kept = DeleteChain(*storage_, std::move(commit));
        if (kept.commits.empty())
            return true;
        if (!Commit::MakeCommitLinksInOrder(kept.commits, this))
            return false;
        MoveBranches(*this, kept);
    }
    UpdateStorage();
    return true;
}

} // namespace KivVcs
