#include "KivVcs/Tree.h"

#include "tree/TableDifferences.h"

namespace KivVcs {

using detail::Entry;
using detail::NamedObjects;
using detail::TableAccess;
using detail::TableNode;

namespace {

/// Collects full paths below directories that are entered and left in depth-first order.
class PathCollector {
public:
    [[nodiscard]] std::size_t Depth() const noexcept { return prefix_.size(); }

    void Enter(KivStringT<char16_t> const& name) {
        prefix_.insert(prefix_.end(), name.GetString(), name.GetString() + name.GetLength());
        prefix_.push_back(u'/');
    }

    void LeaveTo(std::size_t depth) noexcept { prefix_.resize(depth); }

    void Add(KivStringT<char16_t> const& name) {
        if (prefix_.empty()) {
            paths_.push_back(name);
            return;
        }
        const std::size_t length = prefix_.size() + static_cast<std::size_t>(name.GetLength());
        if (length > static_cast<std::size_t>(std::numeric_limits<int>::max()))
            throw std::length_error("path longer than a signed 32-bit length can tell");
        paths_.push_back(KivStringT<char16_t>::Build(static_cast<int>(length), [this, &name](char16_t* path) {
            path = std::copy(prefix_.begin(), prefix_.end(), path);
            std::copy_n(name.GetString(), name.GetLength(), path);
        }));
    }

    /// The paths, sorted, each once.
    [[nodiscard]] PathList Take() {
        // Names are visited in order, and only a directory whose name begins another entry's name breaks the order of paths.
        if (!std::is_sorted(paths_.begin(), paths_.end()))
            std::sort(paths_.begin(), paths_.end());
        paths_.erase(std::unique(paths_.begin(), paths_.end()), paths_.end());
        return std::move(paths_);
    }

private:
    std::vector<char16_t> prefix_;
    PathList paths_;
};

/// Two directories of the same path that are compared; null where one side has none. Both null is not there at all.
struct DirectoryPair {
    KivStringT<char16_t> name;
    Tree const* mine;
    Tree const* theirs;
};

/// Whether a comparison by name counts @p object as unchanged, given what the other side shows under that name.
bool IsSame(Object const& object, Object const* other) {
    return other != nullptr && object.HasSameId(*other);
}

bool BlobDiffers(NamedObjects const& mine, NamedObjects const& theirs) {
    return (mine.blob != nullptr && !IsSame(*mine.blob, theirs.Visible())) ||
           (theirs.blob != nullptr && !IsSame(*theirs.blob, mine.Visible()));
}

bool TreeDiffers(NamedObjects const& mine, NamedObjects const& theirs) {
    return (mine.tree != nullptr && !IsSame(*mine.tree, theirs.Visible())) ||
           (theirs.tree != nullptr && !IsSame(*theirs.tree, mine.Visible()));
}

TableNode const* RootOf(Tree const* tree) noexcept {
    return tree == nullptr ? nullptr : TableAccess::Root(*tree);
}

/// Adds the paths that differ right in a pair of directories, and returns the pairs of subdirectories that differ.
std::vector<DirectoryPair> CompareDirectories(Tree const* mine, Tree const* theirs, PathCollector& paths) {
    std::vector<DirectoryPair> below;
    detail::ForEachDifference(
        RootOf(mine), RootOf(theirs),
        [&](KivStringT<char16_t> const& name, NamedObjects const& here, NamedObjects const& there) {
            if (BlobDiffers(here, there))
                paths.Add(name);
            if (!name.IsEmpty() && TreeDiffers(here, there))
                below.push_back({name, here.tree, there.tree});
        });
    return below;
}

/// The paths of all blobs that differ between two trees, either of which may be null, without recursing into directories.
PathList DeepBlobDiffs(Tree const* mine, Tree const* theirs) {
    struct Level {
        std::vector<DirectoryPair> pairs;
        std::size_t next;
        std::size_t depth;
    };
    PathCollector paths;
    std::vector<Level> levels;
    levels.push_back({CompareDirectories(mine, theirs, paths), 0, 0});
    while (!levels.empty()) {
        Level& level = levels.back();
        paths.LeaveTo(level.depth);
        if (level.next == level.pairs.size()) {
            levels.pop_back();
            continue;
        }
        DirectoryPair const& pair = level.pairs[level.next++];
        paths.Enter(pair.name);
        const std::size_t depth = paths.Depth();
        levels.push_back({CompareDirectories(pair.mine, pair.theirs, paths), 0, depth});
    }
    return paths.Take();
}

PathList LocalPaths(Tree const& tree, bool wantTrees) {
    PathList names;
    detail::ForEachEntry(TableAccess::Root(tree), [&names, wantTrees](Entry const& entry) {
        if (entry.IsTree() == wantTrees && entry.Child() != nullptr)
            names.push_back(entry.Name());
    });
    return names;
}

template <class Differs>
PathList LocalDiffs(Tree const& mine, Tree const* theirs, Differs differs) {
    PathList names;
    detail::ForEachDifference(
        TableAccess::Root(mine), RootOf(theirs),
        [&](KivStringT<char16_t> const& name, NamedObjects const& here, NamedObjects const& there) {
            if (differs(here, there))
                names.push_back(name);
        });
    return names;
}

} // namespace

std::uint64_t Tree::GetDeepBlobCount() const {
    std::uint64_t count = 0;
    std::vector<Tree const*> open{this};
    while (!open.empty()) {
        Tree const* const tree = open.back();
        open.pop_back();
        count += tree->GetLocalBlobCount();
        if (tree->GetLocalBlobCount() == tree->GetLocalObjectCount())
            continue;
        detail::ForEachEntry(tree->entries_.Root(), [&open](Entry const& entry) {
            if (entry.TreeChild() != nullptr)
                open.push_back(entry.TreeChild());
        });
    }
    return count;
}

PathList Tree::GetLocalBlobPaths() const {
    return LocalPaths(*this, false);
}

PathList Tree::GetLocalSubtreePaths() const {
    return LocalPaths(*this, true);
}

PathList Tree::GetLocalObjectPaths() const {
    PathList names = GetLocalSubtreePaths();
    const PathList blobs = GetLocalBlobPaths();
    names.insert(names.end(), blobs.begin(), blobs.end());
    return names;
}

PathList Tree::GetDeepBlobPaths() const {
    return DeepBlobDiffs(this, nullptr);
}

PathList Tree::GetLocalBlobDiffs(cow_ptr<Tree> const& other) const {
    return LocalDiffs(*this, other.get(), BlobDiffers);
}

PathList Tree::GetLocalTreeDiffs(cow_ptr<Tree> const& other) const {
    return LocalDiffs(*this, other.get(), TreeDiffers);
}

PathList Tree::GetDeepBlobDiffs(cow_ptr<Tree> const& other) const {
    return DeepBlobDiffs(this, other.get());
}

} // namespace KivVcs
