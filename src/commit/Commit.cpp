#include "KivVcs/Commit.h"

#include "KivVcs/IRepository.h"

namespace KivVcs {

Commit::Commit(cow_ptr<Commit> parent, bool amend) : amend_(amend) {
    if (parent) {
        tree_ = parent->tree_;
        if (amend) {
            parent_ = parent->parent_;
            description_ = parent->description_;
            authorName_ = parent->authorName_;
            authorEmail_ = parent->authorEmail_;
        } else {
            parent_ = std::move(parent);
        }
    }
    if (!tree_)
        tree_.write();
}

Commit::Commit(IRepository* repository, bool amend)
    : Commit(repository == nullptr ? nullptr : repository->GetHead(), amend) {}

Commit& Commit::operator=(Commit const& other) {
    return *this = Commit(other);
}
Commit& Commit::operator=(Commit&& other) noexcept = default;

Commit::~Commit() {
    ReleaseHistory();
}

void Commit::ReleaseHistory() noexcept {
    // Ancestors that nobody else holds die here one after the other: left to their own destructors, they would take stack
    // for every commit of the history.
    while (const std::unique_ptr<Commit> last = parent_.release_if_last())
        parent_ = std::move(last->parent_);
}

void Commit::ResetState() {
    Object::ResetState();
    data_.Reset();
}

void Commit::SetAuthorName(KivStringT<char16_t> const& name) {
    authorName_ = name;
    ResetState();
}

void Commit::SetAuthorEmail(KivStringT<char16_t> const& email) {
    authorEmail_ = email;
    ResetState();
}

void Commit::SetDescription(KivStringT<char16_t> const& description) {
    description_ = description;
    ResetState();
}

void Commit::SetCommitTime(Time const& time) {
    commitTime_ = time;
    ResetState();
}

void Commit::SetCommitTimezoneBias(TimeDelta const& bias) {
    timezoneBias_ = bias;
    ResetState();
}

void Commit::SetParent(cow_ptr<Commit> parent) {
    parent_ = std::move(parent);
    ResetState();
}

void Commit::ResetPropertiesForAmend(Commit const& other) {
    SetAuthorName(other.authorName_);
    SetAuthorEmail(other.authorEmail_);
    SetDescription(other.description_);
}

namespace {

/// Makes the root of @p tree, which may be null, the storage's instance of it.
void AnchorRoot(cow_ptr<CommitTree>& tree, IRepository& repo) {
    if (cow_ptr<Tree> stored = repo.GetTreeFromStorage(tree ? tree->GetRootId() : Id())) {
        tree.write()->ReplaceRoot(&repo, std::move(stored));
        return;
    }
    if (!tree || !tree->GetRoot())
        return;
    cow_ptr<Tree> stored = repo.SyncWithStorage(tree->GetRoot());
    tree.write()->ReplaceRoot(&repo, std::move(stored));
}

} // namespace

template <class Edit>
auto Commit::EditTree(IRepository* repo, Edit edit) {
    // Edited aside and taken over when everything is done, so that an exception half-way leaves the commit as it was.
    cow_ptr<CommitTree> edited = tree_;
    auto result = edit(*edited.write());
    if (result) {
        if (repo != nullptr)
            AnchorRoot(edited, *repo);
        tree_ = std::move(edited);
        ResetState();
    }
    return result;
}

cow_ptr<Blob> Commit::AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob) {
    return EditTree(repo, [&](CommitTree& tree) { return tree.AddBlob(repo, path, blob); });
}

cow_ptr<Tree> Commit::AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree) {
    return EditTree(repo, [&](CommitTree& holder) { return holder.AddTree(repo, path, tree); });
}

cow_ptr<Object> Commit::AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id) {
    return EditTree(repo, [&](CommitTree& tree) { return tree.AddObject(repo, path, id); });
}

bool Commit::RemoveObject(IRepository* repo, KivStringViewT<char16_t> path) {
    return tree_ && EditTree(repo, [&](CommitTree& tree) { return tree.RemoveObject(repo, path); });
}

cow_ptr<Blob> Commit::GetBlob(KivStringViewT<char16_t> path) const {
    return tree_ ? tree_->GetBlob(path) : nullptr;
}

cow_ptr<CommitTree> Commit::GetTree(KivStringViewT<char16_t> path) const {
    cow_ptr<Tree> tree = tree_ ? tree_->GetTree(path) : nullptr;
    return tree ? immu::make<CommitTree>(std::move(tree)) : nullptr;
}

void Commit::ReplaceRoot(IRepository* repo, cow_ptr<Tree> root) {
    // The identifier stays until the state is reset, and so does the text that it tells.
    if (IsIdentified())
        static_cast<void>(GetPackedData());
    cow_ptr<CommitTree> edited = tree_;
    edited.write()->ReplaceRoot(repo, std::move(root));
    if (repo != nullptr)
        AnchorRoot(edited, *repo);
    tree_ = std::move(edited);
}

void Commit::RebuildTree(IRepository* repo) {
    if (repo != nullptr)
        AnchorRoot(tree_, *repo);
}

bool Commit::MakeCommitLinksInOrder(std::vector<cow_ptr<Commit>>& commits, IRepository* repo) {
    if (repo == nullptr || commits.empty())
        return false;
    commits.back().write()->ResetState();
    commits.back() = repo->SyncWithStorage(commits.back());
    for (std::size_t index = commits.size() - 1; index-- > 0;) {
        if (!commits[index] || !commits[index + 1])
            continue;
        commits[index].write()->SetParent(commits[index + 1]);
        commits[index] = repo->SyncWithStorage(commits[index]);
    }
    return true;
}

cow_ptr<Commit> dll_wrapped_shared(std::unique_ptr<Commit> commit) {
    return cow_ptr<Commit>(std::move(commit));
}

cow_ptr<std::vector<cow_ptr<Commit>>> dll_wrapped_shared(std::unique_ptr<std::vector<cow_ptr<Commit>>> commits) {
    return cow_ptr<std::vector<cow_ptr<Commit>>>(std::move(commits));
}

} // namespace KivVcs
