#pragma once

/// @file
/// Three-way merges of trees and the resolvers that settle their conflicts.
///
/// Threads: a merge needs exclusive use of its repository, reads its trees as their `const` operations do, and asks the
/// resolvers on the thread that called it.

#include "KivVcs/Tree.h"

#include <functional>

namespace KivVcs {

/// The inputs of a merge; null means that there is no tree at this place.
struct MergeTrees {
    /// The current state.
    cow_ptr<Tree> left;
    /// The common base from which both sides' changes are measured.
    cow_ptr<Tree> root;
    /// The state being merged in.
    cow_ptr<Tree> right;
};

/// What becomes of an entry that both sides changed differently. Resolvers are stored and compared by these values.
enum class ConflictChoice : std::int32_t {
    Left = 0,
    Right = 1,
    /// Keep the base state.
    Root = 2,
    /// No opinion: a chain asks its next resolver, a merge gives up.
    Undecided = 3,
};

/// What becomes of a directory that both sides changed differently.
enum class TreeConflictChoice : std::int32_t {
    /// Merge it entry by entry.
    Merge = 0,
    Left = 1,
    Right = 2,
    Root = 3,
    /// No opinion: a chain asks its next resolver, a merge gives up.
    Undecided = 4,
};

/// Settles a conflict. It is given the path of the disputed entry, as components from the top of the merge on, and the
/// three whole trees of the merge, in which it can look the entry up. The path is valid during the call only.
using BlobConflictResolver = std::function<ConflictChoice(array_view<KivStringViewT<char16_t> const>, MergeTrees)>;
/// The same for directories; the path is empty for the trees of the merge themselves.
using TreeConflictResolver = std::function<TreeConflictChoice(array_view<KivStringViewT<char16_t> const>, MergeTrees)>;

/// Both kinds of resolver. An empty one makes a merge give up at the first conflict of its kind. The tree resolver is
/// asked for the top-level trees too, whenever the sides differ: for an ordinary merge it answers `Merge`.
struct Resolvers {
    BlobConflictResolver blobResolver;
    TreeConflictResolver treeResolver;
};

/// Resolvers that always give the same answer.
[[nodiscard]] KIVVCS_EXPORT BlobConflictResolver AlwaysChooseRoot();
[[nodiscard]] KIVVCS_EXPORT BlobConflictResolver AlwaysChooseLeft();
[[nodiscard]] KIVVCS_EXPORT BlobConflictResolver AlwaysChooseRight();

/// A resolver that asks @p first and, only if that is undecided, @p second, whose answer is final. Asking an empty
/// member throws `std::bad_function_call`.
[[nodiscard]] KIVVCS_EXPORT BlobConflictResolver ChainResolvers(BlobConflictResolver first,
                                                                BlobConflictResolver second);
[[nodiscard]] KIVVCS_EXPORT TreeConflictResolver ChainResolvers(TreeConflictResolver first,
                                                                TreeConflictResolver second);

/// A resolver that lets the side with the later time win. A side's time is read by @p getTime from the first of the
/// blobs @p names (relative paths, in order of preference) that has one, looked up in the directory of the disputed
/// entry and, while that decides nothing, in each directory above it. The path of the entry itself is tried as a
/// directory first.
///
/// The answer is never `Root`, and `Undecided` if no level decides. Times compare as unsigned ticks. An empty @p
/// getTime throws `std::bad_function_call` when the first time-stamp blob is found.
[[nodiscard]] KIVVCS_EXPORT BlobConflictResolver TimeBasedConflictResolver(
    std::vector<KivStringT<char16_t>> names, std::function<optional<Time>(cow_ptr<Blob>)> getTime);

/// Merges the changes that @p trees make on both sides of their root, entry by entry.
///
/// Resolvers are asked only where both sides changed one entry, or directory, to different states: in ascending name
/// order, the blobs of a directory before its subdirectories. All directories of a merge ask the very same resolvers,
/// which are not copied for each. Contents are never merged, nor asked for. Unchanged subtrees are shared
/// with the inputs, which stay as they are. New trees are stored in @p repo as they are made.
///
/// A name may be a file on one side and a directory on the other. In four cases nobody is asked about it, or the answer
/// is not followed: where one side adds a file and the other a directory, the file is gone; where one side changed a
/// file
/// that the other made a directory, the directory is taken, whatever is answered; where a directory became a file while
/// the other side changed something in it, both may come to be under one name, of which the packed form shows the file;
/// where one side made a directory a file and the other removed it, both are gone. Hosts that care let the tree
/// resolver answer `Left` or `Right` there, or merge with the archive's `MergeAgain`, which asks.
/// @return the merged tree; null if @p repo is null, a resolver that was needed is empty or undecided, or no side has a
/// tree.
/// @complexity proportional to the entries that differ and to the size of the directories that hold them.
/// @throws what resolvers and @p repo throw; nothing is committed then.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Tree> ThreeWayMerge(IRepository* repo, MergeTrees trees, Resolvers resolvers);

} // namespace KivVcs
