#include "KivVcs/IRepository.h"
#include "merge/DiffCategories.h"

#include <utility>

namespace KivVcs {

namespace {

void UseChangeFrom(IRepository* repo, cow_ptr<Tree>& result, cow_ptr<Tree> const& from,
                   KivStringT<char16_t> const& name) {
    // Removes both kinds: an entry of the other kind would stay beside the new one.
    result.write()->RemoveObject(repo, name);
    if (!from)
        return;
    if (const auto blob = from->GetDeepBlob(name))
        result.write()->AddBlob(repo, name, *blob);
    else if (const auto tree = from->GetDeepTree(name))
        result.write()->AddTree(repo, name, *tree);
}

void DoTrivialChanges(IRepository* repo, cow_ptr<Tree>& result, MergeTrees const& trees,
                      DiffCategories const& categories) {
    for (auto const& name : categories.identical)
        UseChangeFrom(repo, result, trees.left, name);
    for (auto const& name : categories.rightOnly)
        UseChangeFrom(repo, result, trees.right, name);
    for (auto const& name : categories.leftOnly)
        UseChangeFrom(repo, result, trees.left, name);
}

/// The host's resolvers, and the path of the directory that they are asked about.
class PlacedResolvers {
public:
    PlacedResolvers(MergeTrees trees, Resolvers resolvers)
        : trees_(std::move(trees)), resolvers_(std::move(resolvers)) {}

    /// The view must stay valid until `Leave`.
    void Enter(KivStringViewT<char16_t> name) { path_.push_back(name); }
    void Leave() noexcept { path_.pop_back(); }

    [[nodiscard]] TreeConflictChoice AskAboutTree() const {
        return resolvers_.treeResolver ? resolvers_.treeResolver(path_, trees_) : TreeConflictChoice::Undecided;
    }

    [[nodiscard]] ConflictChoice AskAboutBlob(KivStringViewT<char16_t> name) {
        if (!resolvers_.blobResolver)
            return ConflictChoice::Undecided;
        Enter(name);
        const ConflictChoice choice = resolvers_.blobResolver(path_, trees_);
        Leave();
        return choice;
    }

private:
    MergeTrees trees_;
    Resolvers resolvers_;
    std::vector<KivStringViewT<char16_t>> path_;
};

/// Merges directory by directory, with a stack of its own, since directories may be nested deeper than calls.
class LevelByLevelMerge {
public:
    LevelByLevelMerge(IRepository* repo, PlacedResolvers resolvers) : repo_(repo), resolvers_(std::move(resolvers)) {}

    /// The merged tree, which may be null; nothing if the merge gave up.
    optional<cow_ptr<Tree>> Run(MergeTrees trees) {
        Outcome outcome = Begin(std::move(trees));
        while (!outcome.gaveUp && !levels_.empty()) {
            if (outcome.isSettled)
                FinishSubtree(outcome.tree);
            outcome = Proceed();
        }
        if (outcome.gaveUp)
            return {};
        return std::move(outcome.tree);
    }

private:
    /// The result for one directory: settled, possibly to no tree at all; given up; or, if neither, opened as a new
    /// level.
    struct Outcome {
        bool gaveUp = false;
        bool isSettled = false;
        cow_ptr<Tree> tree{};

        static Outcome Settled(cow_ptr<Tree> tree) { return {false, true, std::move(tree)}; }
        static Outcome GaveUp() { return {true, false, nullptr}; }
        static Outcome Opened() { return {}; }
    };

    struct Level {
        MergeTrees trees;
        cow_ptr<Tree> result;
        PathList subtreeConflicts;
        std::size_t nextConflict = 0;
    };

    Outcome Begin(MergeTrees trees) {
        if (trees.left && trees.right && trees.left->HasSameId(*trees.right))
            return Outcome::Settled(std::move(trees.left));
        if (!trees.left && !trees.right)
            return Outcome::Settled(nullptr);
        switch (resolvers_.AskAboutTree()) {
        case TreeConflictChoice::Left:
            return Outcome::Settled(std::move(trees.left));
        case TreeConflictChoice::Right:
            return Outcome::Settled(std::move(trees.right));
        case TreeConflictChoice::Root:
            return Outcome::Settled(std::move(trees.root));
        case TreeConflictChoice::Undecided:
            return Outcome::GaveUp();
        case TreeConflictChoice::Merge:
            break;
        }
        return Open(std::move(trees));
    }

    Outcome Open(MergeTrees trees) {
        // A directory added on both sides is merged against an empty base.
        if (!trees.root)
            trees.root.write();
        cow_ptr<Tree> result = trees.root;
        if (!MergeBlobs(trees, result))
            return Outcome::GaveUp();
        DiffCategories categories = CategorizeTreeDiffs(trees);
        DoTrivialChanges(repo_, result, trees, categories);
        levels_.push_back({std::move(trees), std::move(result), std::move(categories.conflicting)});
        return Outcome::Opened();
    }

    bool MergeBlobs(MergeTrees const& trees, cow_ptr<Tree>& result) {
        const DiffCategories categories = CategorizeBlobDiffs(trees);
        for (auto const& name : categories.conflicting) {
            const ConflictChoice choice = resolvers_.AskAboutBlob(name);
            if (choice == ConflictChoice::Undecided)
                return false;
            if (choice == ConflictChoice::Left)
                UseChangeFrom(repo_, result, trees.left, name);
            else if (choice == ConflictChoice::Right)
                UseChangeFrom(repo_, result, trees.right, name);
        }
        DoTrivialChanges(repo_, result, trees, categories);
        return true;
    }

    /// Begins the next disputed subdirectory of the innermost level, or settles that level if there is none left.
    Outcome Proceed() {
        Level& level = levels_.back();
        if (level.nextConflict == level.subtreeConflicts.size()) {
            auto result = std::move(level.result);
            levels_.pop_back();
            return Outcome::Settled(std::move(result));
        }
        auto const& name = level.subtreeConflicts[level.nextConflict];
        const auto subtreeOf = [&name](cow_ptr<Tree> const& tree) { return tree ? tree->GetLocalTree(name) : nullptr; };
        resolvers_.Enter(name);
        return Begin({subtreeOf(level.trees.left), subtreeOf(level.trees.root), subtreeOf(level.trees.right)});
    }

    void FinishSubtree(cow_ptr<Tree> const& subtree) {
        resolvers_.Leave();
        Level& level = levels_.back();
        auto const& name = level.subtreeConflicts[level.nextConflict++];
        if (subtree)
            level.result.write()->AddTree(repo_, name, *subtree);
        else
            level.result.write()->RemoveObject(repo_, name);
    }

    IRepository* repo_;
    PlacedResolvers resolvers_;
    std::vector<Level> levels_;
};

} // namespace

cow_ptr<Tree> ThreeWayMerge(IRepository* repo, MergeTrees trees, Resolvers resolvers) {
    if (repo == nullptr)
        return nullptr;
    LevelByLevelMerge merge(repo, PlacedResolvers(trees, std::move(resolvers)));
    return merge.Run(std::move(trees)).value_or(nullptr);
}

} // namespace KivVcs
