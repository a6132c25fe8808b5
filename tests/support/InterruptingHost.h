#pragma once

#include "support/Builders.h"

#include <exception>
#include <stdexcept>

/// A host whose storage, repository and objects fail in the middle of the library's operations.

namespace KivVcs {

struct Interruption : std::exception {};

/// Counts the calls to a host, and throws at one of them; at none for 0.
class HostCalls {
public:
    void InterruptAt(unsigned call) { left_ = call; }
    void Count() {
        if (left_ != 0 && --left_ == 0)
            throw Interruption();
    }
    /// Sets whether contents may be asked for.
    void PermitContent(bool isPermitted) { isContentPermitted_ = isPermitted; }
    void CountContent() {
        if (!isContentPermitted_)
            throw std::logic_error("content was asked for that is not needed");
        Count();
    }

private:
    unsigned left_ = 0;
    bool isContentPermitted_ = true;
};

class InterruptingStorage : public MemObjectsStorage {
    using Name = KivStringViewT<char16_t>;

public:
    explicit InterruptingStorage(HostCalls& calls) : calls_(&calls) {}

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
    InterruptingStorage const& Counted() const { return calls_->Count(), *this; }
    InterruptingStorage& Counted() { return calls_->Count(), *this; }

    HostCalls* calls_;
};

/// Counts those operations of a repository that do not call its storage.
class InterruptingRepository : public Repository {
public:
    InterruptingRepository(std::unique_ptr<IObjectsStorage>&& storage, HostCalls& calls)
        : Repository(std::move(storage)), calls_(&calls) {}

    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return Counted().Repository::GetCommonBase(std::move(first), std::move(second));
    }
    void UpdateStorage() override { Counted().Repository::UpdateStorage(); }

private:
    InterruptingRepository const& Counted() const { return calls_->Count(), *this; }
    InterruptingRepository& Counted() { return calls_->Count(), *this; }

    HostCalls* calls_;
};

/// A blob that knows its identifier and fetches its content when asked for it.
class FetchedBlob final : public Blob {
public:
    FetchedBlob(std::string const& content, HostCalls& calls)
        : fetched_(MakeBlob(content).GetData()), id_(MakeBlob(content).GetId()), calls_(&calls) {}

    Id GetId() const override { return calls_->Count(), id_; }
    Buffer const& GetData() const override { return calls_->CountContent(), fetched_; }

protected:
    cow_ptr<Blob> Copy() const override { return immu::make<FetchedBlob>(*this); }

private:
    Buffer fetched_;
    Id id_;
    HostCalls* calls_;
};

/// A tree or a commit of a host's class that changes nothing.
template <class Base>
class HostsOwn final : public Base {
public:
    HostsOwn(Base const& base, HostCalls& calls) : Base(base), calls_(&calls) {}

    Id GetId() const override { return calls_->Count(), Base::GetId(); }
    Buffer const& GetData() const override { return calls_->Count(), Base::GetData(); }
    KivStringT<char> GetHeader() const override { return calls_->Count(), Base::GetHeader(); }

protected:
    cow_ptr<Base> Copy() const override { return immu::make<HostsOwn>(*this); }

private:
    HostCalls* calls_;
};

} // namespace KivVcs
