#include "repository/CommonBaseIndex.h"

#include "commit/Ancestors.h"
#include "repository/CommitSet.h"

#include <algorithm>

namespace KivVcs {

CommonBaseIndex::CommonBaseIndex(std::vector<cow_ptr<Commit>> const& heads) {
    if (!AddNodes(heads)) {
        nodes_.clear();
        return;
    }
    for (auto const& head : heads) {
        if (head)
            LinkPath(*head);
    }
}

/// Every commit at which the way down from a head meets that of another one is the base of two heads, and every base is
/// one of these or a head itself, since an identifier determines the identifiers of all ancestors: ways that meet stay
/// together.
/// @return false if there are two objects of one identifier: which of them is a base depends on who asks.
bool CommonBaseIndex::AddNodes(std::vector<cow_ptr<Commit>> const& heads) {
    CommitSet visited;
    for (auto const& head : heads) {
        if (!head)
            continue;
        nodes_.try_emplace(head.get());
        for (Commit const& commit : Ancestors(head.get())) {
            Commit const* const met = visited.Insert(commit);
            if (met == nullptr)
                continue;
            if (met != &commit)
                return false;
            nodes_.try_emplace(met);
            break;
        }
    }
    return true;
}

void CommonBaseIndex::LinkPath(Commit const& head) {
    std::vector<Node*> path;
    for (Commit const& commit : Ancestors(&head)) {
        const auto found = nodes_.find(&commit);
        if (found == nodes_.end())
            continue;
        Node& node = found->second;
        if (!path.empty())
            path.back()->below = &node;
        if (node.depth > 0)
            break;
        node.commit = &commit;
        path.push_back(&node);
    }
    std::reverse(path.begin(), path.end());
    for (Node* const node : path) {
        Node const* const below = node->below;
        node->depth = below == nullptr ? 1 : below->depth + 1;
        if (below == nullptr)
            node->jump = node;
        else if (below->depth - below->jump->depth == below->jump->depth - below->jump->jump->depth)
            node->jump = below->jump->jump;
        else
            node->jump = below;
    }
}

optional<Commit const*> CommonBaseIndex::Find(Commit const& first, Commit const& second) const {
    const auto foundFirst = nodes_.find(&first);
    const auto foundSecond = nodes_.find(&second);
    if (foundFirst == nodes_.end() || foundSecond == nodes_.end())
        return {};
    Node const* deeper = &foundFirst->second;
    Node const* other = &foundSecond->second;
    if (deeper->depth < other->depth)
        std::swap(deeper, other);
    while (deeper->depth > other->depth)
        deeper = deeper->jump->depth >= other->depth ? deeper->jump : deeper->below;
    while (deeper != other) {
        if (deeper->below == nullptr)
            return nullptr;
        const bool meetByJump = deeper->jump == other->jump;
        deeper = meetByJump ? deeper->below : deeper->jump;
        other = meetByJump ? other->below : other->jump;
    }
    return deeper->commit;
}

} // namespace KivVcs
