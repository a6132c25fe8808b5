#include "model/World.h"

/// Merges, and the laws that they keep.

namespace KivVcs::Model {
namespace {

// clang-format off
const Action actions[] = {
    {"Merge", 8, [](World& w) { w.MergeCommit(false); }},
    {"Merge3Way", 4, [](World& w) { w.MergeCommit(true); }},
    {"laws of merging", 6, [](World& w) {
         const Side left = w.PickSide();
         const Side root = w.PickSide();
         const Side right = w.PickSide();
         const unsigned salt = static_cast<unsigned>(w.Below(4)) * 7919;
         Expect("mirrored", w.Merge(left, root, right, {salt}), w.Merge(right, root, left, {salt, true}));
         if (!left.tree)
             return;
         const Side equal{w.PickClass(*left.tree), left.plain};
         Expect("merge(a, r, a)", w.Merge(left, root, equal, {1}), IdText(left.plain));
         // A tree with a name of both kinds differs from itself there, so that its side counts as changed.
         const auto isDoubled = [&root](auto const& below) { return root.plain->blobs.contains(below.first); };
         if (root.plain && std::none_of(root.plain->trees.begin(), root.plain->trees.end(), isDoubled))
             Expect("merge(a, r, r)", w.Merge(left, root, root, {0}), IdText(left.plain));
     }},
};
// clang-format on

} // namespace

std::span<Action const> Merging() {
    return actions;
}

} // namespace KivVcs::Model
