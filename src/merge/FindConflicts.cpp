#include "KivVcs/MergeOutcome.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace KivVcs {

namespace {

/// A directory that both sides changed differently, and how deep it lies.
struct OpenDirectory {
    MergeTrees trees;
    KivStringT<char16_t> name;
    std::size_t depth;
};

cow_ptr<Object> ObjectAt(cow_ptr<Tree> const& tree, KivStringT<char16_t> const& name) {
    return tree ? tree->GetLocalObject(name) : nullptr;
}

/// The names that both sides changed, to different states.
PathList Disputed(MergeTrees const& trees, PathList const& leftDiffs, PathList const& rightDiffs) {
    PathList names;
    std::set_intersection(leftDiffs.begin(), leftDiffs.end(), rightDiffs.begin(), rightDiffs.end(),
                          std::back_inserter(names));
    std::erase_if(names, [&trees](KivStringT<char16_t> const& name) {
        const auto left = ObjectAt(trees.left, name);
        const auto right = ObjectAt(trees.right, name);
        return left && right ? left->GetId() == right->GetId() : left == right;
    });
    return names;
}

/// Walks the disputed directories as the merge does, with a stack of its own.
class ConflictWalk {
public:
    explicit ConflictWalk(MergeTrees top) : top_(std::move(top)) {}

    [[nodiscard]] std::vector<MergeConflict> Run() {
        Search(top_);
        while (!open_.empty()) {
            OpenDirectory directory = std::move(open_.back());
            open_.pop_back();
            path_.resize(directory.depth);
            path_.push_back(std::move(directory.name));
            Search(std::move(directory.trees));
        }
        return std::move(conflicts_);
    }

private:
    void Search(MergeTrees trees) {
        if (trees.left && trees.right ? trees.left->GetId() == trees.right->GetId() : !trees.left && !trees.right)
            return;
        if (!trees.root)
            trees.root.write();
        for (auto const& name :
             Disputed(trees, trees.root->GetLocalBlobDiffs(trees.left), trees.root->GetLocalBlobDiffs(trees.right)))
            Add(name);
        const PathList directories =
            Disputed(trees, trees.root->GetLocalTreeDiffs(trees.left), trees.root->GetLocalTreeDiffs(trees.right));
        std::for_each(directories.rbegin(), directories.rend(), [&](KivStringT<char16_t> const& name) {
            const auto below = [&name](cow_ptr<Tree> const& tree) { return tree ? tree->GetLocalTree(name) : nullptr; };
            open_.push_back({{below(trees.left), below(trees.root), below(trees.right)}, name, path_.size()});
        });
    }

    void Add(KivStringT<char16_t> const& name) {
        std::vector<KivStringViewT<char16_t>> path(path_.begin(), path_.end());
        path.emplace_back(name);
        conflicts_.push_back(DescribeConflict(path, top_, false, ConflictSettlement::Undecided));
    }

    MergeTrees top_;
    PathList path_;
    std::vector<OpenDirectory> open_;
    std::vector<MergeConflict> conflicts_;
};

} // namespace

std::vector<MergeConflict> FindConflicts(MergeTrees trees) {
    return ConflictWalk(std::move(trees)).Run();
}

} // namespace KivVcs
