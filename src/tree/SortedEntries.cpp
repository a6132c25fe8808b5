#include "tree/SortedEntries.h"

namespace KivVcs::detail {

namespace {

constexpr std::size_t maximumElements = Node::maxElements;

/// The nodes above @p nodes, of which there are several, all about equally full.
std::vector<Child> NodesAbove(std::vector<Child> nodes) {
    const int height = nodes.front().node->Height() + 1;
    const std::size_t count = (nodes.size() + maximumElements - 1) / maximumElements;
    std::vector<Child> above;
    above.reserve(count);
    for (std::size_t index = 0; index < count; ++index) {
        const std::size_t from = nodes.size() * index / count;
        const std::size_t to = nodes.size() * (index + 1) / count;
        KivStringT<char16_t> separator = nodes[from].separator;
        above.push_back({std::move(separator), Node::MakeOf(height, std::span(nodes).subspan(from, to - from))});
    }
    return above;
}

} // namespace

void SortedEntries::Add(KivStringT<char16_t> name, Held held) {
    if (entries_.size() == maximumElements)
        MakeLeaf();
    entries_.push_back({std::move(name), std::move(held)});
}

void SortedEntries::MakeLeaf() {
    cow_ptr<Node> leaf = Node::MakeOf(0, std::span(entries_));
    KivStringT<char16_t> first = leaf->EntryAt(0).name;
    leaves_.push_back({std::move(first), std::move(leaf)});
    entries_.clear();
}

EntryTable SortedEntries::Take() {
    if (!entries_.empty())
        MakeLeaf();
    std::vector<Child> nodes = std::exchange(leaves_, {});
    while (nodes.size() > 1)
        nodes = NodesAbove(std::move(nodes));
    return nodes.empty() ? EntryTable() : EntryTable(std::move(nodes.front().node));
}

} // namespace KivVcs::detail
