#include "AncestryGraph.h"

#include <algorithm>
#include <tuple>
#include <unordered_set>
#include <utility>

namespace KivArchive {

AncestryGraph::Node AncestryGraph::Enter(Id const& commit) {
    auto const [entry, isNew] = numbers_.try_emplace(commit, static_cast<Node>(entries_.size()));
    if (isNew) {
        entries_.emplace_back().commit = &entry->first;
        marks_.emplace_back();
    }
    return entry->second;
}

AncestryGraph::Mark& AncestryGraph::MarkOf(Node node) noexcept {
    Mark& mark = marks_[node];
    if (mark.walk != walk_) {
        mark = {};
        mark.walk = walk_;
    }
    return mark;
}

void AncestryGraph::BeginWalk() {
    ++walk_;
}

void AncestryGraph::AddFacts(Ancestry const& facts) {
    Node const node = Enter(facts.commit);
    if (entries_[node].isRead)
        return;
    std::vector<Node> links;
    if (!facts.parent.IsEmpty())
        links.push_back(Enter(facts.parent));
    for (ContainedCommit const& contained : facts.contains)
        if (!contained.id.IsEmpty())
            links.push_back(Enter(contained.id));
    Entry& entry = entries_[node];
    entry.firstLink = links_.size();
    entry.links = static_cast<std::uint32_t>(links.size());
    links_.insert(links_.end(), links.begin(), links.end());
    entry.tree = facts.tree;
    entry.isRead = true;
    entry.isKnown = true;
}

void AncestryGraph::Read(std::span<const Node> nodes, std::size_t more) {
    std::vector<Id> ids;
    for (Node const node : nodes)
        ids.push_back(CommitOf(node));
    for (Ancestry const& facts : read_(ids, more))
        AddFacts(facts);
    // Those without facts are read as well: nothing is known of them.
    for (Node const node : nodes)
        entries_[node].isRead = true;
}

std::vector<AncestryGraph::Node> AncestryGraph::Reach(Node from, std::uint8_t side) {
    std::vector<Node> reached{from};
    MarkOf(from).sides |= side;
    for (std::size_t next = 0; next < reached.size(); ++next)
        for (Node const link : LinksOf(reached[next]))
            if (Mark& mark = MarkOf(link); (mark.sides & side) == 0) {
                mark.sides |= side;
                reached.push_back(link);
            }
    return reached;
}

/// The common ancestors, each before all that it contains. Of a cycle, only the first commit comes before all that the
/// cycle contains.
std::vector<AncestryGraph::Node> AncestryGraph::OrderCommon(std::vector<Node> const& reached) {
    std::vector<Node> ordered;
    std::vector<std::pair<Node, std::uint32_t>> open;
    auto const enter = [&](Node node) {
        if (Mark& mark = MarkOf(node); mark.sides == bothSides && !std::exchange(mark.isOrdered, true))
            open.emplace_back(node, 0);
    };
    for (Node const root : reached) {
        enter(root);
        while (!open.empty()) {
            auto& [node, next] = open.back();
            auto const links = LinksOf(node);
            if (next < links.size()) {
                enter(links[next++]);
                continue;
            }
            ordered.push_back(node);
            open.pop_back();
        }
    }
    std::reverse(ordered.begin(), ordered.end());
    return ordered;
}

std::vector<AncestryGraph::Node> AncestryGraph::ReachFromBest(Node best, std::size_t number) {
    std::uint64_t const bit = std::uint64_t{1} << std::min(number, lastBit);
    std::vector<Node> reached{best};
    MarkOf(best).reachedFrom |= bit;
    for (std::size_t next = 0; next < reached.size(); ++next)
        for (Node const link : LinksOf(reached[next]))
            if (Mark& mark = MarkOf(link); (mark.reachedFrom & bit) == 0) {
                mark.reachedFrom |= bit;
                reached.push_back(link);
            }
    return reached;
}

std::vector<AncestryGraph::Node> AncestryGraph::CycleOf(Node node, std::vector<Node> const& reached) const {
    bool const isInCycle = std::any_of(reached.begin(), reached.end(), [&](Node one) {
        auto const links = LinksOf(one);
        return std::find(links.begin(), links.end(), node) != links.end();
    });
    if (!isInCycle)
        return {node};
    Above const above = TurnLinks(reached);
    std::vector<Node> cycle{node};
    std::unordered_set<Node> met{node};
    for (std::size_t next = 0; next < cycle.size(); ++next)
        ForEachAbove(above, cycle[next], [&](Node one) {
            if (met.insert(one).second)
                cycle.push_back(one);
        });
    return cycle;
}

AncestryGraph::Above AncestryGraph::TurnLinks(std::vector<Node> const& nodes) const {
    Above above;
    for (Node const node : nodes)
        for (Node const link : LinksOf(node))
            above[link].push_back(node);
    return above;
}

/// In the order of `OrderCommon`, a commit that none before it contains is contained by nothing outside of its own
/// cycle.
std::vector<std::vector<AncestryGraph::Node>> AncestryGraph::FindBest(std::vector<Node> const& ordered) {
    std::vector<std::vector<Node>> best;
    for (Node const node : ordered)
        if (MarkOf(node).reachedFrom == 0) {
            best.push_back(CycleOf(node, ReachFromBest(node, best.size())));
            SortById(best.back());
        }
    return best;
}

/// Those commits of the cycles that are a side themselves, or that a commit links to which only one side contains.
std::vector<AncestryGraph::Node> AncestryGraph::FindArrivals(std::vector<std::vector<Node>> const& cycles,
                                                             std::vector<Node> const& reached,
                                                             std::span<const Node> sides) {
    std::vector<Node> arrivals;
    std::unordered_set<Node> inCycle;
    for (auto const& cycle : cycles) {
        if (cycle.size() == 1)
            arrivals.push_back(cycle.front());
        else
            inCycle.insert(cycle.begin(), cycle.end());
    }
    auto const arrive = [&](Node node) {
        if (inCycle.erase(node) != 0)
            arrivals.push_back(node);
    };
    if (!inCycle.empty()) {
        for (Node const side : sides)
            arrive(side);
        for (Node const node : reached)
            if (MarkOf(node).sides != bothSides)
                for (Node const link : LinksOf(node))
                    arrive(link);
    }
    SortById(arrivals);
    return arrivals;
}

void AncestryGraph::SortById(std::vector<Node>& nodes) const {
    std::sort(nodes.begin(), nodes.end(), [this](Node one, Node other) { return CommitOf(one) < CommitOf(other); });
}

AncestryGraph::Meeting AncestryGraph::Meet(Node left, Node right) {
    for (std::size_t batch = 64;; batch *= 2) {
        BeginWalk();
        std::vector<Node> reached = Reach(left, leftSide);
        std::vector<Node> const others = Reach(right, rightSide);
        Meeting meeting;
        auto const cycles = FindBest(OrderCommon(reached));
        for (auto const& cycle : cycles)
            meeting.bases.push_back(cycle.front());
        meeting.leftContainsRight = MarkOf(right).sides == bothSides;
        meeting.rightContainsLeft = MarkOf(left).sides == bothSides;
        // What all bases contain leads to no further base and, except in cycles, back to none of them.
        std::uint64_t const all = (std::uint64_t{1} << std::min(meeting.bases.size(), lastBit)) - 1;
        bool const canSettle = !meeting.bases.empty() && meeting.bases.size() <= lastBit;
        reached.insert(reached.end(), others.begin(), others.end());
        std::vector<Node> unsettled;
        for (Node const node : reached)
            if (!entries_[node].isRead && (!canSettle || MarkOf(node).reachedFrom != all))
                unsettled.push_back(node);
        std::sort(unsettled.begin(), unsettled.end());
        unsettled.erase(std::unique(unsettled.begin(), unsettled.end()), unsettled.end());
        if (unsettled.empty()) {
            SortById(meeting.bases);
            Node const sides[] = {left, right};
            meeting.arrivals = FindArrivals(cycles, reached, sides);
            return meeting;
        }
        Read(unsettled, batch);
    }
}

/// Marks whatever contains one of @p commits, with a bit for each of them or of the cycles that they are in.
/// @return all these bits
std::uint64_t AncestryGraph::MarkAbove(std::span<const Node> commits, Above const& above) {
    std::uint64_t all = 0;
    std::unordered_set<Node> met;
    for (std::size_t i = 0; i < commits.size(); ++i) {
        // What contains one commit of a cycle contains all of it.
        if (met.count(commits[i]) != 0)
            continue;
        std::uint64_t const bit = std::uint64_t{1} << i;
        all |= bit;
        std::vector<Node> open = CycleOf(commits[i], ReachFromBest(commits[i], lastBit));
        met.insert(open.begin(), open.end());
        while (!open.empty()) {
            Node const node = open.back();
            open.pop_back();
            ForEachAbove(above, node, [&](Node one) {
                if (Mark& mark = MarkOf(one); (mark.reachedFrom & bit) == 0) {
                    mark.reachedFrom |= bit;
                    open.push_back(one);
                }
            });
        }
    }
    return all;
}

std::vector<AncestryGraph::Node> AncestryGraph::FindFirstWithAll(Node side, Node other, std::span<const Node> commits,
                                                                 std::function<bool(Node)> const& isUsable) {
    if (commits.size() > lastBit)
        return {};
    BeginWalk();
    std::vector<Node> beyond = Reach(side, leftSide);
    std::ignore = Reach(other, rightSide);
    std::erase_if(beyond, [this](Node node) { return MarkOf(node).sides == bothSides; });
    Above const above = TurnLinks(beyond);
    std::uint64_t const all = MarkAbove(commits, above);
    auto const hasAll = [&](Node node) { return MarkOf(node).sides == leftSide && MarkOf(node).reachedFrom == all; };
    std::vector<Node> open;
    for (Node const node : beyond) {
        auto const links = LinksOf(node);
        if (hasAll(node) && std::none_of(links.begin(), links.end(), hasAll))
            open.push_back(node);
    }
    std::vector<Node> found;
    while (!open.empty()) {
        Node const node = open.back();
        open.pop_back();
        if (std::exchange(MarkOf(node).isOrdered, true))
            continue;
        if (isUsable(node))
            found.push_back(node);
        else
            ForEachAbove(above, node, [&open](Node one) { open.push_back(one); });
    }
    return found;
}

} // namespace KivArchive
