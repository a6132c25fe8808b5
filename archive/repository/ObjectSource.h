#pragma once

/// @file
/// Fetching objects for the storages of a repository and its clones.

#include "KivArchive/IArchive.h"
#include "repository/Contents.h"

#include <KivVcs/Commit.h>

#include <memory>
#include <mutex>
#include <unordered_map>

namespace KivArchive {

using KivVcs::Blob;
using KivVcs::Commit;
using KivVcs::cow_ptr;
using KivVcs::Tree;

class ArchivedStorage;

/// Fetches commits and trees from an archive, each only if no storage has it, and enters them into all storages that
/// are made on this source. The functions with which commits fetch what they defer hold the source, so that it must
/// hold neither commits nor storages.
///
/// Threads: all operations may run concurrently. The lock is never held while the archive is asked.
class ObjectSource : public std::enable_shared_from_this<ObjectSource> {
public:
    ObjectSource(std::shared_ptr<IArchive> archive, std::uint64_t contentBudget);

    [[nodiscard]] std::shared_ptr<IArchive> const& GetArchive() const noexcept { return archive_; }
    [[nodiscard]] std::shared_ptr<Contents> const& GetContents() const noexcept { return contents_; }
    /// The lock of all storages. Recursive, since operations of hosts' objects are called under it.
    [[nodiscard]] std::recursive_mutex& Mutex() const noexcept { return mutex_; }

    void Add(ArchivedStorage& storage);
    void Remove(ArchivedStorage& storage) noexcept;

    /// The object with that identifier. @throws ArchiveError if it cannot be read
    [[nodiscard]] cow_ptr<Commit> FetchCommit(Id const& id);
    [[nodiscard]] cow_ptr<Tree> FetchTree(Id const& id);

    /// What could not be read, and why.
    using Failures = std::unordered_map<Id, Failure>;

    /// Fetches those of @p ids that no storage has, in one batch.
    Failures LoadCommits(std::span<const Id> ids);
    /// Fetches trees, with one batch for each level of all of them. @param progress may be null
    /// @throws ArchiveError if one cannot be read
    void LoadTrees(std::span<const Id> ids, IProgress* progress);
    /// Enters blobs, which are not fetched.
    void LoadBlobs(std::span<const Id> ids);

private:
    friend class TreeFetch;

    using Lock = std::scoped_lock<std::recursive_mutex>;

    [[nodiscard]] cow_ptr<Commit> FindCommit(Id const& id) const;
    [[nodiscard]] cow_ptr<Tree> FindTree(Id const& id) const;
    [[nodiscard]] cow_ptr<Blob> FindBlob(Id const& id) const;
    template <class T>
    void Enter(cow_ptr<T> const& object);
    [[nodiscard]] std::vector<Id> AncestorsAhead(Id const& id);
    [[nodiscard]] cow_ptr<Commit> ReadObject(ArchivedObject const& object);

    std::shared_ptr<IArchive> archive_;
    std::shared_ptr<Contents> contents_;
    mutable std::recursive_mutex mutex_;
    std::vector<ArchivedStorage*> storages_;
    /// The commit after the last batch of ancestors, and the size of the next batch: they grow while a walk goes on.
    Id nextAncestor_;
    std::size_t ahead_;
};

} // namespace KivArchive
