#include "KivVcs/Repository.h"

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
    Commit const* left = first.get();
    Commit const* right = second.get();
    while (left != nullptr || right != nullptr) {
        if (left != nullptr && visited.Insert(*left) != nullptr)
            return cow_ptr<Commit>::share(left);
        if (right != nullptr && visited.Insert(*right) != nullptr)
            return cow_ptr<Commit>::share(right);
        left = left == nullptr ? nullptr : left->GetParent().get();
        right = right == nullptr ? nullptr : right->GetParent().get();
    }
    return nullptr;
}

bool Repository::FastForwardMerge(cow_ptr<Commit> commit) {
    if (!commit)
        return false;
    const auto head = GetHead();
    const auto base = GetCommonBase(head, commit);
    // Identity of objects: a branch without a head, where both are null, goes forward to anything.
    return base == head && MoveBranchTo(Repository::GetCurentBranch(), std::move(commit));
}

} // namespace KivVcs
