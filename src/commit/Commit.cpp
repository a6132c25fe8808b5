#include "KivVcs/Commit.h"

#include "KivVcs/IRepository.h"

#include <typeinfo>

namespace KivVcs {

Commit::Commit() noexcept = default;

Commit::Commit(cow_ptr<Commit> parent, bool amend) : amend_(amend) {
    if (parent) {
        tree_ = parent->tree_;
        deferred_.CopyRoot(parent->deferred_);
        if (amend) {
            parent_ = parent->parent_;
            deferred_.CopyParent(parent->deferred_);
            description_ = parent->description_;
            authorName_ = parent->authorName_;
            authorEmail_ = parent->authorEmail_;
        } else {
            parent_ = std::move(parent);
        }
    }
    if (!tree_ && deferred_.RootId() == nullptr)
        tree_.write();
}

Commit::Commit(IRepository* repository, bool amend)
    : Commit(repository == nullptr ? nullptr : repository->GetHead(), amend) {}

Commit::Commit(Commit const& other) = default;
Commit::Commit(Commit&& other) noexcept = default;
Commit& Commit::operator=(Commit const& other) {
    return *this = Commit(other);
}
Commit& Commit::operator=(Commit&& other) noexcept = default;

Commit::~Commit() {
    if (parent_ || deferred_)
        ReleaseHistory();
}

bool Commit::IsOfHostClass() const noexcept {
    return &typeid(*this) != &typeid(Commit);
}

void Commit::ReleaseHistory() noexcept {
    // Ancestors that nobody else holds die here one after the other: left to their own destructors, they would take
    // stack for every commit of the history. One of a host's class stays whole until its destructor has run, which
    // leaves the parent alone since this loop holds it, too.
    cow_ptr<Commit> oldest = std::move(parent_);
    if (!oldest && deferred_) {
        oldest = GetHeldParent();
        deferred_ = {};
    }
    while (std::unique_ptr<Commit> last = oldest.release_if_last()) {
        cow_ptr<Commit> parent = last->Commit::IsOfHostClass() ? last->parent_ : std::move(last->parent_);
        if (!parent && last->deferred_)
            parent = last->GetHeldParent();
        last.reset();
        oldest = std::move(parent);
    }
}

cow_ptr<Commit> Commit::Copy() const {
    return immu::make<Commit>(*this);
}

cow_ptr<Commit> CopyOf(Commit const& commit) {
    cow_ptr<Commit> copy = commit.IsOfHostClass() ? commit.Copy() : nullptr;
    return copy.use_count() == 1 ? copy : immu::make<Commit>(commit);
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
    deferred_.ClearParent();
    ResetState();
}

void Commit::DeferParent(Id const& id, FetchCommit fetch) {
    if (id.IsEmpty())
        deferred_.ClearParent();
    else
        deferred_.SetParent(id, std::move(fetch));
    parent_.reset();
    ResetState();
}

void Commit::DeferRoot(Id const& id, FetchTree fetch) {
    if (id.IsEmpty())
        deferred_.ClearRoot();
    else
        deferred_.SetRoot(id, std::move(fetch));
    tree_.reset();
    ResetState();
}

cow_ptr<Commit> Commit::GetParent() const {
    return cow_ptr<Commit>::share(Parent());
}

Commit const* Commit::DeferredParent() const {
    cow_ptr<Commit> const* const parent = deferred_.Parent();
    return parent == nullptr ? nullptr : parent->get();
}

cow_ptr<CommitTree> Commit::GetCommitTree() const {
    cow_ptr<CommitTree> const* const deferred = tree_ ? nullptr : deferred_.Root();
    return deferred == nullptr ? tree_ : *deferred;
}

cow_ptr<Commit> Commit::GetHeldParent() const noexcept {
    cow_ptr<Commit> const* const fetched = parent_ ? nullptr : deferred_.HeldParent();
    return fetched == nullptr ? parent_ : *fetched;
}

cow_ptr<CommitTree> Commit::GetHeldCommitTree() const noexcept {
    cow_ptr<CommitTree> const* const fetched = tree_ ? nullptr : deferred_.HeldRoot();
    return fetched == nullptr ? tree_ : *fetched;
}

Id Commit::GetParentId() const {
    if (parent_)
        return parent_->GetId();
    Id const* const deferred = deferred_.ParentId();
    return deferred == nullptr ? Id() : *deferred;
}

Id Commit::GetRootId() const {
    if (tree_)
        return tree_->GetRootId();
    Id const* const deferred = deferred_.RootId();
    return deferred == nullptr ? Id() : *deferred;
}

void Commit::SetTree(cow_ptr<CommitTree> tree) noexcept {
    tree_ = std::move(tree);
    deferred_.ClearRoot();
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
    // A copy is edited, which takes the place of the tree in the end, so that an exception leaves the commit as it was.
    cow_ptr<CommitTree> edited = GetCommitTree();
    auto result = edit(*edited.write());
    if (result) {
        if (repo != nullptr)
            AnchorRoot(edited, *repo);
        SetTree(std::move(edited));
        ResetState();
    }
    return result;
}

cow_ptr<Blob> Commit::AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob) {
    return EditTree(repo, [&](CommitTree& tree) { return tree.AddBlob(repo, path, blob); });
}

bool Commit::AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs) {
    return EditTree(repo, [&](CommitTree& tree) { return tree.AddBlobs(repo, blobs); });
}

cow_ptr<Tree> Commit::AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree) {
    return EditTree(repo, [&](CommitTree& holder) { return holder.AddTree(repo, path, tree); });
}

cow_ptr<Object> Commit::AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id) {
    return EditTree(repo, [&](CommitTree& tree) { return tree.AddObject(repo, path, id); });
}

bool Commit::RemoveObject(IRepository* repo, KivStringViewT<char16_t> path) {
    return GetCommitTree() && EditTree(repo, [&](CommitTree& tree) { return tree.RemoveObject(repo, path); });
}

cow_ptr<Blob> Commit::GetBlob(KivStringViewT<char16_t> path) const {
    const cow_ptr<CommitTree> files = GetCommitTree();
    return files ? files->GetBlob(path) : nullptr;
}

cow_ptr<CommitTree> Commit::GetTree(KivStringViewT<char16_t> path) const {
    const cow_ptr<CommitTree> files = GetCommitTree();
    cow_ptr<Tree> tree = files ? files->GetTree(path) : nullptr;
    return tree ? immu::make<CommitTree>(std::move(tree)) : nullptr;
}

void Commit::KeepText() const {
    // An identifier stays when the root is replaced. The packed form that is asked for later must be the one that it
    // was computed from, and can only be made now.
    if (IsIdentified())
        static_cast<void>(GetPackedData());
}

void Commit::ReplaceRoot(IRepository* repo, cow_ptr<Tree> root) {
    KeepText();
    cow_ptr<CommitTree> edited = GetHeldCommitTree();
    edited.write()->ReplaceRoot(repo, std::move(root));
    if (repo != nullptr)
        AnchorRoot(edited, *repo);
    SetTree(std::move(edited));
}

void Commit::RebuildTree(IRepository* repo) {
    if (repo == nullptr)
        return;
    KeepText();
    if (!tree_)
        SetTree(GetCommitTree());
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
