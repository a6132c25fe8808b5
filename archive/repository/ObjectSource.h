#pragma once

/// @file
/// Where the storages of a repository and of its clones get objects from.

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

/// Fetches commits and trees from an archive, each at most once as long as a storage has it, and enters them into every
/// storage that is made on it. Commits hold it by the functions that fetch what they defer, so that it must hold neither
/// commits nor storages.
///
/// Threads: all operations may run concurrently. The lock is never held while the archive is asked.
class ObjectSource : public std::enable_shared_from_this<ObjectSource> {
public:
    ObjectSource(std::shared_ptr<IArchive> archive, std::uint64_t contentBudget);

    [[nodiscard]] std::shared_ptr<IArchive> const& GetArchive() const noexcept { return archive_; }
    [[nodiscard]] std::shared_ptr<Contents> const& GetContents() const noexcept { return contents_; }
    /// The lock of all storages: recursive, since hosts' objects may be asked under it.
    [[nodiscard]] std::recursive_mutex& Mutex() const noexcept { return mutex_; }

    void Add(ArchivedStorage& storage);
    void Remove(ArchivedStorage& storage) noexcept;

    /// The object of that identifier. @throws ArchiveError if it cannot be had
    [[nodiscard]] cow_ptr<Commit> FetchCommit(Id const& id);
    [[nodiscard]] cow_ptr<Tree> FetchTree(Id const& id);

    /// What was asked for and why it cannot be had.
    using Failures = std::unordered_map<Id, Failure>;

    /// Fetches those of @p ids that no storage has, in one batch.
    Failures LoadCommits(std::span<const Id> ids);
    /// Fetches trees, with one batch for each level of all of them. @param progress may be null
    /// @throws ArchiveError if one cannot be had
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
    /// Where the last batch of ancestors ended, and how many the next one takes: a walk that goes on takes more and more.
    Id nextAncestor_;
    std::size_t ahead_;
};

} // namespace KivArchive
