#include "KivVcs/Conflicts.h"

#include "merge/DiffCategories.h"

#include <algorithm>
#include <utility>

namespace KivVcs {

namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

/// What a tree holds at the path of a conflict.
struct Held {
    Id id;
    bool isTree = false;
};

Held HeldBy(cow_ptr<Tree> const& tree, Path path, bool isDirectory) {
    if (!tree)
        return {};
    if (const auto blob = isDirectory ? nullptr : tree->GetDeepBlob(path))
        return {blob->GetId(), false};
    const auto directory = path.empty() ? tree : tree->GetDeepTree(path);
    return directory ? Held{directory->GetId(), true} : Held{};
}

ChangeKind ChangeOf(Held const& before, Held const& after) noexcept {
    if (before.id == after.id)
        return ChangeKind::Unchanged;
    if (before.id.IsEmpty())
        return ChangeKind::Added;
    if (after.id.IsEmpty())
        return ChangeKind::Removed;
    if (before.isTree == after.isTree)
        return ChangeKind::Changed;
    return after.isTree ? ChangeKind::FileBecameDirectory : ChangeKind::DirectoryBecameFile;
}

KivStringT<char16_t> Join(Path path) {
    KivStringT<char16_t> joined;
    for (auto const& component : path) {
        if (!joined.IsEmpty())
            joined += u'/';
        joined += component;
    }
    return joined;
}

/// A directory that both sides changed differently, and how deep it lies.
struct OpenDirectory {
    MergeTrees trees;
    KivStringT<char16_t> name;
    std::size_t depth;
};

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
        const DiffCategories files = CategorizeBlobDiffs(trees);
        for (auto const& name : files.conflicting)
            Add(name);
        const PathList directories = CategorizeTreeDiffs(trees).conflicting;
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

ConflictSettlement SettlementOf(ConflictChoice choice) noexcept {
    switch (choice) {
    case ConflictChoice::Left:
        return ConflictSettlement::Left;
    case ConflictChoice::Right:
        return ConflictSettlement::Right;
    case ConflictChoice::Undecided:
        return ConflictSettlement::Undecided;
    case ConflictChoice::Root:
        break;
    }
    return ConflictSettlement::Root;
}

optional<ConflictSettlement> SettlementOf(TreeConflictChoice choice) noexcept {
    switch (choice) {
    case TreeConflictChoice::Left:
        return ConflictSettlement::Left;
    case TreeConflictChoice::Right:
        return ConflictSettlement::Right;
    case TreeConflictChoice::Root:
        return ConflictSettlement::Root;
    case TreeConflictChoice::Undecided:
        return ConflictSettlement::Undecided;
    case TreeConflictChoice::Merge:
        break;
    }
    return {};
}

MergeConflict DescribeConflict(Path path, MergeTrees const& trees, bool isDirectory, ConflictSettlement settlement) {
    const Held root = HeldBy(trees.root, path, isDirectory);
    const Held left = HeldBy(trees.left, path, isDirectory);
    const Held right = HeldBy(trees.right, path, isDirectory);
    return {Join(path), isDirectory, ChangeOf(root, left), ChangeOf(root, right), root.id, left.id,
            right.id,   settlement};
}

std::vector<MergeConflict> FindConflicts(MergeTrees trees) {
    return ConflictWalk(std::move(trees)).Run();
}

} // namespace KivVcs
