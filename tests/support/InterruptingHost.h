#pragma once

#include "KivVcs/KivVcs.h"

#include <exception>

/// A host whose operations fail in the middle of what the library does.

namespace KivVcs {

struct Interruption : std::exception {};

/// Counts the calls to a host, and throws at the one that it is told, unless that is 0.
class Countdown {
public:
    void Start(unsigned calls) { left_ = calls; }
    void Stop() { left_ = 0; }
    void Count() {
        if (left_ != 0 && --left_ == 0)
            throw Interruption();
    }

private:
    unsigned left_ = 0;
};

class InterruptingStorage : public MemObjectsStorage {
    using Name = KivStringViewT<char16_t>;

public:
    explicit InterruptingStorage(Countdown& countdown) : countdown_(&countdown) {}

    std::unique_ptr<IObjectsStorage> Clone() const override { return std::make_unique<InterruptingStorage>(*this); }
    cow_ptr<Commit> GetCommit(Id const& id) const override { return Counted().MemObjectsStorage::GetCommit(id); }
    cow_ptr<Tree> GetTree(Id const& id) const override { return Counted().MemObjectsStorage::GetTree(id); }
    cow_ptr<Blob> GetBlob(Id const& id) const override { return Counted().MemObjectsStorage::GetBlob(id); }
    void AddCommit(cow_ptr<Commit> commit) override { Counted().MemObjectsStorage::AddCommit(std::move(commit)); }
    void AddTree(cow_ptr<Tree> tree) override { Counted().MemObjectsStorage::AddTree(std::move(tree)); }
    void AddBlob(cow_ptr<Blob> blob) override { Counted().MemObjectsStorage::AddBlob(std::move(blob)); }
    void DeleteCommit(cow_ptr<Commit> commit) override { Counted().MemObjectsStorage::DeleteCommit(std::move(commit)); }
    void PurgeUnusedObjects() override { Counted().MemObjectsStorage::PurgeUnusedObjects(); }
    bool BranchExist(Name name) const override { return Counted().MemObjectsStorage::BranchExist(name); }
    bool CreateBranch(Name name, cow_ptr<Commit> commit) override {
        return Counted().MemObjectsStorage::CreateBranch(name, std::move(commit));
    }
    bool RemoveBranch(Name name) override { return Counted().MemObjectsStorage::RemoveBranch(name); }
    bool UpdateBranch(Name name, cow_ptr<Commit> commit) override {
        return Counted().MemObjectsStorage::UpdateBranch(name, std::move(commit));
    }
    cow_ptr<Commit> GetHead(Name name) const override { return Counted().MemObjectsStorage::GetHead(name); }
    std::vector<KivStringT<char16_t>> GetCommitBranches(cow_ptr<Commit> commit) const override {
        return Counted().MemObjectsStorage::GetCommitBranches(std::move(commit));
    }

private:
    InterruptingStorage const& Counted() const { return countdown_->Count(), *this; }
    InterruptingStorage& Counted() { return countdown_->Count(), *this; }

    Countdown* countdown_;
};

class InterruptingRepository : public Repository {
    using Name = KivStringViewT<char16_t>;

public:
    InterruptingRepository(std::unique_ptr<IObjectsStorage>&& storage, Countdown& countdown)
        : Repository(std::move(storage)), countdown_(&countdown) {}

    cow_ptr<Commit> DoCommit(Commit& commit) override { return Counted().Repository::DoCommit(commit); }
    cow_ptr<Commit> GetHead() const override { return Counted().Repository::GetHead(); }
    cow_ptr<Commit> GetHead(Name branch) const override { return Counted().Repository::GetHead(branch); }
    KivStringT<char16_t> GetCurentBranch() const override { return Counted().Repository::GetCurentBranch(); }
    cow_ptr<Commit> GetCommitFromStorage(Id const& id) const override {
        return Counted().Repository::GetCommitFromStorage(id);
    }
    cow_ptr<Tree> GetTreeFromStorage(Id const& id) const override {
        return Counted().Repository::GetTreeFromStorage(id);
    }
    cow_ptr<Blob> GetBlobFromStorage(Id const& id) const override {
        return Counted().Repository::GetBlobFromStorage(id);
    }
    cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) override {
        return Counted().Repository::SyncWithStorage(std::move(commit));
    }
    cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) override {
        return Counted().Repository::SyncWithStorage(std::move(tree));
    }
    cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) override {
        return Counted().Repository::SyncWithStorage(std::move(blob));
    }
    void UpdateStorage() override { Counted().Repository::UpdateStorage(); }
    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return Counted().Repository::GetCommonBase(std::move(first), std::move(second));
    }
    bool BranchExist(Name branch) override { return Counted().Repository::BranchExist(branch); }
    bool CreateBranch(Name branch, cow_ptr<Commit> head) override {
        return Counted().Repository::CreateBranch(branch, std::move(head));
    }
    bool MoveBranchTo(Name branch, cow_ptr<Commit> commit) override {
        return Counted().Repository::MoveBranchTo(branch, std::move(commit));
    }
    bool FastForwardMerge(cow_ptr<Commit> commit) override {
        return Counted().Repository::FastForwardMerge(std::move(commit));
    }
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override {
        return Counted().Repository::Merge3Way(std::move(commit), std::move(resolvers));
    }

private:
    InterruptingRepository const& Counted() const { return countdown_->Count(), *this; }
    InterruptingRepository& Counted() { return countdown_->Count(), *this; }

    Countdown* countdown_;
};

} // namespace KivVcs
