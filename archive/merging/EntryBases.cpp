#include "EntryBases.h"

#include <algorithm>

namespace KivArchive {

namespace {

using Node = AncestryGraph::Node;

std::pair<Node, Node> Ordered(Node one, Node other) {
    return {std::min(one, other), std::max(one, other)};
}

} // namespace

HeldEntry EntryIn(cow_ptr<Tree> const& directory, KivStringT<char16_t> const& name) {
    if (!directory)
        return {};
    if (auto file = directory->GetLocalBlob(name)) {
        Id const id = file->GetId();
        return {std::move(file), nullptr, id};
    }
    return EntryOf(directory->GetLocalTree(name));
}

HeldEntry EntryOf(cow_ptr<Tree> directory) {
    Id const id = directory ? directory->GetId() : Id();
    return {nullptr, std::move(directory), id};
}

void VersionTrees::Enter(KivStringT<char16_t> const& name) {
    names_.push_back(&name);
    levels_.emplace_back();
}

void VersionTrees::Leave() noexcept {
    names_.pop_back();
    levels_.pop_back();
}

bool VersionTrees::IsGone(Node version) {
    if (levels_.front().count(version) != 0)
        return false;
    Id const& tree = graph_.TreeOf(version);
    if (gone_.count(graph_.CommitOf(version)) != 0)
        return true;
    auto top = tree.IsEmpty() ? nullptr : sources_.tree(tree);
    if (!top && (!tree.IsEmpty() || !graph_.IsKnown(version))) {
        gone_.insert(graph_.CommitOf(version));
        return true;
    }
    levels_.front().emplace(version, std::move(top));
    return false;
}

cow_ptr<Tree> const& VersionTrees::DirectoryOf(Node version) {
    // Down from the lowest level that is known of this version.
    std::size_t level = levels_.size();
    while (levels_[level - 1].count(version) == 0)
        --level;
    for (; level < levels_.size(); ++level) {
        cow_ptr<Tree> const& above = levels_[level - 1].at(version);
        levels_[level].emplace(version, above ? above->GetLocalTree(*names_[level - 1]) : nullptr);
    }
    return levels_.back().at(version);
}

EntryBases::EntryBases(MergeSources const& sources, MergeSide const& left, MergeSide const& right)
    : graph_(sources.ancestry), versions_(sources, graph_),
      sides_(Ordered(graph_.Enter(left.commit), graph_.Enter(right.commit))) {
    versions_.SetTree(graph_.Enter(left.commit), left.tree);
    versions_.SetTree(graph_.Enter(right.commit), right.tree);
}

AncestryGraph::Meeting const* EntryBases::MeetingOf(Pair pair) {
    auto const known = meetings_.find(pair);
    if (known != meetings_.end())
        return &known->second;
    if (meetings_.size() == maximumPairs)
        return nullptr;
    return &meetings_.emplace(pair, graph_.Meet(pair.first, pair.second)).first->second;
}

BaseEntry EntryBases::OfAll() {
    Found found;
    return Find(sides_, nullptr, found);
}

BaseEntry EntryBases::Of(KivStringT<char16_t> const& name) {
    Found found;
    return Find(sides_, &name, found);
}

cow_ptr<Tree> EntryBases::OnlyBase() {
    auto const& bases = MeetingOf(sides_)->arrivals;
    return bases.size() == 1 && !versions_.IsGone(bases.front()) ? versions_.DirectoryOf(bases.front()) : nullptr;
}

std::vector<Id> EntryBases::LostBases() {
    std::vector<Id> lost;
    for (Node const base : MeetingOf(sides_)->arrivals)
        if (versions_.IsGone(base))
            lost.push_back(graph_.CommitOf(base));
    return lost;
}

HeldEntry EntryBases::EntryAt(Node version, KivStringT<char16_t> const* name) {
    auto const& directory = versions_.DirectoryOf(version);
    return name != nullptr ? EntryIn(directory, *name) : EntryOf(directory);
}

/// The entry that all of @p versions have; nothing if they differ, if one is gone, or if there are none.
BaseEntry EntryBases::CommonEntry(std::vector<Node> const& versions, KivStringT<char16_t> const* name) {
    BaseEntry common;
    for (Node const version : versions) {
        if (versions_.IsGone(version))
            return {};
        HeldEntry entry = EntryAt(version, name);
        if (common && !(*common == entry))
            return {};
        common = std::move(entry);
    }
    return common;
}

// NOLINTNEXTLINE(misc-no-recursion): no deeper than `deepest`
BaseEntry EntryBases::Find(Pair pair, KivStringT<char16_t> const* name, Found& found) {
    auto const known = found.entries.find(pair);
    if (known != found.entries.end())
        return known->second;
    if (found.depth == deepest || found.entries.size() == maximumPairsOfEntry)
        return {};
    AncestryGraph::Meeting const* const meeting = MeetingOf(pair);
    // If each contains the other, neither is the older one.
    if (meeting == nullptr || (meeting->leftContainsRight && meeting->rightContainsLeft))
        return {};
    // Finding it may lead back to this pair, for which there is no base then.
    found.entries.emplace(pair, BaseEntry());
    ++found.depth;
    BaseEntry base = meeting->bases.empty() ? HeldEntry() : CombineBases(pair, meeting->arrivals, name, found);
    --found.depth;
    found.entries.insert_or_assign(pair, base);
    return base;
}

// NOLINTNEXTLINE(misc-no-recursion): no deeper than `deepest`
BaseEntry EntryBases::CombineBases(Pair pair, std::vector<Node> const& bases, KivStringT<char16_t> const* name,
                                   Found& found) {
    for (Node const base : bases)
        if (versions_.IsGone(base))
            return {};
    if (BaseEntry common = CommonEntry(bases, name))
        return common;
    if (BaseEntry decided = DecidedByBoth(pair, bases, name))
        return decided;
    std::vector<Node> last;
    for (Node const base : bases)
        if (!IsChangedBy(base, bases, name, found))
            last.push_back(base);
    if (BaseEntry common = CommonEntry(last, name))
        return common;
    return last.empty() || last.size() == bases.size() ? BaseEntry() : DecidedByBoth(pair, last, name);
}

/// Whether another one of @p bases has changed the entry that @p base has.
// NOLINTNEXTLINE(misc-no-recursion): no deeper than `deepest`
bool EntryBases::IsChangedBy(Node base, std::vector<Node> const& bases, KivStringT<char16_t> const* name,
                             Found& found) {
    HeldEntry const entry = EntryAt(base, name);
    for (Node const other : bases) {
        if (EntryAt(other, name) == entry)
            continue;
        BaseEntry const before = Find(Ordered(base, other), name, found);
        if (before && *before == entry)
            return true;
    }
    return false;
}

/// What both sides had when each had brought the bases together, if that is the same.
BaseEntry EntryBases::DecidedByBoth(Pair pair, std::vector<Node> const& bases, KivStringT<char16_t> const* name) {
    BaseEntry one = CommonEntry(FirstWithAll(pair.first, pair.second, bases), name);
    BaseEntry const other = one ? CommonEntry(FirstWithAll(pair.second, pair.first, bases), name) : BaseEntry();
    return one && other && *one == *other ? std::move(one) : BaseEntry();
}

std::vector<Node> const& EntryBases::FirstWithAll(Node side, Node other, std::vector<Node> const& bases) {
    auto const [entry, isNew] = firstWithAll_.try_emplace({Pair(side, other), bases});
    if (isNew)
        entry->second =
            graph_.FindFirstWithAll(side, other, bases, [this](Node node) { return !versions_.IsGone(node); });
    return entry->second;
}

} // namespace KivArchive
