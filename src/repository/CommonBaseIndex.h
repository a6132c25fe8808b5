#pragma once

/// @file
/// The common bases of many heads at once.

#include "KivVcs/Commit.h"

#include <unordered_map>

namespace KivVcs {

/// The common bases of every two of a set of heads. Making the index follows every parent link below the heads at most
/// twice; a base is then found in a number of steps that is logarithmic in the number of heads.
///
/// Holds no references: the heads must outlive it.
class CommonBaseIndex {
public:
    explicit CommonBaseIndex(std::vector<cow_ptr<Commit>> const& heads);

    /// The commit at which the histories of both commits meet, or null; nothing if one of them is not in the index.
    [[nodiscard]] optional<Commit const*> Find(Commit const& first, Commit const& second) const;

private:
    /// A head, or a commit at which the histories of two heads meet.
    struct Junction {
        Commit const* commit = nullptr;
        /// The nearest junction among its ancestors; null for the oldest.
        Junction const* below = nullptr;
        /// A further one below, such that any depth is reached in a logarithmic number of steps; itself for the oldest.
        Junction const* jump = nullptr;
        /// The number of junctions from this one down, itself included; 0 until it is linked.
        std::size_t depth = 0;
    };

    bool AddJunctions(std::vector<cow_ptr<Commit>> const& heads);
    void LinkLine(Commit const& head);

    std::unordered_map<Commit const*, Junction> junctions_;
};

} // namespace KivVcs
