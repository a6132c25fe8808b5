#include "KivVcs/Repository.h"

namespace KivVcs {

Repository::Repository(std::unique_ptr<IObjectsStorage>&& storage)
    : storage_(std::move(storage)), currentBranch_(u"master") {}

Repository::~Repository() = default;

cow_ptr<Commit> Repository::DoCommit(Commit& commit) {
    if (storage_ == nullptr || (commit.IsAmend() && !GetHead()))
        return nullptr;
    // A commit's text stores whole seconds only.
    const Time now = Time::FromTimeT(Time::Now().ToTimeT(TimeZone::Utc), TimeZone::Utc);
    commit.SetCommitTime(now);
    commit.SetCommitTimezoneBias(DateTime::GetCurrentTimezoneBias(now));

    cow_ptr<Commit> stored = GetCommitFromStorage(commit.GetId());
    if (!stored)
        stored = SyncWithStorage(CopyOf(commit));
    // If the current branch has been removed none is moved, but the commit is stored all the same.
    storage_->UpdateBranch(Repository::GetCurentBranch(), stored);
    return stored;
}

cow_ptr<Commit> Repository::GetHead() const {
    // With a copy of the name, since an override may make another branch current.
    return GetHead(Repository::GetCurentBranch());
}

cow_ptr<Commit> Repository::GetHead(KivStringViewT<char16_t> branch) const {
    return storage_ == nullptr ? nullptr : storage_->GetHead(branch);
}

KivStringT<char16_t> Repository::GetCurentBranch() const {
    return currentBranch_;
}

cow_ptr<Commit> Repository::GetCommitFromStorage(Id const& id) const {
    return storage_ == nullptr ? nullptr : storage_->GetCommit(id);
}

cow_ptr<Tree> Repository::GetTreeFromStorage(Id const& id) const {
    return storage_ == nullptr ? nullptr : storage_->GetTree(id);
}

cow_ptr<Blob> Repository::GetBlobFromStorage(Id const& id) const {
    return storage_ == nullptr ? nullptr : storage_->GetBlob(id);
}

cow_ptr<Commit> Repository::SyncWithStorage(cow_ptr<Commit> commit) {
    if (!commit)
        return nullptr;
    if (cow_ptr<Commit> stored = GetCommitFromStorage(commit->GetId()))
        return stored;
    AddCommitToStorage(commit);
    return commit;
}

cow_ptr<Tree> Repository::SyncWithStorage(cow_ptr<Tree> tree) {
    if (!tree)
        return nullptr;
    if (cow_ptr<Tree> stored = GetTreeFromStorage(tree->GetId()))
        return stored;
    AddTreeToStorage(tree);
    return tree;
}

cow_ptr<Blob> Repository::SyncWithStorage(cow_ptr<Blob> blob) {
    if (!blob)
        return nullptr;
    if (cow_ptr<Blob> stored = GetBlobFromStorage(blob->GetId()))
        return stored;
    AddBlobToStorage(blob);
    return blob;
}

void Repository::AddCommitToStorage(cow_ptr<Commit> commit) {
    if (storage_ != nullptr)
        storage_->AddCommit(std::move(commit));
}

void Repository::AddTreeToStorage(cow_ptr<Tree> tree) {
    if (storage_ != nullptr)
        storage_->AddTree(std::move(tree));
}

void Repository::AddBlobToStorage(cow_ptr<Blob> blob) {
    if (storage_ != nullptr)
        storage_->AddBlob(std::move(blob));
}

std::uint64_t Repository::GetCommitCount() const {
    return storage_ == nullptr ? 0 : storage_->GetCommitCount();
}

std::uint64_t Repository::GetTreeCount() const {
    return storage_ == nullptr ? 0 : storage_->GetTreeCount();
}

std::uint64_t Repository::GetBlobCount() const {
    return storage_ == nullptr ? 0 : storage_->GetBlobCount();
}

void Repository::UpdateStorage() {
    if (storage_ != nullptr)
        storage_->PurgeUnusedObjects();
}

IObjectsStorage* Repository::GetStorage() {
    return storage_.get();
}

IObjectsStorage const* Repository::GetStorage() const {
    return storage_.get();
}

bool Repository::Checkout(KivStringViewT<char16_t> branch) {
    if (storage_ == nullptr || !BranchExist(branch))
        return false;
    currentBranch_ = branch;
    return true;
}

bool Repository::CreateBranch(KivStringViewT<char16_t> branch, cow_ptr<Commit> head) {
    if (storage_ == nullptr || BranchExist(branch))
        return false;
    if (!head)
        head = GetHead();
    return storage_->CreateBranch(branch, std::move(head));
}

bool Repository::BranchExist(KivStringViewT<char16_t> branch) {
    return storage_ != nullptr && storage_->BranchExist(branch);
}

bool Repository::MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) {
    return storage_ != nullptr && commit && BranchExist(branch) && storage_->UpdateBranch(branch, std::move(commit));
}

bool Repository::RemoveBranch(KivStringViewT<char16_t> branch) {
    return storage_ != nullptr && BranchExist(branch) && storage_->RemoveBranch(branch);
}

void Repository::CommitRewritten(cow_ptr<Commit>, cow_ptr<Commit>) {}

void Repository::AnnounceRewrite(cow_ptr<Commit> const& old, cow_ptr<Commit> const& rebuilt) {
    if (rebuilt && !old->HasSameId(*rebuilt))
        CommitRewritten(old, rebuilt);
}

} // namespace KivVcs
