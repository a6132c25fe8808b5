#pragma once

#include "support/PackedForms.h"

#include <algorithm>
#include <functional>
#include <set>
#include <span>

namespace KivVcs {

/// What a tree should hold, in the plainest containers.
struct PlainTree {
    std::map<std::string, std::string> blobs;
    std::map<std::string, PlainTree> trees;

    [[nodiscard]] bool IsEmpty() const { return blobs.empty() && trees.empty(); }
};

inline std::string Data(PlainTree const& tree) {
    std::map<std::string, std::string> entries;
    for (auto const& [name, content] : tree.blobs)
        entries.emplace(name, Entry("blob", name, Identifier("blob", content)));
    for (auto const& [name, below] : tree.trees)
        entries.emplace(name, Entry("tree", name, Identifier("tree", Data(below))));
    std::string data;
    for (auto const& [name, entry] : entries)
        data += entry;
    return data;
}

inline std::string IdOf(PlainTree const& tree) {
    return Identifier("tree", Data(tree));
}

inline std::string VisibleId(PlainTree const& tree, std::string const& name) {
    if (auto const blob = tree.blobs.find(name); blob != tree.blobs.end())
        return Identifier("blob", blob->second);
    auto const below = tree.trees.find(name);
    return below == tree.trees.end() ? "" : IdOf(below->second);
}

inline std::set<std::string> LocalDiffs(PlainTree const& left, PlainTree const& right, bool ofTrees) {
    std::set<std::string> names;
    for (auto const& [mine, theirs] : {std::pair(&left, &right), std::pair(&right, &left)}) {
        if (ofTrees) {
            for (auto const& [name, below] : mine->trees)
                if (VisibleId(*theirs, name) != IdOf(below))
                    names.insert(name);
        } else {
            for (auto const& [name, content] : mine->blobs)
                if (VisibleId(*theirs, name) != Identifier("blob", content))
                    names.insert(name);
        }
    }
    return names;
}

/// The paths of a single tree are its differences from an empty one.
inline std::set<std::string> DeepDiffs(PlainTree const& left, PlainTree const& right) {
    static const PlainTree none;
    const auto below = [](PlainTree const& tree, std::string const& name) -> PlainTree const& {
        auto const found = tree.trees.find(name);
        return found == tree.trees.end() ? none : found->second;
    };
    std::set<std::string> paths = LocalDiffs(left, right, false);
    for (std::string const& name : LocalDiffs(left, right, true))
        for (std::string const& path : DeepDiffs(below(left, name), below(right, name)))
            paths.insert(name + "/" + path);
    return paths;
}

/// Adds a content or a tree. Every tree that is added or changed is replaced by what @p stored returns for it.
template <class T, class Stored = std::identity>
void Add(PlainTree& tree, std::span<std::string const> path, T const& added, Stored stored = {}) {
    if (path.size() > 1) {
        PlainTree& below = tree.trees[path[0]];
        Add(below, path.subspan(1), added, stored);
        below = stored(PlainTree(below));
    } else if constexpr (std::is_same_v<T, PlainTree>) {
        tree.trees[path[0]] = stored(PlainTree(added));
    } else {
        tree.blobs[path[0]] = added;
    }
}

/// Removes a blob, a subtree or both, and the directories that this leaves empty. @return false if nothing was there
template <class Stored = std::identity>
bool Remove(PlainTree& tree, std::span<std::string const> path, Stored stored = {}) {
    auto const below = tree.trees.find(path[0]);
    if (path.size() > 1) {
        if (below == tree.trees.end() || !Remove(below->second, path.subspan(1), stored))
            return false;
        if (!below->second.IsEmpty()) {
            below->second = stored(PlainTree(below->second));
            return true;
        }
    }
    return tree.blobs.erase(path[0]) + tree.trees.erase(path[0]) > 0;
}

inline Names Sorted(std::set<std::string> const& names) {
    return {names.begin(), names.end()};
}

inline void ListFiles(PlainTree const& tree, std::string const& prefix, Names& files) {
    for (auto const& [name, content] : tree.blobs)
        files.push_back(prefix + name + "=" + content);
    for (auto const& [name, below] : tree.trees) {
        if (below.IsEmpty())
            files.push_back(prefix + name + "/");
        ListFiles(below, prefix + name + "/", files);
    }
}

/// As `Files` of a tree of the library.
inline std::string Files(PlainTree const& tree) {
    Names files;
    ListFiles(tree, "", files);
    std::sort(files.begin(), files.end());
    return Joined(files);
}

} // namespace KivVcs
