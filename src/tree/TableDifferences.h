#pragma once

#include "tree/TableNode.h"

#include <array>

namespace KivVcs::detail {

/// What one side of a comparison holds under a name; a null handle counts as nothing.
struct NamedObjects {
    Blob const* blob = nullptr;
    Tree const* tree = nullptr;

    /// What a lookup by name finds: the blob before the subtree.
    [[nodiscard]] Object const* Visible() const noexcept {
        return blob != nullptr ? static_cast<Object const*>(blob) : static_cast<Object const*>(tree);
    }
};

/// A position among the entries below a node.
class TableCursor {
public:
    explicit TableCursor(TableNode const* root) noexcept : atEnd_(root == nullptr) {
        if (atEnd_)
            return;
        top_ = root->Height();
        nodes_[Index(top_)] = root;
        positions_[Index(top_)] = 0;
        Descend(top_);
    }

    [[nodiscard]] bool AtEnd() const noexcept { return atEnd_; }
    [[nodiscard]] Entry const& Get() const noexcept {
        return nodes_[0]->Entries()[static_cast<std::size_t>(positions_[0])];
    }
    void Next() noexcept { Advance(0); }

    /// Moves both cursors past the largest node that both are at the beginning of; false if there is none that may be skipped.
    static bool SkipShared(TableCursor& left, TableCursor& right) noexcept {
        for (int height = std::min(left.BeginningOf(), right.BeginningOf()); height >= 0; --height) {
            TableNode const* const node = left.nodes_[Index(height)];
            // A subtree hidden behind a blob differs even from itself when it is looked up by name.
            if (node == right.nodes_[Index(height)] && node->Total().doubled == 0) {
                left.Advance(height + 1);
                right.Advance(height + 1);
                return true;
            }
        }
        return false;
    }

    /// Takes both entries of the name at the cursor, which lie in one leaf, and moves past them.
    NamedObjects TakeName() noexcept {
        NamedObjects objects;
        const KivStringViewT<char16_t> name = Get().Name();
        do {
            Entry const& entry = Get();
            if (entry.IsTree())
                objects.tree = entry.TreeChild();
            else
                objects.blob = entry.BlobChild();
            Next();
        } while (!atEnd_ && Get().Name() == name);
        return objects;
    }

private:
    static constexpr std::size_t Index(int height) noexcept { return static_cast<std::size_t>(height); }

    /// The greatest height of a node that the cursor is at the beginning of.
    [[nodiscard]] int BeginningOf() const noexcept {
        int height = 0;
        while (height < top_ && positions_[Index(height)] == 0)
            ++height;
        return positions_[Index(height)] == 0 ? height : height - 1;
    }

    /// Goes from the element at @p height down to its first entry.
    void Descend(int height) noexcept {
        for (; height > 0; --height) {
            nodes_[Index(height - 1)] = nodes_[Index(height)]->Branches()[Index(positions_[Index(height)])].child;
            positions_[Index(height - 1)] = 0;
        }
    }

    /// Moves to the next element of the node at @p height, or of the first one above it that has another.
    void Advance(int height) noexcept {
        while (height <= top_ && ++positions_[Index(height)] == nodes_[Index(height)]->Count())
            ++height;
        atEnd_ = height > top_;
        if (!atEnd_)
            Descend(height);
    }

    std::array<TableNode const*, TableNode::greatestHeight> nodes_;
    std::array<int, TableNode::greatestHeight> positions_;
    int top_ = 0;
    bool atEnd_;
};

/// Whether two inner nodes divide the names among their children in the same way, so that child can be compared with child.
[[nodiscard]] inline bool DivideAlike(TableNode const& left, TableNode const& right) noexcept {
    if (left.IsLeaf() || left.Height() != right.Height() || left.Count() != right.Count())
        return false;
    const auto mine = left.Branches();
    const auto theirs = right.Branches();
    // The first child takes all smaller names, whatever its own first name says.
    return std::equal(mine.begin() + 1, mine.end(), theirs.begin() + 1, [](Branch const& a, Branch const& b) {
        return a.first.GetString() == b.first.GetString() || a.first == b.first;
    });
}

/// The order of two entries by name; 0 without a look at the texts where both share one.
[[nodiscard]] inline int CompareNames(Entry const& left, Entry const& right) noexcept {
    KivStringT<char16_t> const& mine = left.Name();
    KivStringT<char16_t> const& theirs = right.Name();
    return mine.GetString() == theirs.GetString() ? 0 : mine.Compare(theirs);
}

/// As below, for two leaves without doubled names: each name is one entry there.
template <class Visit>
void ForEachDifferenceOfLeaves(TableNode const& left, TableNode const& right, Visit const& visit) {
    const auto objectsOf = [](Entry const& entry) { return NamedObjects{entry.BlobChild(), entry.TreeChild()}; };
    auto mine = left.Entries().begin();
    auto theirs = right.Entries().begin();
    const auto mineEnd = left.Entries().end();
    const auto theirsEnd = right.Entries().end();
    while (mine != mineEnd && theirs != theirsEnd) {
        if (mine->Shares(*theirs)) {
            ++mine;
            ++theirs;
            continue;
        }
        const int order = CompareNames(*mine, *theirs);
        visit((order <= 0 ? mine : theirs)->Name(), order <= 0 ? objectsOf(*mine) : NamedObjects{},
              order >= 0 ? objectsOf(*theirs) : NamedObjects{});
        mine += order <= 0 ? 1 : 0;
        theirs += order >= 0 ? 1 : 0;
    }
    for (; mine != mineEnd; ++mine)
        visit(mine->Name(), objectsOf(*mine), NamedObjects{});
    for (; theirs != theirsEnd; ++theirs)
        visit(theirs->Name(), NamedObjects{}, objectsOf(*theirs));
}

/// Hands every name of two tables (either may be null) to @p visit, in order, with what both sides hold under it, but for runs
/// of entries that both tables share and that no lookup can tell apart. Recurses only with the height.
template <class Visit>
// NOLINTNEXTLINE(misc-no-recursion): as deep as the table is high
void ForEachDifference(TableNode const* left, TableNode const* right, Visit const& visit) {
    if (left == right && (left == nullptr || left->Total().doubled == 0))
        return;
    if (left != nullptr && right != nullptr && DivideAlike(*left, *right)) {
        // Most children of two versions are the same; without doubled names below they need not even be looked at.
        const bool skipsShared = left->Total().doubled == 0;
        for (std::size_t index = 0; index < left->Branches().size(); ++index) {
            TableNode const* const mine = left->Branches()[index].child;
            TableNode const* const theirs = right->Branches()[index].child;
            if (mine != theirs || !skipsShared)
                ForEachDifference(mine, theirs, visit);
        }
        return;
    }
    if (left != nullptr && right != nullptr && left->IsLeaf() && right->IsLeaf() && left->Total().doubled == 0 &&
        right->Total().doubled == 0) {
        ForEachDifferenceOfLeaves(*left, *right, visit);
        return;
    }
    TableCursor mine(left);
    TableCursor theirs(right);
    while (!mine.AtEnd() || !theirs.AtEnd()) {
        if (!mine.AtEnd() && !theirs.AtEnd() && TableCursor::SkipShared(mine, theirs))
            continue;
        int order = mine.AtEnd() ? 1 : -1;
        if (!mine.AtEnd() && !theirs.AtEnd())
            order = CompareNames(mine.Get(), theirs.Get());
        KivStringT<char16_t> const& name = order <= 0 ? mine.Get().Name() : theirs.Get().Name();
        const NamedObjects here = order <= 0 ? mine.TakeName() : NamedObjects{};
        const NamedObjects there = order >= 0 ? theirs.TakeName() : NamedObjects{};
        visit(name, here, there);
    }
}

} // namespace KivVcs::detail
