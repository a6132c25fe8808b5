#include "KivVcs/Tree.h"

#include "tree/TableDifferences.h"

namespace KivVcs {

using detail::Entry;
using detail::NamedObjects;
using detail::TableAccess;
using detail::TableNode;

namespace {

/// Collects full paths below directories that are entered depth first.
class PathCollector {
public:
    /// Goes to the directory @p name of the one whose paths begin with the first @p length code units of this one's.
    void Enter(std::size_t length, KivStringT<char16_t> const& name) {
        prefix_.resize(length);
        prefix_.insert(prefix_.end(), name.GetString(), name.GetString() + name.GetLength());
        prefix_.push_back(u'/');
    }

    /// The length of what the paths of this directory begin with.
    [[nodiscard]] std::size_t PrefixLength() const noexcept { return prefix_.size(); }

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

/// Two directories of the same path that are compared, either of which may be null, and how the path begins that their
/// name ends.
struct DirectoryPair {
    KivStringT<char16_t> const* name;
    Tree const* mine;
    Tree const* theirs;
    std::size_t prefixLength;
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

/// Adds the paths that differ right in a pair of directories, and puts the pairs of subdirectories that differ on @p open,
/// the first one last.
void CompareDirectories(Tree const* mine, Tree const* theirs, PathCollector& paths, std::vector<DirectoryPair>& open) {
    const auto before = static_cast<std::ptrdiff_t>(open.size());
    detail::ForEachDifference(
        RootOf(mine), RootOf(theirs),
        [&](KivStringT<char16_t> const& name, NamedObjects const& here, NamedObjects const& there) {
            if (BlobDiffers(here, there))
                paths.Add(name);
            if (!name.IsEmpty() && TreeDiffers(here, there))
                open.push_back({&name, here.tree, there.tree, paths.PrefixLength()});
        });
    std::reverse(open.begin() + before, open.end());
}

/// The paths of all blobs that differ between two trees, either of which may be null, without recursing into directories.
PathList DeepBlobDiffs(Tree const* mine, Tree const* theirs) {
    PathCollector paths;
    std::vector<DirectoryPair> open;
    CompareDirectories(mine, theirs, paths, open);
    while (!open.empty()) {
        const DirectoryPair pair = open.back();
        open.pop_back();
        paths.Enter(pair.prefixLength, *pair.name);
        CompareDirectories(pair.mine, pair.theirs, paths, open);
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
