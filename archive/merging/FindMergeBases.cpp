#include "AncestryGraph.h"

#include <algorithm>

namespace KivArchive {

std::vector<Id> FindMergeBases(AncestryReader const& read, Id const& left, Id const& right) {
    if (left.IsEmpty() || right.IsEmpty())
        return {};
    AncestryGraph graph(read);
    AncestryGraph::Meeting const meeting = graph.Meet(graph.Enter(left), graph.Enter(right));
    if (meeting.leftContainsRight && meeting.rightContainsLeft)
        return {std::min(left, right)};
    if (meeting.leftContainsRight)
        return {right};
    if (meeting.rightContainsLeft)
        return {left};
    std::vector<Id> bases;
    for (AncestryGraph::Node const base : meeting.bases)
        bases.push_back(graph.CommitOf(base));
    return bases;
}

std::vector<Id> FindMergeBases(IArchive& archive, Id const& left, Id const& right) {
    return FindMergeBases(
        [&archive](std::span<const Id> commits, std::size_t more) {
            return archive.ReadAncestry(commits, Follow::Everything, more);
        },
        left, right);
}

} // namespace KivArchive
