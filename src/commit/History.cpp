#include "KivVcs/History.h"

#include "KivVcs/CommitTree.h"
#include "KivVcs/Helpers.h"

#include <algorithm>
#include <utility>

namespace KivVcs {

namespace {

/// The identifier of what a commit holds at a path; null if it holds nothing there.
Id IdAt(cow_ptr<Commit> const& commit, KivStringViewT<char16_t> path) {
    const auto tree = commit ? commit->GetCommitTree() : nullptr;
    if (!tree)
        return {};
    return path.IsEmpty() ? tree->GetRootId() : tree->GetIdByPath(path).value_or(Id());
}

/// The commit itself or its newest ancestor that changed the path; null if there is none.
cow_ptr<Commit> NewestChange(cow_ptr<Commit> commit, KivStringViewT<char16_t> path) {
    for (Id here = IdAt(commit, path); commit;) {
        cow_ptr<Commit> parent = commit->GetParent();
        Id before = IdAt(parent, path);
        if (here != before)
            break;
        commit = std::move(parent);
        here = std::move(before);
    }
    return commit;
}

} // namespace

History History::Changing(KivStringViewT<char16_t> path) const {
    History result = *this;
    // Every spelling of the path without components becomes the empty text, which `IdAt` looks for.
    result.path_ = Helpers::SplitVcsPath(path).empty() ? KivStringT<char16_t>() : path.ToString();
    return result;
}

History History::First(std::uint64_t count) const {
    History result = *this;
    result.count_ = std::min(count_, count);
    return result;
}

History::Iterator History::begin() const {
    return count_ == 0 ? Iterator() : Iterator(head_, path_, count_);
}

History::Iterator History::end() const noexcept {
    return {};
}

History::Iterator::Iterator(cow_ptr<Commit> head, optional<KivStringT<char16_t>> path, std::uint64_t count)
    : commit_(path ? NewestChange(std::move(head), *path) : std::move(head)), path_(std::move(path)), left_(count) {}

History::Iterator& History::Iterator::operator++() {
    cow_ptr<Commit> next;
    if (left_ > 1) {
        next = commit_->GetParent();
        if (path_)
            next = NewestChange(std::move(next), *path_);
    }
    commit_ = std::move(next);
    --left_;
    return *this;
}

Differences DifferencesFromParent(Commit const& commit, DifferenceOptions const& options) {
    const auto parent = commit.GetParent();
    return {parent ? parent->GetCommitTree() : cow_ptr<CommitTree>(), commit.GetCommitTree(), options};
}

} // namespace KivVcs
