#pragma once

#include "KivVcs/KivVcs.h"

#include <exception>

/// A host whose operations fail in the middle of what the library does.

namespace KivVcs {

struct Interruption : std::exception {};

/// Counts the calls to a host, and throws at the given one, unless that is 0.
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

/// Most of what a repository does asks its storage; the rest is counted here.
class InterruptingRepository : public Repository {
public:
    InterruptingRepository(std::unique_ptr<IObjectsStorage>&& storage, Countdown& countdown)
        : Repository(std::move(storage)), countdown_(&countdown) {}

    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return Counted().Repository::GetCommonBase(std::move(first), std::move(second));
    }
    void UpdateStorage() override { Counted().Repository::UpdateStorage(); }

private:
    InterruptingRepository const& Counted() const { return countdown_->Count(), *this; }
    InterruptingRepository& Counted() { return countdown_->Count(), *this; }

    Countdown* countdown_;
};

} // namespace KivVcs
