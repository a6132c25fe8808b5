#pragma once

#include "tree/Node.h"

#include <array>

namespace KivVcs::detail {

/// A position among the entries below a node, which may be null.
class Cursor {
public:
    explicit Cursor(Node const* top) noexcept;

    /// At the beginning of the leaf that packs the byte @p offset of what @p top packs, and @p offset is counted from the leaf
    /// on then. @pre there is such a byte
    [[nodiscard]] static Cursor AtLeafOf(Node const& top, std::uint64_t& offset) noexcept;

    [[nodiscard]] bool AtEnd() const noexcept { return entry_ == nullptr; }
    [[nodiscard]] Entry const& Get() const noexcept { return *entry_; }
    [[nodiscard]] Node const& Leaf() const noexcept { return *steps_[0].node; }
    void Next() noexcept {
        if (++entry_ == end_)
            NextLeaf();
    }
    void NextLeaf() noexcept;

    /// Moves both cursors past what follows at both, leaves and entries, that is the same and that no lookup by name can tell
    /// apart.
    static void SkipShared(Cursor& left, Cursor& right) noexcept;

private:
    Cursor() noexcept = default;

    /// A node on the way to the entry and the index of the child that leads on.
    struct Step {
        Node const* node;
        int child;
    };

    void Descend(std::size_t height) noexcept;

    Entry const* entry_ = nullptr;
    Entry const* end_ = nullptr;
    std::size_t height_ = 0;
    /// By height, from the leaf on.
    std::array<Step, Node::maxHeight> steps_;
};

/// Hands every entry below @p top, which may be null, to @p visit in order.
template <class Visit>
void ForEachEntry(Node const* top, Visit const& visit) {
    for (Cursor cursor(top); !cursor.AtEnd(); cursor.NextLeaf()) {
        for (Entry const& entry : cursor.Leaf().Entries())
            visit(entry);
    }
}

} // namespace KivVcs::detail
