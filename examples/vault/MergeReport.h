#pragma once

#include "MergeAttributes.h"

#include <KivVcs/MergeOutcome.h>

#include <span>
#include <string>
#include <vector>

namespace vault {

/// What became of a path that both sides of a merge changed.
struct MergedPath {
    /// As trees have it.
    std::string path;
    /// What each side did, for people.
    std::string left;
    std::string right;
    /// Whether somebody has to decide, rather than texts that were merged line by line.
    bool isConflict = true;
    /// Which side was taken: "left", "right", "base", "combined", "marked" or "undecided".
    std::string taken;
    /// Whether it is gone because the side that was taken removed it.
    bool isRemoved = false;
};

/// @param isMarked whether the conflict is marked in the file
/// @param isStopped whether nothing was merged in the end
[[nodiscard]] MergedPath DescribeConflict(KivVcs::MergeConflict const& conflict, bool isMarked, bool isStopped);
[[nodiscard]] MergedPath DescribeConflict(ModeConflict const& conflict, bool prefersRight, bool isStopped);

/// Lists every path with what both sides did and how it was settled.
void ListMerged(std::span<MergedPath const> paths);

/// Writes the same, and the result of the merge, as an object of JSON.
void WriteMergeJson(std::string_view result, Id const& head, std::span<MergedPath const> paths);

} // namespace vault
