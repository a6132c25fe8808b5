#include "KivVcs/Tree.h"

#include "tree/ForEachDifference.h"
#include "tree/PathPrefix.h"

#include <unordered_map>

namespace KivVcs {

using detail::BlobDiffers;
using detail::Entry;
using detail::Held;
using detail::TopOf;
using detail::TreeDiffers;

namespace {

/// Collects full paths, directory by directory, the names of each in their order.
class PathCollector {
public:
    void Enter(std::size_t length, KivStringT<char16_t> const& name) {
        prefix_.Enter(length, name);
        isFirst_ = true;
    }

    /// The length of what the paths of this directory begin with.
    [[nodiscard]] std::size_t PrefixLength() const noexcept { return prefix_.GetLength(); }

    void Add(KivStringT<char16_t> const& name) {
        paths_.push_back(prefix_.PathOf(name));
        // Within a directory paths ascend as names do.
        if (std::exchange(isFirst_, false) && paths_.size() > 1)
            isAscending_ = isAscending_ && paths_[paths_.size() - 2] < paths_.back();
    }

    /// The paths, sorted, each once.
    [[nodiscard]] PathList Take() {
        if (!isAscending_) {
            std::sort(paths_.begin(), paths_.end());
            paths_.erase(std::unique(paths_.begin(), paths_.end()), paths_.end());
        }
        return std::move(paths_);
    }

private:
    PathPrefix prefix_;
    PathList paths_;
    bool isFirst_ = false;
    bool isAscending_ = true;
};

/// Two directories of the same path that are compared, either of which may be null, and how the path begins that their
/// name ends.
struct DirectoryPair {
    KivStringT<char16_t> const* name;
    Tree const* mine;
    Tree const* theirs;
    std::size_t prefixLength;
};

/// Adds the paths that differ right in a pair of directories, and puts the pairs of subdirectories that differ on @p open,
/// the first one last.
void CompareDirectories(Tree const* mine, Tree const* theirs, PathCollector& paths, std::vector<DirectoryPair>& open) {
    const auto before = static_cast<std::ptrdiff_t>(open.size());
    detail::ForEachDifference(TopOf(mine), TopOf(theirs),
                              [&](KivStringT<char16_t> const& name, Held const& here, Held const& there) {
                                  if (BlobDiffers(here, there))
                                      paths.Add(name);
                                  if (TreeDiffers(here, there))
                                      open.push_back({&name, here.GetTree(), there.GetTree(), paths.PrefixLength()});
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

template <class Differs>
PathList LocalDiffs(Tree const& mine, Tree const* theirs, Differs differs) {
    PathList names;
    detail::ForEachDifference(TopOf(&mine), TopOf(theirs),
                              [&](KivStringT<char16_t> const& name, Held const& here, Held const& there) {
                                  if (differs(here, there))
                                      names.push_back(name);
                              });
    return names;
}

} // namespace

std::uint64_t Tree::GetDeepBlobCount() const {
    // Every tree is counted once, when those below it have been, and its number added wherever it is named.
    std::unordered_map<Tree const*, std::uint64_t> counts;
    std::vector<Tree const*> open{this};
    while (!open.empty()) {
        Tree const& tree = *open.back();
        const std::size_t waiting = open.size();
        std::uint64_t count = tree.GetLocalBlobCount();
        if (count != tree.GetLocalObjectCount() && !counts.contains(&tree)) {
            detail::ForEachEntry(TopOf(&tree), [&](Entry const& entry) {
                Tree const* const subtree = entry.held.GetTree();
                if (subtree == nullptr)
                    return;
                if (const auto known = counts.find(subtree); known != counts.end())
                    count += known->second;
                else
                    open.push_back(subtree);
            });
        }
        if (open.size() > waiting)
            continue;
        counts.try_emplace(&tree, count);
        open.pop_back();
    }
    return counts.at(this);
}

PathList Tree::GetLocalBlobPaths() const {
    return LocalDiffs(*this, nullptr, BlobDiffers);
}

PathList Tree::GetLocalSubtreePaths() const {
    return LocalDiffs(*this, nullptr, TreeDiffers);
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
