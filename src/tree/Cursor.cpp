#include "tree/Cursor.h"

namespace KivVcs::detail {

Cursor::Cursor(Node const* top) noexcept {
    if (top == nullptr)
        return;
    height_ = static_cast<std::size_t>(top->Height());
    steps_[height_] = {top, 0};
    Descend(height_);
}

Cursor Cursor::AtLeafOf(Node const& top, std::uint64_t& offset) noexcept {
    Cursor cursor;
    cursor.height_ = static_cast<std::size_t>(top.Height());
    cursor.steps_[cursor.height_] = {&top, 0};
    for (std::size_t height = cursor.height_; height > 0; --height) {
        Step& step = cursor.steps_[height];
        while (offset >= step.node->ChildAt(step.child).node->Total().packedSize)
            offset -= step.node->ChildAt(step.child++).node->Total().packedSize;
        cursor.steps_[height - 1] = {step.node->ChildAt(step.child).node.get(), 0};
    }
    cursor.Descend(0);
    return cursor;
}

/// Goes from the current child of the node at @p height down to its first entry.
void Cursor::Descend(std::size_t height) noexcept {
    for (; height > 0; --height)
        steps_[height - 1] = {steps_[height].node->ChildAt(steps_[height].child).node.get(), 0};
    const auto entries = Leaf().Entries();
    entry_ = entries.data();
    end_ = entry_ + entries.size();
}

void Cursor::NextLeaf() noexcept {
    for (std::size_t height = 1; height <= height_; ++height) {
        if (++steps_[height].child < steps_[height].node->Count())
            return Descend(height);
    }
    entry_ = nullptr;
}

void Cursor::SkipShared(Cursor& left, Cursor& right) noexcept {
    // A subtree hidden behind a blob differs even from itself when it is looked up by name.
    while (!left.AtEnd() && !right.AtEnd() && !left.Leaf().Total().HasSharedNames()) {
        Entry const* mine = left.entry_;
        Entry const* theirs = right.entry_;
        Entry const* const end = mine + std::min(left.end_ - mine, right.end_ - theirs);
        if (mine == theirs) {
            mine = theirs = end;
        } else {
            for (; mine != end && mine->IsSharedWith(*theirs); ++mine)
                ++theirs;
        }
        left.entry_ = mine;
        right.entry_ = theirs;
        if (mine != end)
            return;
        if (mine == left.end_)
            left.NextLeaf();
        if (theirs == right.end_)
            right.NextLeaf();
    }
}

} // namespace KivVcs::detail
