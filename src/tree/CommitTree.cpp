#include "KivVcs/CommitTree.h"

#include "KivVcs/IRepository.h"

namespace KivVcs {

namespace {

/// Adds to @p root, which is made if there is none, but not if the addition ends in an exception.
template <class Add>
auto AddTo(cow_ptr<Tree>& root, Add add) {
    if (root)
        return add(*root.write());
    cow_ptr<Tree> made;
    auto added = add(*made.write());
    root = std::move(made);
    return added;
}

} // namespace

cow_ptr<CommitTree> CommitTree::Deserialize(Id const& id, IRepository* repo,
                                            PortableVersion::Delegate<StreamIO(Id const&)> loader) {
    cow_ptr<Tree> root = Tree::Deserialize(id, repo, std::move(loader));
    return root ? immu::make<CommitTree>(std::move(root)) : nullptr;
}

cow_ptr<Blob> CommitTree::AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob) {
    return AddTo(root_, [&](Tree& root) { return root.AddBlob(repo, path, blob); });
}

bool CommitTree::AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs) {
    return AddTo(root_, [&](Tree& root) { return root.AddBlobs(repo, blobs); });
}

cow_ptr<Tree> CommitTree::AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree) {
    return AddTo(root_, [&](Tree& root) { return root.AddTree(repo, path, tree); });
}

cow_ptr<Object> CommitTree::AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id) {
    return AddTo(root_, [&](Tree& root) { return root.AddObject(repo, path, id); });
}

bool CommitTree::RemoveObject(IRepository* repo, KivStringViewT<char16_t> path) {
    return root_ && root_.write()->RemoveObject(repo, path);
}

cow_ptr<Blob> CommitTree::GetBlob(KivStringViewT<char16_t> path) const {
    return root_ ? root_->GetDeepBlob(path) : nullptr;
}

cow_ptr<Tree> CommitTree::GetTree(KivStringViewT<char16_t> path) const {
    return root_ ? root_->GetDeepTree(path) : nullptr;
}

Id CommitTree::GetRootId() const {
    return root_ ? root_->GetId() : Id();
}

void CommitTree::ReplaceRoot(IRepository* repo, cow_ptr<Tree> root) {
    if (repo != nullptr && root) {
        if (cow_ptr<Tree> stored = repo->GetTreeFromStorage(root->GetId()))
            root = std::move(stored);
    }
    root_ = std::move(root);
}

bool CommitTree::IsEmpty() const noexcept {
    return !root_ || root_->IsEmpty();
}

optional<Id> CommitTree::GetIdByPath(KivStringViewT<char16_t> path) const {
    return root_ ? root_->GetIdByPath(path) : std::nullopt;
}

PathList CommitTree::GetBlobDiffs(cow_ptr<CommitTree> const& other) const {
    const cow_ptr<Tree> theirs = other ? other->GetRoot() : nullptr;
    if (root_)
        return root_->GetDeepBlobDiffs(theirs);
    return theirs ? theirs->GetDeepBlobPaths() : PathList();
}

PathList CommitTree::GetAllBlobPaths() const {
    return root_ ? root_->GetDeepBlobPaths() : PathList();
}

std::uint64_t CommitTree::GetBlobCount() const {
    return root_ ? root_->GetDeepBlobCount() : 0;
}

cow_ptr<CommitTree> dll_wrapped_shared(std::unique_ptr<CommitTree> tree) {
    return cow_ptr<CommitTree>(std::move(tree));
}

} // namespace KivVcs
