#pragma once

#include "KivVcs/Merge.h"

namespace KivVcs {

/// The names of one directory that either side of a merge changed, sorted and disjoint.
struct DiffCategories {
    /// Both sides changed these, to different states.
    PathList conflicting;
    PathList identical;
    PathList leftOnly;
    PathList rightOnly;
};

/// Categorizes the changes to the blobs, or to the subtrees, of the topmost directory of @p trees. @pre there is a root
[[nodiscard]] DiffCategories CategorizeBlobDiffs(MergeTrees const& trees);
[[nodiscard]] DiffCategories CategorizeTreeDiffs(MergeTrees const& trees);

} // namespace KivVcs
