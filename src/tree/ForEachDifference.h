#pragma once

#include "tree/Cursor.h"

namespace KivVcs::detail {

/// Whether a lookup by name finds something else on the other side than @p object, which may be null.
[[nodiscard]] inline bool IsMissingIn(Held const& other, Object const* object) {
    return object != nullptr && (other.Visible() == nullptr || !object->HasSameId(*other.Visible()));
}

[[nodiscard]] inline bool BlobDiffers(Held const& mine, Held const& theirs) {
    return IsMissingIn(theirs, mine.GetBlob()) || IsMissingIn(mine, theirs.GetBlob());
}

[[nodiscard]] inline bool TreeDiffers(Held const& mine, Held const& theirs) {
    return (mine.HasTree() || theirs.HasTree()) &&
           (IsMissingIn(theirs, mine.GetTree()) || IsMissingIn(mine, theirs.GetTree()));
}

[[nodiscard]] inline Node const* TopOf(Tree const* tree) noexcept {
    return tree == nullptr ? nullptr : TreeAccess::Top(*tree).get();
}

/// Whether two nodes have their children separated alike, so that child can be compared with child.
[[nodiscard]] inline bool AreSeparatedAlike(Node const& left, Node const& right) noexcept {
    if (left.IsLeaf() || left.Height() != right.Height() || left.Count() != right.Count())
        return false;
    const auto mine = left.Children();
    const auto theirs = right.Children();
    // The first child takes all smaller names, whatever its own separator.
    return std::equal(mine.begin() + 1, mine.end(), theirs.begin() + 1, [](Child const& a, Child const& b) {
        return a.separator.IsSharedWith(b.separator) || a.separator == b.separator;
    });
}

/// The order of the entries at two cursors by name, behind all others where a cursor is at its end.
[[nodiscard]] inline int CompareNames(Cursor const& left, Cursor const& right) noexcept {
    if (left.AtEnd() || right.AtEnd())
        return left.AtEnd() ? 1 : -1;
    KivStringT<char16_t> const& mine = left.Get().name;
    KivStringT<char16_t> const& theirs = right.Get().name;
    return mine.IsSharedWith(theirs) ? 0 : mine.Compare(theirs);
}

/// Hands every name below two nodes, either of which may be null, to @p visit, in order and with what both sides hold under
/// it; but not what both share and no lookup by name can tell apart. Recurses only with the height.
template <class Visit>
// NOLINTNEXTLINE(misc-no-recursion): as deep as the table is high
void ForEachDifference(Node const* left, Node const* right, Visit const& visit) {
    if (left != nullptr && right != nullptr && AreSeparatedAlike(*left, *right)) {
        for (int index = 0; index < left->Count(); ++index) {
            Node const* const mine = left->ChildAt(index).node.get();
            Node const* const theirs = right->ChildAt(index).node.get();
            // A subtree hidden behind a blob differs even from itself when it is looked up by name.
            if (mine != theirs || mine->Total().HasSharedNames())
                ForEachDifference(mine, theirs, visit);
        }
        return;
    }
    const Held nothing;
    Cursor mine(left);
    Cursor theirs(right);
    for (Cursor::SkipShared(mine, theirs); !mine.AtEnd() || !theirs.AtEnd(); Cursor::SkipShared(mine, theirs)) {
        const int order = CompareNames(mine, theirs);
        visit(order <= 0 ? mine.Get().name : theirs.Get().name, order <= 0 ? mine.Get().held : nothing,
              order >= 0 ? theirs.Get().held : nothing);
        if (order <= 0)
            mine.Next();
        if (order >= 0)
            theirs.Next();
    }
}

} // namespace KivVcs::detail
