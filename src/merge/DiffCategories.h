#pragma once

#include "KivVcs/Merge.h"

namespace KivVcs {

/// The names of one directory that either side of a merge changed, sorted and disjoint.
struct DiffCategories {
    /// What both sides changed, to different states.
    PathList conflicting;
    PathList identical;
    PathList leftOnly;
    PathList rightOnly;
};

/// What both sides changed of the blobs, or of the subtrees, right in the root of @p trees. @pre there is a root
[[nodiscard]] DiffCategories CategorizeBlobDiffs(MergeTrees const& trees);
[[nodiscard]] DiffCategories CategorizeTreeDiffs(MergeTrees const& trees);

} // namespace KivVcs
