#pragma once

/// @file
/// The storage of a repository over an archive.

#include "repository/ObjectSource.h"

#include <KivVcs/Storage.h>

#include <list>
#include <unordered_set>

namespace KivArchive {

/// A storage in memory that objects enter as they are fetched, whichever repository, clone or thread reaches them
/// first.
///
/// What has been fetched is kept apart until the host changes the storage, since tables that hosts were given must stay
/// as they are until then. A deleted commit that somebody holds is hidden, not dropped: it stays the only living object
/// with its identifier.
///
/// Threads: as for every storage, and objects may enter at any time. The storages of one source have one lock.
class ArchivedStorage final : public KivVcs::IObjectsStorage {
public:
    explicit ArchivedStorage(std::shared_ptr<ObjectSource> source);
    ArchivedStorage(ArchivedStorage const& other);
    ArchivedStorage& operator=(ArchivedStorage const&) = delete;
    ~ArchivedStorage() override;

    [[nodiscard]] std::unique_ptr<IObjectsStorage> Clone() const override;
    [[nodiscard]] cow_ptr<Commit> GetCommit(Id const& id) const override;
    [[nodiscard]] cow_ptr<Tree> GetTree(Id const& id) const override;
    [[nodiscard]] cow_ptr<Blob> GetBlob(Id const& id) const override;
    void AddCommit(cow_ptr<Commit> commit) override;
    void AddTree(cow_ptr<Tree> tree) override;
    void AddBlob(cow_ptr<Blob> blob) override;
    [[nodiscard]] std::uint64_t GetCommitCount() const override;
    [[nodiscard]] std::uint64_t GetTreeCount() const override;
    [[nodiscard]] std::uint64_t GetBlobCount() const override;
    [[nodiscard]] CommitTable const& GetCommits() const override;
    [[nodiscard]] TreeTable const& GetTrees() const override;
    [[nodiscard]] BlobTable const& GetBlobs() const override;
    [[nodiscard]] ReferenceTable const& GetRefs() const override;
    void DeleteCommit(cow_ptr<Commit> commit) override;
    void PurgeUnusedObjects() override;
    [[nodiscard]] bool BranchExist(KivStringViewT<char16_t> name) const override;
    bool CreateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) override;
    bool RemoveBranch(KivStringViewT<char16_t> name) override;
    bool UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) override;
    [[nodiscard]] cow_ptr<Commit> GetHead(KivStringViewT<char16_t> name) const override;
    [[nodiscard]] std::vector<KivStringT<char16_t>> GetCommitBranches(cow_ptr<Commit> commit) const override;

    /// The living object with that identifier, hidden or not. Called under the lock of the source, as is `Enter`.
    [[nodiscard]] cow_ptr<Commit> FindLiving(Id const& id) const;
    void Enter(cow_ptr<Commit> const& commit);
    void Enter(cow_ptr<Tree> const& tree);
    void Enter(cow_ptr<Blob> const& blob);

    /// Whether the archive may never have had a commit: a host added it, and it has not been published.
    [[nodiscard]] bool MayBeUnpublished(Id const& id) const;
    void SetPublished(std::span<const Id> commits) noexcept;

private:
    using Lock = std::unique_lock<std::recursive_mutex>;

    ArchivedStorage(ArchivedStorage const& other, Lock const& lock);

    [[nodiscard]] Lock LockTables() const { return Lock(source_->Mutex()); }
    /// Takes in what has arrived, before the host changes the storage.
    void Settle();
    void CountHidden() noexcept;

    std::shared_ptr<ObjectSource> source_;
    KivVcs::MemObjectsStorage objects_;
    /// What has been fetched since the host changed the storage.
    CommitTable arrivedCommits_;
    TreeTable arrivedTrees_;
    BlobTable arrivedBlobs_;
    /// The commits that were deleted. Those that are still alive are among the objects all the same.
    std::unordered_set<Id> hidden_;
    std::uint64_t hiddenCount_ = 0;
    std::unordered_set<Id> unpublished_;
    /// Tables that include what has arrived, for hosts that asked for them; kept until the host changes the storage.
    mutable std::list<CommitTable> commitTables_;
    mutable std::list<TreeTable> treeTables_;
    mutable std::list<BlobTable> blobTables_;
};

} // namespace KivArchive
