#include "merge/DiffCategories.h"

#include <utility>

namespace KivVcs {

namespace {

bool SidesAgree(MergeTrees const& trees, KivStringT<char16_t> const& name) {
    const auto left = trees.left ? trees.left->GetDeepObject(name) : nullptr;
    const auto right = trees.right ? trees.right->GetDeepObject(name) : nullptr;
    return left && right ? left->HasSameId(*right) : left == right;
}

/// @param leftDiffs, rightDiffs names, sorted, each once
DiffCategories Categorize(MergeTrees const& trees, PathList leftDiffs, PathList rightDiffs) {
    DiffCategories categories;
    auto left = leftDiffs.begin();
    auto right = rightDiffs.begin();
    while (left != leftDiffs.end() || right != rightDiffs.end()) {
        const int order = left == leftDiffs.end()     ? 1
                          : right == rightDiffs.end() ? -1
                                                      : left->Compare(*right, CompareCase{});
        if (order < 0) {
            categories.leftOnly.push_back(std::move(*left++));
        } else if (order > 0) {
            categories.rightOnly.push_back(std::move(*right++));
        } else {
            (SidesAgree(trees, *left) ? categories.identical : categories.conflicting).push_back(std::move(*left));
            ++left;
            ++right;
        }
    }
    return categories;
}

} // namespace

DiffCategories CategorizeBlobDiffs(MergeTrees const& trees) {
    return Categorize(trees, trees.root->GetLocalBlobDiffs(trees.left), trees.root->GetLocalBlobDiffs(trees.right));
}

DiffCategories CategorizeTreeDiffs(MergeTrees const& trees) {
    return Categorize(trees, trees.root->GetLocalTreeDiffs(trees.left), trees.root->GetLocalTreeDiffs(trees.right));
}

} // namespace KivVcs
