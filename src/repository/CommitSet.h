#pragma once

/// @file
/// The set of commits that a walk over the history has visited.

#include "KivVcs/Commit.h"

#include <array>

namespace KivVcs {

/// Commits, each identifier once. Holds no references, so that walking neither touches use counts nor keeps anything
/// alive. Allocates nothing for the first few commits, and takes at most 64 bytes for each further one, also while it
/// grows.
class CommitSet {
public:
    CommitSet() noexcept = default;
    CommitSet(CommitSet const&) = delete;
    CommitSet& operator=(CommitSet const&) = delete;

    /// @return the commit with the same identifier that is there already; null if there was none and @p commit has been
    /// inserted
    /// @pre @p commit outlives the set
    Commit const* Insert(Commit const& commit) {
        const std::uint64_t prefix = commit.GetIdPrefix();
        Slot* const slot = Find(prefix, commit);
        if (slot->commit != nullptr)
            return slot->commit;
        *slot = {prefix, &commit};
        if (--free_ == 0)
            Grow();
        return nullptr;
    }

private:
    struct Slot {
        std::uint64_t prefix;
        Commit const* commit;
    };

    static constexpr std::size_t slotsAtFirst = 32;

    /// The slot of the commit with that identifier, or the empty one where it belongs.
    Slot* Find(std::uint64_t prefix, Commit const& commit) {
        for (std::size_t index = static_cast<std::size_t>(prefix) & mask_;; index = (index + 1) & mask_) {
            Slot& slot = slots_[index];
            if (slot.commit == nullptr || (slot.prefix == prefix && slot.commit->HasSameId(commit)))
                return &slot;
        }
    }

    void Grow();

    std::array<Slot, slotsAtFirst> first_{};
    std::vector<Slot> allocated_;
    Slot* slots_ = first_.data();
    std::size_t mask_ = slotsAtFirst - 1;
    /// How many commits can be inserted before the set grows, at three quarters of its slots.
    std::size_t free_ = slotsAtFirst / 4 * 3;
};

} // namespace KivVcs
