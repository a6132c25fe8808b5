#include "Changes.h"
#include "repository/RepositoryState.h"

#include <algorithm>

namespace KivArchive {

RefreshOutcome ArchivedRepository::Refresh(IProgress* progress) {
    ReportProgress(progress, {"looking at branches", 0, 0}, {});
    auto const theirs = state_->Archive().ReadBranches();
    std::vector<Id> heads;
    for (Branch const& branch : theirs) {
        auto const known = state_->branches.find(branch.name);
        if (known == state_->branches.end() || known->second.unreadable || !(known->second.published == branch.head))
            heads.push_back(branch.head);
    }
    state_->source->LoadCommits(heads);
    ReportProgress(progress, {"looking at branches", theirs.size(), theirs.size()}, {});
    RefreshOutcome outcome;
    for (Branch const& branch : theirs)
        RefreshBranch(branch, outcome);
    ForgetRemoved(theirs, outcome);
    return outcome;
}

void ArchivedRepository::RefreshBranch(Branch const& theirs, RefreshOutcome& outcome) {
    KnownBranch& known = state_->branches.try_emplace(theirs.name).first->second;
    bool const isThere = state_->storage->BranchExist(theirs.name);
    Id const own = state_->OwnHead(theirs.name);
    bool const isNew = !(known.taken == theirs.head);
    bool const isToBeRead = known.unreadable && isThere && own.IsEmpty();
    bool const hasUnpublished = !isToBeRead && !(own == known.taken);
    known.published = theirs.head;
    if (own == theirs.head) {
        known.taken = theirs.head;
        known.unreadable.reset();
        return;
    }
    if (hasUnpublished && isThere && isNew)
        outcome.diverged.push_back(theirs.name);
    // A branch that was removed here comes back if others have moved it.
    if (hasUnpublished && (isThere || !isNew))
        return;
    TakePublished(theirs.name);
    if (known.taken == theirs.head)
        outcome.moved.push_back(theirs.name);
}

void ArchivedRepository::ForgetRemoved(std::vector<Branch> const& theirs, RefreshOutcome& outcome) {
    std::vector<KivStringT<char16_t>> removed;
    for (auto const& [name, known] : state_->branches)
        if (std::none_of(theirs.begin(), theirs.end(),
                         [&name = name](Branch const& branch) { return branch.name == name; }))
            removed.push_back(name);
    for (auto const& name : removed) {
        if (BranchExist(name) && !HasUnpublished(name)) {
            RemoveBranch(name);
            outcome.moved.push_back(name);
        }
        // If the branch is still here, it is a new one from now on.
        state_->branches.erase(name);
    }
}

/// Moves the branch to its published head, or leaves it without one if that cannot be read.
void ArchivedRepository::TakePublished(KivStringT<char16_t> const& branch) {
    KnownBranch& known = state_->branches.at(branch);
    cow_ptr<Commit> head;
    try {
        head = state_->source->FetchCommit(known.published);
    } catch (ArchiveError const& error) {
        bool const isLocal = error.GetKind() == Failure::Damaged || error.GetKind() == Failure::Unrepresentable ||
                             error.GetKind() == Failure::Collected;
        if (!isLocal)
            throw;
        known.unreadable = error.GetKind();
        if (state_->storage->GetHead(branch))
            state_->storage->RemoveBranch(branch);
        state_->storage->CreateBranch(branch, nullptr);
        known.taken = known.published;
        return;
    }
    bool const hasMoved =
        BranchExist(branch) ? MoveBranchTo(branch, std::move(head)) : CreateBranch(branch, std::move(head));
    // A host's class may refuse to move. Its head must then not seem to include what others have published.
    if (hasMoved && state_->OwnHead(branch) == known.published) {
        known.taken = known.published;
        known.unreadable.reset();
    }
}

} // namespace KivArchive
