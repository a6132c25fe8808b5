#include "KivArchive/Upkeep.h"

#include <algorithm>

namespace KivArchive {

namespace {

constexpr std::size_t askedAtOnce = 10'000;

} // namespace

std::vector<Id> FindForgotten(IArchive& from, IArchive& to, std::span<const Id> heads) {
    std::vector<Id> reached;
    for (Ancestry const& facts : from.ReadAncestry(heads, Follow::Reachable, SIZE_MAX))
        reached.push_back(facts.commit);
    std::vector<Id> forgotten;
    for (std::span<const Id> rest = reached; !rest.empty();) {
        auto const some = rest.first(std::min(askedAtOnce, rest.size()));
        rest = rest.subspan(some.size());
        auto const missing = to.FindMissing(some);
        for (Ancestry const& facts : to.ReadAncestry(missing, Follow::Parents, 0))
            forgotten.push_back(facts.commit);
    }
    return forgotten;
}

} // namespace KivArchive
