#pragma once

/// @file
/// What both sides of a merge changed differently.

#include "KivVcs/Differences.h"
#include "KivVcs/Merge.h"

#include <vector>

namespace KivVcs {

/// How a conflict was settled.
enum class ConflictSettlement : std::int32_t {
    Undecided = 0,
    Left = 1,
    Right = 2,
    /// As it was before either side changed it.
    Root = 3,
    /// By something that neither side had: merged content, or both kept under two names. No merge of this library
    /// settles conflicts so; merges built on it may.
    Combined = 4,
};

/// How a resolver's answer settles what it was asked about.
[[nodiscard]] KIVVCS_EXPORT ConflictSettlement SettlementOf(ConflictChoice choice) noexcept;
/// The same for a directory; nothing if it is merged entry by entry, which settles nothing by itself.
[[nodiscard]] KIVVCS_EXPORT optional<ConflictSettlement> SettlementOf(TreeConflictChoice choice) noexcept;

/// A path that both sides changed differently.
struct MergeConflict {
    /// Empty for the whole tree.
    KivStringT<char16_t> path;
    /// Whether it is about a directory as a whole, and the identifiers are those of directories.
    bool isDirectory = false;
    /// What each side did since the root: `Unchanged` only for a directory.
    ChangeKind leftChange = ChangeKind::Unchanged;
    ChangeKind rightChange = ChangeKind::Unchanged;
    /// What the root and each side hold there; null for nothing.
    Id rootId;
    Id leftId;
    Id rightId;
    ConflictSettlement settlement = ConflictSettlement::Undecided;
};

/// The conflict at @p path, given as components from the top of @p trees on, as resolvers are asked about it. An empty
/// path stands for the trees themselves.
[[nodiscard]] KIVVCS_EXPORT MergeConflict DescribeConflict(array_view<KivStringViewT<char16_t> const> path,
                                                           MergeTrees const& trees, bool isDirectory,
                                                           ConflictSettlement settlement);

/// The paths about which `ThreeWayMerge` would ask its blob resolver if its tree resolver always answered `Merge`, in
/// that order, undecided. Merges, stores and fetches nothing, so that hosts can look before they merge.
/// @complexity as of the merge @throws std::bad_alloc, and what hosts' objects throw
[[nodiscard]] KIVVCS_EXPORT std::vector<MergeConflict> FindConflicts(MergeTrees trees);

} // namespace KivVcs
