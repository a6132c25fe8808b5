#pragma once

/// @file
/// One version of the whole file set.

#include "KivVcs/CommitTree.h"
#include "KivVcs/detail/DeferredLinks.h"
#include "KivVcs/detail/Published.h"

namespace KivVcs {

/// A root tree, at most one parent, author, description, and the time and time-zone bias of committing.
///
/// A commit is made on top of its parent or in its parent's place, edited, and passed to `IRepository::DoCommit`, which
/// stamps it and stores a copy. From then on it is read through shared pointers. Every edit of the files stores the new
/// trees at once.
///
/// Parent and root may be deferred: given as an identifier and a function that fetches the object when somebody first
/// asks for it, a walk of this library included (`DeferParent`, `DeferRoot`).
///
/// Exceptions: nothing throws for bad data. What allocation and the repository throw passes through; the commit then
/// has its former content, or the complete new one.
///
/// Threads: all `const` operations may run concurrently on one commit. A change needs exclusive use of the commit.
class KIVVCS_EXPORT Commit : public Object {
public:
    /// Everything empty, null or zero. Unlike the other constructors, makes no tree holder.
    Commit() noexcept;
    /// A new commit on top of @p parent, sharing its tree; or, if @p amend, one in its place: with its parent, tree,
    /// author and description. A missing tree becomes an empty holder. A null parent makes a root commit.
    Commit(cow_ptr<Commit> parent, bool amend);
    /// The same with the head of the current branch as parent; a null repository counts as no parent.
    Commit(IRepository* repository, bool amend);
    Commit(Commit const& other);
    Commit(Commit&& other) noexcept;
    Commit& operator=(Commit const& other);
    Commit& operator=(Commit&& other) noexcept;
    ~Commit() override;

    /// "commit"
    [[nodiscard]] KivStringT<char> GetHeader() const override;
    /// Empty.
    [[nodiscard]] KivStringT<char> GetStoragePrefix() const override;
    /// The commit text: tree, parent, author and committer lines, an empty line, the description and a line break.
    Buffer const& GetData() const override;
    void ResetState() override;

    [[nodiscard]] KivStringT<char16_t> const& GetAuthorName() const noexcept { return authorName_; }
    [[nodiscard]] KivStringT<char16_t> const& GetAuthorEmail() const noexcept { return authorEmail_; }
    [[nodiscard]] KivStringT<char16_t> const& GetDescription() const noexcept { return description_; }
    [[nodiscard]] Time GetCommitTime() const noexcept { return commitTime_; }
    [[nodiscard]] TimeDelta GetCommitTimezoneBias() const noexcept { return timezoneBias_; }
    /// The parent, and the holder of the root tree; null if there is none. What is deferred is fetched first.
    /// @throws what fetching throws; std::runtime_error if the function that fetches gives null or another object
    [[nodiscard]] cow_ptr<Commit> GetParent() const;
    [[nodiscard]] cow_ptr<CommitTree> GetCommitTree() const;
    /// The same without fetching: null also for what is deferred and has not been fetched.
    [[nodiscard]] cow_ptr<Commit> GetHeldParent() const noexcept;
    [[nodiscard]] cow_ptr<CommitTree> GetHeldCommitTree() const noexcept;
    /// The identifiers that the commit's text shows, without fetching; the null identifier if there is no parent, or no
    /// root.
    [[nodiscard]] Id GetParentId() const;
    [[nodiscard]] Id GetRootId() const;
    [[nodiscard]] bool IsAmend() const noexcept { return amend_; }

    /// Setters; each calls `ResetState`.
    void SetAuthorName(KivStringT<char16_t> const& name);
    void SetAuthorEmail(KivStringT<char16_t> const& email);
    /// A description may have several lines; only the first is read back by `Deserialize`.
    void SetDescription(KivStringT<char16_t> const& description);
    void SetCommitTime(Time const& time);
    void SetCommitTimezoneBias(TimeDelta const& bias);
    void SetParent(cow_ptr<Commit> parent);

    /// Functions that fetch what is deferred: they are given the identifier and return the one living object that has
    /// it.
    using FetchCommit = PortableVersion::Delegate<cow_ptr<Commit>(Id const&)>;
    using FetchTree = PortableVersion::Delegate<cow_ptr<Tree>(Id const&)>;

    /// Makes the commit of identifier @p id the parent without having it; each calls `ResetState`. The first operation
    /// that needs the parent itself calls @p fetch, once, and the commit holds what it returns from then on. The
    /// identifier, the text, copying, comparing, purging and destroying never fetch, and what is not fetched is not
    /// held. The null identifier stands for no parent.
    ///
    /// A function that throws, or returns null or an object with another identifier, leaves the parent deferred, and is
    /// called again the next time. Whoever asked for the parent gets an exception, never "no parent". The function must
    /// not ask the same commit for what it is to fetch. It may store what it fetches: nothing in this library iterates
    /// over a storage while it is called. It has to keep alive what it needs, and every copy of the commit keeps it.
    ///
    /// Cost: what walks a whole history (common bases, fast-forward, simplifying, joining, deleting) fetches all of it.
    /// Threads: any number may ask concurrently; one of them calls @p fetch while the others wait for it.
    void DeferParent(Id const& id, FetchCommit fetch);
    /// The same for the root tree, which gets a holder of its own; a commit made on top of this one takes the deferral
    /// over.
    void DeferRoot(Id const& id, FetchTree fetch);

    /// Copies author and description from @p other; time and bias stay.
    void ResetPropertiesForAmend(Commit const& other);

    /// Adds to, or removes from, the commit's files, as the operations of `CommitTree`; then replaces the root by the
    /// storage's instance of it and calls `ResetState`. On failure the commit's content and caches stay as they are.
    /// @return null, or false, if nothing was added or removed: no repository, a path that cannot be, an unknown
    /// identifier.
    cow_ptr<Blob> AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob);
    bool AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs);
    cow_ptr<Tree> AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree);
    cow_ptr<Object> AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id);
    bool RemoveObject(IRepository* repo, KivStringViewT<char16_t> path);

    [[nodiscard]] cow_ptr<Blob> GetBlob(KivStringViewT<char16_t> path) const;
    /// A new holder of the subtree at @p path; null if there is none.
    [[nodiscard]] cow_ptr<CommitTree> GetTree(KivStringViewT<char16_t> path) const;

    /// Replaces the whole root tree, and calls `RebuildTree`. With both operations, a known identifier or text stays
    /// until the next `ResetState`.
    void ReplaceRoot(IRepository* repo, cow_ptr<Tree> root);
    /// Makes the root the storage's instance of itself, storing it if the storage has none. A null @p repo changes
    /// nothing.
    void RebuildTree(IRepository* repo);

    /// Links a line of history, newest first: makes every commit's parent its successor in @p commits, and every
    /// element the stored instance of its commit, oldest first. The last element keeps its own parent. A null element
    /// is skipped, and so is the one before it. Commits held elsewhere are copied, not changed.
    /// @return false, changing nothing, if @p repo is null or the list empty.
    static bool MakeCommitLinksInOrder(std::vector<cow_ptr<Commit>>& commits, IRepository* repo);

    /// A signature line: "ROLE NAME <EMAIL> SECONDS +HHMM". Seconds are written as a signed 32-bit number. Each text
    /// ends at its first U+0000. The sign is that of the whole hours, so that a bias between minus one hour and zero is
    /// written with "+".
    [[nodiscard]] static KivStringT<char16_t> GetAuthorInfo(KivStringViewT<char16_t> role,
                                                            KivStringViewT<char16_t> name,
                                                            KivStringViewT<char16_t> email, Time time, TimeDelta bias);

    /// What follows @p key in @p text up to the next line break, found anywhere at or after @p position, which moves to
    /// that line break; nothing, leaving @p position, if the key is not there. A value without line break is empty, and
    /// @p position moves to the end of the text.
    static optional<KivStringT<char>> ParseCommitInfo(KivStringT<char> const& text, KivStringViewT<char> key,
                                                      int& position);

    /// The commit of identifier @p id: the one that @p repository holds, otherwise read through @p loader with its
    /// tree. It has the repository's head as parent; the caller links the real one, whose identifier goes to @p
    /// parentId (untouched if the commit is held already). Only the first line of a description is read.
    /// @return null if @p repository is null, @p id or @p loader is empty, the header does not begin with "commit ", or
    /// there is no tree line.
    /// @throws what @p loader and @p repository throw
    static cow_ptr<Commit> Deserialize(Id const& id, Id& parentId, IRepository* repository,
                                       PortableVersion::Delegate<StreamIO(Id const&)> loader);

    [[nodiscard]] bool IsOfHostClass() const noexcept final;

protected:
    /// A copy of an object of a host's class, which nobody else holds; by default a `Commit` with the same fields. Not
    /// called for objects of exactly this class.
    [[nodiscard]] virtual cow_ptr<Commit> Copy() const;

private:
    friend class AncestorIterator;
    friend KIVVCS_EXPORT cow_ptr<Commit> CopyOf(Commit const& commit);

    [[nodiscard]] Id ComputeId() const final;
    void ListParts(detail::OpenObjects& parts) const final;
    template <class Add>
    auto EditTree(IRepository* repo, Add add);
    /// How walks get to the parent: as `GetParent`, but without another handle, since this commit holds it.
    [[nodiscard]] Commit const* Parent() const { return parent_ ? parent_.get() : DeferredParent(); }
    [[nodiscard]] Commit const* DeferredParent() const;
    [[nodiscard]] bool HasParent() const noexcept { return parent_ || deferred_.ParentId() != nullptr; }
    void SetTree(cow_ptr<CommitTree> tree) noexcept;
    void KeepText() const;
    void IdentifyAncestors() const;
    void ReleaseHistory() noexcept;

    // First, beside the cached identifier: walks over the history visit nothing else. Null where the link is deferred.
    cow_ptr<Commit> parent_;
    detail::DeferredLinks deferred_;
    cow_ptr<CommitTree> tree_;
    KivStringT<char16_t> description_;
    KivStringT<char16_t> authorName_;
    KivStringT<char16_t> authorEmail_;
    Time commitTime_;
    TimeDelta timezoneBias_;
    bool amend_ = false;
    detail::Published<Buffer> data_;
};

/// A copy that the caller owns alone: of an object of a host's class the one that its `Copy` makes, or a `Commit` if
/// that is null or somebody else's.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Commit> CopyOf(Commit const& commit);

[[nodiscard]] KIVVCS_EXPORT cow_ptr<Commit> dll_wrapped_shared(std::unique_ptr<Commit> commit);
[[nodiscard]] KIVVCS_EXPORT cow_ptr<std::vector<cow_ptr<Commit>>>
dll_wrapped_shared(std::unique_ptr<std::vector<cow_ptr<Commit>>> commits);

} // namespace KivVcs
