#include "KivVcs/Tree.h"

#include "tree/DirectoryPairs.h"

#include <unordered_map>
#include <utility>

namespace KivVcs {

using detail::BlobDiffers;
using detail::Entry;
using detail::Held;
using detail::TopOf;
using detail::TreeDiffers;

namespace {

/// The paths of all blobs that differ between two trees, either of which may be null, sorted, each once.
PathList DeepBlobDiffs(Tree const* mine, Tree const* theirs) {
    PathList paths;
    bool isAscending = true;
    detail::DirectoryPairs pairs(mine, theirs);
    do {
        // Within a directory paths ascend as names do.
        bool isFirst = true;
        pairs.ForEachDifference([&](KivStringT<char16_t> const& name, Held const& here, Held const& there) {
            if (BlobDiffers(here, there)) {
                paths.push_back(pairs.PathOf(name));
                if (std::exchange(isFirst, false) && paths.size() > 1)
                    isAscending = isAscending && paths[paths.size() - 2] < paths.back();
            }
            return TreeDiffers(here, there);
        });
    } while (pairs.Next());
    if (!isAscending) {
        std::sort(paths.begin(), paths.end());
        paths.erase(std::unique(paths.begin(), paths.end()), paths.end());
    }
    return paths;
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
