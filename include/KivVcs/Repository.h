#pragma once

/// @file
/// Commits on branches: the repository.

#include "KivVcs/IRepository.h"
#include "KivVcs/Merge.h"
#include "KivVcs/Storage.h"

namespace KivVcs {

class CommonBaseIndex;

/// The repository: owns one storage and knows which branch is current. There is no working copy; the head of a branch
/// is always read from the storage. Without a storage, lookups give null, counts 0 and everything else false.
class KIVVCS_EXPORT Repository : public IRepository {
public:
    /// Takes the storage over, which may be null, and makes "master" the current branch, whether or not it exists.
    explicit Repository(std::unique_ptr<IObjectsStorage>&& storage);
    Repository(Repository const&) = delete;
    Repository& operator=(Repository const&) = delete;
    virtual ~Repository();

    cow_ptr<Commit> DoCommit(Commit& commit) override;
    [[nodiscard]] cow_ptr<Commit> GetHead() const override;
    [[nodiscard]] cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const override;
    [[nodiscard]] KivStringT<char16_t> GetCurentBranch() const override;
    [[nodiscard]] cow_ptr<Commit> GetCommitFromStorage(Id const& id) const override;
    [[nodiscard]] cow_ptr<Tree> GetTreeFromStorage(Id const& id) const override;
    [[nodiscard]] cow_ptr<Blob> GetBlobFromStorage(Id const& id) const override;
    cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) override;
    cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) override;
    cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) override;
    [[nodiscard]] std::uint64_t GetCommitCount() const override;
    [[nodiscard]] std::uint64_t GetTreeCount() const override;
    [[nodiscard]] std::uint64_t GetBlobCount() const override;
    bool DeleteCommits(cow_ptr<Commit> commit) override;
    bool SimplifyCommitGraph(bool purge) override;
    void UpdateStorage() override;
    [[nodiscard]] IObjectsStorage* GetStorage() override;
    [[nodiscard]] IObjectsStorage const* GetStorage() const override;
    [[nodiscard]] cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override;
    bool Checkout(KivStringViewT<char16_t> branch) override;
    bool CreateBranch(KivStringViewT<char16_t> branch, cow_ptr<Commit> head) override;
    [[nodiscard]] bool BranchExist(KivStringViewT<char16_t> branch) override;
    bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) override;
    bool RemoveBranch(KivStringViewT<char16_t> branch) override;
    bool EnsureCommonRootFor(KivStringViewT<char16_t> first, KivStringViewT<char16_t> second,
                             KivStringViewT<char16_t> rootBranch) override;
    bool FastForwardMerge(cow_ptr<Commit> commit) override;
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override;
    bool Merge(cow_ptr<Commit> commit, Resolvers resolvers) override;

    /// Hands an object to the storage without looking it up first; the first object under an identifier stays.
    /// @pre the pointer is not null
    void AddCommitToStorage(cow_ptr<Commit> commit);
    void AddTreeToStorage(cow_ptr<Tree> tree);
    void AddBlobToStorage(cow_ptr<Blob> blob);

    /// Puts the line of commits from @p commit down to, but without, @p base on top of @p onto: the same trees, authors
    /// and times with new parents. A null @p base moves the whole history; if @p commit is @p base, that commit alone
    /// is moved. Commits are compared as objects. No branch moves, and the old commits stay.
    /// @return the new tip; @p commit itself if it sits on @p onto already; null if @p commit or @p onto is null.
    cow_ptr<Commit> MergelessRebase(cow_ptr<Commit> commit, cow_ptr<Commit> base, cow_ptr<Commit> onto);
    /// The same for the head of @p branch, from its common base with the head of @p ontoBranch.
    cow_ptr<Commit> MergelessRebase(KivStringViewT<char16_t> branch, KivStringViewT<char16_t> ontoBranch);

protected:
    /// Called by `SimplifyCommitGraph`, `DeleteCommits`, `MergelessRebase` and what calls them whenever they have
    /// stored a commit anew on top of another parent: before a branch moves to @p rebuilt, and before anything is
    /// purged. @p old still has its whole history. Not called if both have the same identifier.
    ///
    /// Does nothing. What an override throws ends the operation; what has been stored or moved by then stays so.
    virtual void CommitRewritten(cow_ptr<Commit> old, cow_ptr<Commit> rebuilt);

private:
    class GraphSimplification;

    void AnnounceRewrite(cow_ptr<Commit> const& old, cow_ptr<Commit> const& rebuilt);

    std::unique_ptr<IObjectsStorage> storage_;
    KivStringT<char16_t> currentBranch_;
    /// The index in which `GetCommonBase` looks first while the commit graph is being simplified; null otherwise.
    CommonBaseIndex const* commonBases_ = nullptr;
};

} // namespace KivVcs
