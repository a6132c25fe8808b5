#include "repository/CommonBaseIndex.h"

#include "commit/Ancestors.h"
#include "repository/CommitSet.h"

#include <algorithm>

namespace KivVcs {

CommonBaseIndex::CommonBaseIndex(std::vector<cow_ptr<Commit>> const& heads) {
    if (!AddJunctions(heads)) {
        junctions_.clear();
        return;
    }
    for (auto const& head : heads) {
        if (head)
            LinkLine(*head);
    }
}

/// Every commit at which two heads' histories meet is the common base of these heads, and every common base is such a
/// commit or a head itself: an identifier determines those of all ancestors, so that histories that have met stay
/// together.
/// @return false if there are two objects with one identifier: which of them is a base depends on the two commits asked
/// about
bool CommonBaseIndex::AddJunctions(std::vector<cow_ptr<Commit>> const& heads) {
    CommitSet visited;
    for (auto const& head : heads) {
        if (!head)
            continue;
        junctions_.try_emplace(head.get());
        for (Commit const& commit : Ancestors(head.get())) {
            Commit const* const met = visited.Insert(commit);
            if (met == nullptr)
                continue;
            if (met != &commit)
                return false;
            junctions_.try_emplace(met);
            break;
        }
    }
    return true;
}

void CommonBaseIndex::LinkLine(Commit const& head) {
    std::vector<Junction*> line;
    for (Commit const& commit : Ancestors(&head)) {
        const auto found = junctions_.find(&commit);
        if (found == junctions_.end())
            continue;
        Junction& junction = found->second;
        if (!line.empty())
            line.back()->below = &junction;
        if (junction.depth > 0)
            break;
        junction.commit = &commit;
        line.push_back(&junction);
    }
    std::reverse(line.begin(), line.end());
    for (Junction* const junction : line) {
        Junction const* const below = junction->below;
        junction->depth = below == nullptr ? 1 : below->depth + 1;
        if (below == nullptr)
            junction->jump = junction;
        else if (below->depth - below->jump->depth == below->jump->depth - below->jump->jump->depth)
            junction->jump = below->jump->jump;
        else
            junction->jump = below;
    }
}

optional<Commit const*> CommonBaseIndex::Find(Commit const& first, Commit const& second) const {
    const auto foundFirst = junctions_.find(&first);
    const auto foundSecond = junctions_.find(&second);
    if (foundFirst == junctions_.end() || foundSecond == junctions_.end())
        return {};
    Junction const* deeper = &foundFirst->second;
    Junction const* other = &foundSecond->second;
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
