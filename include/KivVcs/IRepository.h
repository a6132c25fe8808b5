#pragma once

/// @file
/// Commits on branches: the interface of every repository.

#include "KivVcs/Id.h"

#include <cstdint>

namespace KivVcs {

class Blob;
class Commit;
class IObjectsStorage;
class Tree;
struct Resolvers;

/// What objects and merges call back on while they are edited, read or merged, and what hosts program against. Higher
/// operations call lower ones through this interface, so overriding a lower one changes the higher ones too. The order
/// of the operations is part of the binary interface.
///
/// A null pointer is the interface's "none" in both directions; nothing throws for a missing object or branch. Nothing
/// owns a repository through this interface.
///
/// Threads: the `const` operations may run concurrently; everything else needs exclusive use.
class KIVVCS_EXPORT IRepository {
public:
    /// Stamps @p commit with the current time, in whole seconds, and the local time-zone bias, stores a copy of it
    /// unless an identical commit is stored, and moves the current branch, if it exists, to the stored commit.
    /// @return the stored commit; null without storage, or (before stamping) if an amend finds no head.
    virtual cow_ptr<Commit> DoCommit(Commit& commit) = 0;
    /// The head of the current branch, or null.
    [[nodiscard]] virtual cow_ptr<Commit> GetHead() const = 0;
    /// The head of the named branch; null if it has none or does not exist.
    [[nodiscard]] virtual cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const = 0;
    [[nodiscard]] virtual KivStringT<char16_t> GetCurentBranch() const = 0;
    /// The stored object of that identifier, or null.
    [[nodiscard]] virtual cow_ptr<Commit> GetCommitFromStorage(Id const& id) const = 0;
    [[nodiscard]] virtual cow_ptr<Tree> GetTreeFromStorage(Id const& id) const = 0;
    [[nodiscard]] virtual cow_ptr<Blob> GetBlobFromStorage(Id const& id) const = 0;
    /// The stored object with the same identifier; the given object, now stored, if there was none. Null gives null.
    virtual cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) = 0;
    virtual cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) = 0;
    virtual cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) = 0;
    [[nodiscard]] virtual std::uint64_t GetCommitCount() const = 0;
    [[nodiscard]] virtual std::uint64_t GetTreeCount() const = 0;
    [[nodiscard]] virtual std::uint64_t GetBlobCount() const = 0;
    /// Deletes @p commit and all its ancestors, but for the commits that are branch heads: those are
    /// stored anew, linked to each other in their old order, their branches moved, and unused objects purged. A root
    /// commit, and null, are left alone. Descendants of @p commit keep their old parents in memory.
    /// @return false without storage.
    /// @throws what allocation and the host's operations throw; what has been deleted, stored or moved by then stays
    /// so.
    virtual bool DeleteCommits(cow_ptr<Commit> commit) = 0;
    /// Rewrites the history of all branches so that it keeps only their heads and the common bases of every two heads,
    /// each linked to the nearest kept ancestor; purges unused objects at the end if @p purge. Content stays.
    /// @return false without storage.
    /// @complexity proportional to the histories and their heads; in a repository of a host's class, `GetCommonBase` is
    /// called for every two heads
    /// @throws as `DeleteCommits`
    virtual bool SimplifyCommitGraph(bool purge) = 0;
    /// Purges the objects that nothing references.
    virtual void UpdateStorage() = 0;
    /// The storage, which stays the repository's; may be null.
    [[nodiscard]] virtual IObjectsStorage* GetStorage() = 0;
    [[nodiscard]] virtual IObjectsStorage const* GetStorage() const = 0;
    /// The commit at which the histories of both commits meet, compared by identifier; null if they never do. Follows
    /// parent links, one step on each side in turn; when both arrive together the result is the object in the second
    /// one's history.
    [[nodiscard]] virtual cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const = 0;
    /// Makes an existing branch current; false if there is none of that name.
    virtual bool Checkout(KivStringViewT<char16_t> branch) = 0;
    /// Makes a branch at @p head, or at the current head if that is null; false if the name is empty or taken.
    virtual bool CreateBranch(KivStringViewT<char16_t> branch, cow_ptr<Commit> head) = 0;
    [[nodiscard]] virtual bool BranchExist(KivStringViewT<char16_t> branch) = 0;
    /// Points an existing branch at any commit; false if there is no such branch or the commit is null.
    virtual bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) = 0;
    /// Removes an existing branch, the current one too, which stays current by name.
    virtual bool RemoveBranch(KivStringViewT<char16_t> branch) = 0;
    /// Makes two branches share an ancestor. Unless they do already, each of them whose history has no common base with
    /// the head of @p rootBranch is put on top of that head; the root branch is made, with an empty commit "Root
    /// commit", if it has no head. A branch without commits is pointed at the root itself.
    /// @return false if the root branch cannot be made or a branch cannot be moved; what was stored before stays
    /// stored, and a branch that was moved before stays there.
    /// @throws as `DeleteCommits`
    virtual bool EnsureCommonRootFor(KivStringViewT<char16_t> first, KivStringViewT<char16_t> second,
                                     KivStringViewT<char16_t> rootBranch) = 0;
    /// Moves the current branch forward to @p commit; false if the current head is not on its history (as the same
    /// object).
    virtual bool FastForwardMerge(cow_ptr<Commit> commit) = 0;
    /// Merges the tree of @p commit into the current branch by a new commit on top of its head.
    /// @return false, changing nothing, if @p commit or the head is null, the merge gave up, or nothing could be
    /// committed.
    virtual bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) = 0;
    /// Brings @p commit into the current branch the cheapest way: points an empty branch at it, moves the branch
    /// forward, or merges. @return false, changing nothing, if none of them can be done.
    virtual bool Merge(cow_ptr<Commit> commit, Resolvers resolvers) = 0;

protected:
    IRepository() = default;
    IRepository(IRepository const&) = default;
    IRepository& operator=(IRepository const&) = default;
    ~IRepository() = default;
};

} // namespace KivVcs
