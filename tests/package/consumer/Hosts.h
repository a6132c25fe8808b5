#pragma once

#include <KivVcs/KivVcs.h>

#include <stdexcept>
#include <utility>

/// Hosts that implement the library's interfaces themselves, by handing on to what the library has, or derive from its
/// classes, and throw exceptions of their own.
namespace hosts {

using namespace KivVcs;
using Path = KivStringViewT<char16_t>;

struct Refused : std::runtime_error {
    using std::runtime_error::runtime_error;
};

class Stream final : public IStream {
public:
    bool Read(void*, std::uint64_t) override { throw Refused("read"); }
    bool Write(const void*, std::uint64_t) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return 1; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return 0; }
};

class Note final : public IObject {
public:
    bool operator==(IObject const& other) const override { return GetId() == other.GetId(); }
    bool operator!=(IObject const& other) const override { return !(*this == other); }
    Id GetId() const override { return blob_.GetId(); }
    [[nodiscard]] KivStringT<char> GetHeader() const override { return "note"; }
    [[nodiscard]] KivStringT<char> GetStoragePrefix() const override { return "100644"; }
    Buffer const& GetPackedData() const override { return blob_.GetPackedData(); }
    Buffer const& GetData() const override { return blob_.GetData(); }
    [[nodiscard]] KivStringT<char16_t> ToString() const override { return blob_.ToString(); }
    void ResetState() override { blob_.ResetState(); }

private:
    Blob blob_;
};

class Storage final : public MemObjectsStorage {
public:
    bool refuses = false;

    void AddBlob(cow_ptr<Blob> blob) override {
        if (refuses)
            throw Refused("add");
        MemObjectsStorage::AddBlob(std::move(blob));
    }
};

class Repository final : public IRepository {
public:
    explicit Repository(std::unique_ptr<IObjectsStorage> storage) : kept_(std::move(storage)) {}

    cow_ptr<Commit> DoCommit(Commit& commit) override { return kept_.DoCommit(commit); }
    [[nodiscard]] cow_ptr<Commit> GetHead() const override { return kept_.GetHead(); }
    [[nodiscard]] cow_ptr<Commit> GetHead(Path branch) const override { return kept_.GetHead(branch); }
    [[nodiscard]] KivStringT<char16_t> GetCurentBranch() const override { return kept_.GetCurentBranch(); }
    [[nodiscard]] cow_ptr<Commit> GetCommitFromStorage(Id const& id) const override {
        return kept_.GetCommitFromStorage(id);
    }
    [[nodiscard]] cow_ptr<Tree> GetTreeFromStorage(Id const& id) const override { return kept_.GetTreeFromStorage(id); }
    [[nodiscard]] cow_ptr<Blob> GetBlobFromStorage(Id const& id) const override { return kept_.GetBlobFromStorage(id); }
    cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) override {
        return kept_.SyncWithStorage(std::move(commit));
    }
    cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) override { return kept_.SyncWithStorage(std::move(tree)); }
    cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) override { return kept_.SyncWithStorage(std::move(blob)); }
    [[nodiscard]] std::uint64_t GetCommitCount() const override { return kept_.GetCommitCount(); }
    [[nodiscard]] std::uint64_t GetTreeCount() const override { return kept_.GetTreeCount(); }
    [[nodiscard]] std::uint64_t GetBlobCount() const override { return kept_.GetBlobCount(); }
    bool DeleteCommits(cow_ptr<Commit> commit) override { return kept_.DeleteCommits(std::move(commit)); }
    bool SimplifyCommitGraph(bool purge) override { return kept_.SimplifyCommitGraph(purge); }
    void UpdateStorage() override { kept_.UpdateStorage(); }
    [[nodiscard]] IObjectsStorage* GetStorage() override { return kept_.GetStorage(); }
    [[nodiscard]] IObjectsStorage const* GetStorage() const override { return std::as_const(kept_).GetStorage(); }
    [[nodiscard]] cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return kept_.GetCommonBase(std::move(first), std::move(second));
    }
    bool Checkout(Path branch) override { return kept_.Checkout(branch); }
    bool CreateBranch(Path branch, cow_ptr<Commit> head) override {
        return kept_.CreateBranch(branch, std::move(head));
    }
    [[nodiscard]] bool BranchExist(Path branch) override { return kept_.BranchExist(branch); }
    bool MoveBranchTo(Path branch, cow_ptr<Commit> commit) override {
        return kept_.MoveBranchTo(branch, std::move(commit));
    }
    bool RemoveBranch(Path branch) override { return kept_.RemoveBranch(branch); }
    bool EnsureCommonRootFor(Path first, Path second, Path rootBranch) override {
        return kept_.EnsureCommonRootFor(first, second, rootBranch);
    }
    bool FastForwardMerge(cow_ptr<Commit> commit) override { return kept_.FastForwardMerge(std::move(commit)); }
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override {
        return kept_.Merge3Way(std::move(commit), std::move(resolvers));
    }
    bool Merge(cow_ptr<Commit> commit, Resolvers resolvers) override {
        return kept_.Merge(std::move(commit), std::move(resolvers));
    }

private:
    KivVcs::Repository kept_;
};

} // namespace hosts
