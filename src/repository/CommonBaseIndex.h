#pragma once

/// @file
/// The common bases of many heads at once.

#include "KivVcs/Commit.h"

#include <unordered_map>

namespace KivVcs {

/// Knows the common bases of every two of a set of heads. Making it follows every parent link below the heads at most
/// twice; a base is then found in a number of steps that is logarithmic in the number of heads.
///
/// Holds no references: the heads must outlive it.
class CommonBaseIndex {
public:
    explicit CommonBaseIndex(std::vector<cow_ptr<Commit>> const& heads);

    /// The commit at which the histories of both commits meet, or null; nothing if the index does not know both of
    /// them.
    [[nodiscard]] optional<Commit const*> Find(Commit const& first, Commit const& second) const;

private:
    /// A head, or a commit at which the ways down from two heads meet.
    struct Node {
        Commit const* commit = nullptr;
        /// The nearest node on the way down; null for the last one.
        Node const* below = nullptr;
        /// A node further down, such that any depth is reached in a logarithmic number of steps; itself for the last
        /// one.
        Node const* jump = nullptr;
        /// The number of nodes on the way down, this one included; 0 until the node is linked.
        std::size_t depth = 0;
    };

    bool AddNodes(std::vector<cow_ptr<Commit>> const& heads);
    void LinkPath(Commit const& head);

    std::unordered_map<Commit const*, Node> nodes_;
};

} // namespace KivVcs
