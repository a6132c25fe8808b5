#pragma once

/// @file
/// The walk along facts that `IArchive::ReadAncestry` promises.

#include "Changes.h"

#include <unordered_set>

namespace KivArchive {

/// @param lookUp returns the facts of a commit as a pointer or an optional value; nothing if there are none
template <class LookUp>
[[nodiscard]] std::vector<Ancestry> WalkAncestry(std::span<const Id> commits, Follow follow, std::size_t more,
                                                 LookUp lookUp) {
    std::vector<Ancestry> found;
    constexpr std::size_t maximumReserved = 4096;
    found.reserve(std::min(commits.size() + std::min(more, maximumReserved), maximumReserved));
    std::unordered_set<Id> met;
    met.reserve(found.capacity());
    auto const meet = [&](Id const& id) {
        if (id.IsEmpty() || !met.insert(id).second)
            return false;
        auto facts = lookUp(id);
        if (!facts)
            return false;
        found.push_back(*std::move(facts));
        return true;
    };
    for (Id const& commit : commits)
        if (met.count(commit) == 0)
            meet(commit);
    auto const follows = [follow](ContainedCommit const& contained) {
        return follow == Follow::Everything || (follow == Follow::Reachable && contained.how == Containment::Merged);
    };
    // `found` is also the queue of the walk.
    std::vector<Id> links;
    for (std::size_t next = 0; next < found.size() && more > 0; ++next) {
        links.assign(1, found[next].parent);
        for (ContainedCommit const& contained : found[next].contains)
            if (follows(contained))
                links.push_back(contained.id);
        for (auto link = links.begin(); link != links.end() && more > 0; ++link)
            if (meet(*link))
                --more;
    }
    return found;
}

} // namespace KivArchive
