#include "KivVcs/Repository.h"

#include "commit/Ancestors.h"
#include "repository/CommitSet.h"
#include "repository/CommonBaseIndex.h"

namespace KivVcs {

cow_ptr<Commit> Repository::GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const {
    if (!first || !second)
        return nullptr;
    if (commonBases_ != nullptr) {
        if (const auto base = commonBases_->Find(*first, *second))
            return cow_ptr<Commit>::share(*base);
    }
    CommitSet visited;
    AncestorIterator left(first.get());
    AncestorIterator right(second.get());
    while (left || right) {
        if (left && visited.Insert(*left) != nullptr)
            return cow_ptr<Commit>::share(left.Get());
        if (right && visited.Insert(*right) != nullptr)
            return cow_ptr<Commit>::share(right.Get());
        if (left)
            ++left;
        if (right)
            ++right;
    }
    return nullptr;
}

bool Repository::FastForwardMerge(cow_ptr<Commit> commit) {
    if (!commit)
        return false;
    const auto head = GetHead();
    const auto base = GetCommonBase(head, commit);
    // Compares objects. A branch without a head, for which both are null, moves forward to any commit.
    return base == head && MoveBranchTo(Repository::GetCurentBranch(), std::move(commit));
}

} // namespace KivVcs
