#pragma once

/// @file
/// Directories.

#include "KivVcs/Blob.h"
#include "KivVcs/detail/DigestTrail.h"
#include "KivVcs/detail/EntryTable.h"
#include "KivVcs/detail/Published.h"

#include <vector>

namespace KivVcs {

class IRepository;
class Tree;

namespace detail {
struct TreeAccess;
}

/// Paths, relative to the tree that was asked, their components joined by "/", without a leading or trailing one.
using PathList = std::vector<KivStringT<char16_t>>;

/// The deepest nesting of directories that `Tree::Deserialize` reads; what lies deeper counts as not loadable.
inline constexpr std::size_t deepestLoadedNesting = 131'072;

/// A blob and the path that it is added under.
struct BlobAtPath {
    KivStringViewT<char16_t> path;
    cow_ptr<Blob> blob;
};

/// A directory: names mapped to blobs and to subtrees.
///
/// Names are single path components. One name may be held both as a blob and as a subtree; lookups by name and the
/// packed form then see the blob. Paths are split at "/", empty components dropped. Every object that is added is
/// reconciled with the repository's storage, so that equal content is held once.
///
/// A copy shares all entries and costs O(1); an edit below a path copies only the trees on that path, and of a large
/// tree only the nodes that change. Trees shared with others never change: edit through `cow_ptr::write`.
///
/// Nothing throws for a bad path or a missing object; running out of memory throws `std::bad_alloc`, after which this
/// tree is as before (trees below it may have been stored already). What the repository's operations throw passes
/// through likewise.
///
/// Threads: all `const` operations may run concurrently on one tree, whether or not its identifier has been computed.
/// An edit needs exclusive use of the tree.
class KIVVCS_EXPORT Tree : public Object {
public:
    Tree() noexcept;
    Tree(Tree const& other);
    Tree(Tree&& other) noexcept;
    Tree& operator=(Tree const& other);
    Tree& operator=(Tree&& other) noexcept;
    ~Tree() override;

    /// "tree"
    [[nodiscard]] KivStringT<char> GetHeader() const override;
    /// "40000"
    [[nodiscard]] KivStringT<char> GetStoragePrefix() const override;
    /// The entries in name order, each as mode, blank, type word, blank, name in UTF-8, a zero byte and identifier.
    /// Mode, type word and identifier are the `GetStoragePrefix`, `GetHeader` and `GetId` of its object, which are
    /// called for objects of hosts' classes only; the identifiers of all others have 64 digits. @throws what hosts'
    /// objects throw
    Buffer const& GetData() const override;
    void ResetState() override;

    [[nodiscard]] bool IsEmpty() const noexcept;
    /// The number of entries, blobs and subtrees. O(1).
    [[nodiscard]] std::uint64_t GetLocalObjectCount() const noexcept;
    /// The number of blob entries. O(1).
    [[nodiscard]] std::uint64_t GetLocalBlobCount() const noexcept;
    /// The number of blob entries at any depth, each subtree counted wherever it is named. Linear in distinct subtrees.
    [[nodiscard]] std::uint64_t GetDeepBlobCount() const;

    /// Adds a blob under @p path, making the trees on the way that are missing and replacing a blob of that name. A
    /// subtree of that name stays beside it, and a blob on the way stays beside the tree that is made.
    ///
    /// Asks @p repo, from the bottom up, for each object by its identifier (`GetBlobFromStorage`, `GetTreeFromStorage`)
    /// and hands it to `SyncWithStorage`; the handle that this returns becomes the entry.
    /// @return the handle that was entered; null, changing nothing, if @p repo is null or the path has no components.
    /// @complexity O(log n) in each tree on the path, plus hashing those trees.
    cow_ptr<Blob> AddBlob(IRepository* repo, KivStringViewT<char16_t> path, Blob const& blob);
    /// The same for a subtree.
    cow_ptr<Tree> AddTree(IRepository* repo, KivStringViewT<char16_t> path, Tree const& tree);
    /// The same for an object that the storage holds, a blob before a tree of that identifier; null if it holds
    /// neither.
    cow_ptr<Object> AddObject(IRepository* repo, KivStringViewT<char16_t> path, Id const& id);

    /// Adds many blobs. Afterwards the entries, and those of the directories below, are what `AddBlob` of one pair
    /// after the other makes them; the last pair of a path stays. The versions of directories in between are neither
    /// made nor stored. Pairs of a null blob or a path without components are left out.
    ///
    /// Asks @p repo as `AddBlob` does: for all blobs, in the given order, then for the directories on their ways, each
    /// after those in it, in the order of their names. What is stored if the storage has none is the given blob itself.
    /// Identifiers are computed as by `Identify`.
    /// @return whether a blob was added; false, changing nothing, if @p repo is null.
    /// @complexity linear in the blobs, if those of a directory come together in the order of their names and the
    /// directory is new, with a factor O(log n) otherwise; plus hashing
    bool AddBlobs(IRepository* repo, array_view<BlobAtPath const> blobs);

    /// `AddBlob` and `AddTree` with the path given as components. An empty last component adds nothing and returns
    /// null, although the trees on the way have been made; an empty one before it makes a tree that is attached
    /// nowhere.
    template <class T>
    cow_ptr<T> AddObjectToTree(IRepository* repo, array_view<KivStringViewT<char16_t> const> components,
                               T const& object);

    /// Removes what is held under @p path, of both kinds, and the trees on the way that this leaves empty (never this
    /// tree).
    /// @return false, changing nothing, if nothing is there.
    bool RemoveObject(IRepository* repo, KivStringViewT<char16_t> path);
    bool RemoveObjectFromTree(IRepository* repo, array_view<KivStringViewT<char16_t> const> components);

    /// Whether @p name is held as a blob or as a subtree, even by a null handle.
    [[nodiscard]] bool LocalObjectExists(KivStringViewT<char16_t> name) const noexcept;
    /// The blob of that name, otherwise the subtree, otherwise null. All lookups are O(log n) a level and call nobody.
    [[nodiscard]] cow_ptr<Object> GetLocalObject(KivStringViewT<char16_t> name) const noexcept;
    [[nodiscard]] cow_ptr<Blob> GetLocalBlob(KivStringViewT<char16_t> name) const noexcept;
    [[nodiscard]] cow_ptr<Tree> GetLocalTree(KivStringViewT<char16_t> name) const noexcept;

    /// What is held under a path: all but the last component lead through subtrees. Null if there is nothing, or no
    /// component.
    [[nodiscard]] cow_ptr<Object> GetDeepObject(KivStringViewT<char16_t> path) const;
    [[nodiscard]] cow_ptr<Object> GetDeepObject(array_view<KivStringViewT<char16_t> const> components) const noexcept;
    [[nodiscard]] cow_ptr<Blob> GetDeepBlob(KivStringViewT<char16_t> path) const;
    [[nodiscard]] cow_ptr<Blob> GetDeepBlob(array_view<KivStringViewT<char16_t> const> components) const noexcept;
    [[nodiscard]] cow_ptr<Tree> GetDeepTree(KivStringViewT<char16_t> path) const;
    [[nodiscard]] cow_ptr<Tree> GetDeepTree(array_view<KivStringViewT<char16_t> const> components) const noexcept;
    /// The identifier of what `GetDeepObject` finds, or nothing.
    [[nodiscard]] optional<Id> GetIdByPath(KivStringViewT<char16_t> path) const;

    /// Names of the entries whose handle is not null, sorted.
    [[nodiscard]] PathList GetLocalBlobPaths() const;
    [[nodiscard]] PathList GetLocalSubtreePaths() const;
    /// The subtree names followed by the blob names, each half sorted; a name held as both is listed twice.
    [[nodiscard]] PathList GetLocalObjectPaths() const;
    /// The paths of the blobs at any depth, sorted, each once.
    [[nodiscard]] PathList GetDeepBlobPaths() const;

    /// Names of the blob entries (subtree entries) of either tree that the other does not hold with the same
    /// identifier, looked up there with `GetLocalObject`; sorted, each once. All of this tree's for a null @p other.
    /// @complexity proportional to what differs where one tree was made from the other by edits, to the entries
    /// otherwise.
    [[nodiscard]] PathList GetLocalBlobDiffs(cow_ptr<Tree> const& other) const;
    [[nodiscard]] PathList GetLocalTreeDiffs(cow_ptr<Tree> const& other) const;
    /// The paths of the blobs at any depth that were added, removed or changed between the two trees; sorted, each
    /// once. Subtrees with equal identifiers are not descended into.
    [[nodiscard]] PathList GetDeepBlobDiffs(cow_ptr<Tree> const& other) const;

    /// The tree of identifier @p id: the one that @p repo holds already, otherwise read through @p loader with
    /// everything below it. Blobs and subtrees that cannot be loaded are left out. A tree that names itself, directly
    /// or not, or that lies deeper than `deepestLoadedNesting`, counts as not loadable. An entry whose name holds "/"
    /// is added by that path, as `AddBlob` and `AddTree` do, each time storing the directories on its way. A packed
    /// form is read once however often it is named. Blobs are looked up and loaded in the order of the entries, up to
    /// 32 or 512 KiB of one directory before those are identified together and stored. Large forms of streams on
    /// buffers are shared; a loader may use its own buffer again.
    /// @return null if @p repo is null, @p id or @p loader is empty, or the packed form has a header that does not
    /// begin with "tree", no entries, or an entry that is neither tree nor blob.
    /// @throws what @p loader and @p repo throw
    static cow_ptr<Tree> Deserialize(Id const& id, IRepository* repo,
                                     PortableVersion::Delegate<StreamIO(Id const&)> loader);

    [[nodiscard]] bool IsOfHostClass() const noexcept final;

protected:
    /// A copy of an object of a host's class, which nobody else holds; by default a `Tree` with the same entries. Not
    /// called for objects of exactly this class.
    [[nodiscard]] virtual cow_ptr<Tree> Copy() const;

private:
    friend KIVVCS_EXPORT cow_ptr<Tree> CopyOf(Tree const& tree);
    friend struct detail::TreeAccess;

    using PathComponentsView = array_view<KivStringViewT<char16_t> const>;

    /// Makes the storage's instance of @p object the entry @p name and returns it; null, doing nothing, for an empty
    /// name. @p own returns what is stored if the storage has none.
    template <class T, class Own>
    cow_ptr<T> SetLocal(IRepository& repo, KivStringViewT<char16_t> name, T const& object, Own own);
    void EraseLocal(KivStringViewT<char16_t> name);
    /// Private copies of the trees along @p names, new ones where there is none.
    [[nodiscard]] std::vector<cow_ptr<Tree>> CopyWay(PathComponentsView names) const;
    /// Stores the copies and enters them, from the bottom up; removes them instead where they are empty, if @p prunes.
    void PutWayBack(IRepository* repo, PathComponentsView names, std::vector<cow_ptr<Tree>> way, bool prunes);
    [[nodiscard]] Id ComputeId() const final;
    void ListParts(detail::OpenObjects& parts) const final;
    [[nodiscard]] optional<std::uint64_t> GetSizeToHash() const noexcept final;
    void GetDataToHash(detail::DataToHash& data) const final;

    detail::EntryTable entries_;
    detail::Published<Buffer> data_;
    detail::DigestTrail trail_;
};

extern template KIVVCS_EXPORT cow_ptr<Blob>
Tree::AddObjectToTree(IRepository*, array_view<KivStringViewT<char16_t> const>, Blob const&);
extern template KIVVCS_EXPORT cow_ptr<Tree>
Tree::AddObjectToTree(IRepository*, array_view<KivStringViewT<char16_t> const>, Tree const&);

/// A copy that the caller owns alone: of an object of a host's class the one that its `Copy` makes, or a `Tree` if that
/// is null or somebody else's.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Tree> CopyOf(Tree const& tree);

[[nodiscard]] KIVVCS_EXPORT cow_ptr<Tree> dll_wrapped_shared(std::unique_ptr<Tree> tree);

} // namespace KivVcs
