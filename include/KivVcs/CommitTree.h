#pragma once

/// @file
/// The files of a commit.

#include "KivVcs/Tree.h"

namespace KivVcs {

/// The holder of a commit's root tree, which may be absent. Everything forwards to the root; without one, lookups find
/// nothing.
///
/// The first add makes the root; once there it stays, even when removals empty it. A root that is shared with another
/// holder is copied before it is changed.
///
/// Threads: all `const` operations may run concurrently on one holder. A change needs exclusive use of the holder.
class KIVVCS_EXPORT CommitTree {
public:
    /// No root.
    CommitTree() noexcept = default;
    explicit CommitTree(cow_ptr<Tree> root) noexcept : root_(std::move(root)) {}

    /// A holder of what `Tree::Deserialize` returns; null if that is null.
    static cow_ptr<CommitTree> Deserialize(Id const& id, IRepository* repo,
                                           PortableVersion::Delegate<StreamIO(Id const&)> loader);

    /// As the operations of `Tree`, on a root that is made if there is none, even if nothing is added then. A first add
    /// that throws leaves the holder without a root, as it was.
    cow_ptr<Blob> AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob);
    bool AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs);
    cow_ptr<Tree> AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree);
    cow_ptr<Object> AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id);
    bool RemoveObject(IRepository* repo, KivStringViewT<char16_t> path);

    [[nodiscard]] cow_ptr<Blob> GetBlob(KivStringViewT<char16_t> path) const;
    [[nodiscard]] cow_ptr<Tree> GetTree(KivStringViewT<char16_t> path) const;
    [[nodiscard]] cow_ptr<Tree> GetRoot() const noexcept { return root_; }
    /// The root's identifier; the null identifier without a root.
    [[nodiscard]] Id GetRootId() const;

    /// Takes the tree that @p repo holds under the identifier of @p root, or @p root itself if there is none or @p repo
    /// is null; null clears the root. Stores nothing.
    void ReplaceRoot(IRepository* repo, cow_ptr<Tree> root);

    /// Whether there is no root, or one without entries.
    [[nodiscard]] bool IsEmpty() const noexcept;
    [[nodiscard]] optional<Id> GetIdByPath(KivStringViewT<char16_t> path) const;
    /// The paths of all blobs that differ between the two roots; a missing root counts as empty.
    [[nodiscard]] PathList GetBlobDiffs(cow_ptr<CommitTree> const& other) const;
    [[nodiscard]] PathList GetAllBlobPaths() const;
    [[nodiscard]] std::uint64_t GetBlobCount() const;

private:
    cow_ptr<Tree> root_;
};

[[nodiscard]] KIVVCS_EXPORT cow_ptr<CommitTree> dll_wrapped_shared(std::unique_ptr<CommitTree> tree);

} // namespace KivVcs
