#pragma once

#include "Trees.h"

#include <KivVcs/Tree.h>

#include <string_view>
#include <unordered_set>

namespace vault {

/// What a merge of versions starts from.
struct MergedVersions {
    /// The trees of both sides, and of the versions where their histories met.
    Id left;
    Id right;
    std::vector<Id> bases;
    /// Whether the right side wins where both changed a mode differently.
    bool prefersRight = false;
    /// Paths about which somebody has decided already.
    std::unordered_set<std::string> settled;
};

/// A path whose mode or kind one side changed, while the other one changed it differently, or removed the path.
struct ModeConflict {
    std::string path;
    /// What each side did, for people.
    std::string_view left;
    std::string_view right;
};

/// A merged tree that is ready to be stored.
struct MergedTree {
    Id tree;
    /// The objects that are new, and what they rely on.
    KivArchive::Change change;
    std::vector<ModeConflict> conflicts;
};

/// Gives every entry of @p merged the attributes of the side that it came from; what only one side changed since they
/// parted is taken from that one. Until now the attributes in it are those of one side, directory by directory.
[[nodiscard]] MergedTree MergeAttributes(IArchive& archive, KivVcs::cow_ptr<KivVcs::Tree> const& merged,
                                         MergedVersions const& versions);

} // namespace vault
