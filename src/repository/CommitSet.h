#pragma once

/// @file
/// The set of commits that a walk over the history has visited.

#include "KivVcs/Commit.h"

#include <array>

namespace KivVcs {

/// Commits, each identifier once. Holds no references, so that walking neither touches use counts nor keeps anything
/// alive, and allocates nothing for the first few commits. At most 64 bytes a commit otherwise, also while it grows.
class CommitSet {
public:
    CommitSet() noexcept = default;
    CommitSet(CommitSet const&) = delete;
    CommitSet& operator=(CommitSet const&) = delete;

    /// @return the commit of the same identifier that is there already; null if there was none, and @p commit is there
    /// now.
    /// @pre @p commit outlives the set
    Commit const* Insert(Commit const& commit) {
        const std::size_t hash = commit.GetIdHash();
        Slot* const slot = Find(hash, commit);
        if (slot->commit != nullptr)
            return slot->commit;
        *slot = {hash, &commit};
        if (++count_ > mask_ - mask_ / 4)
            Grow();
        return nullptr;
    }

private:
    struct Slot {
        std::size_t hash;
        Commit const* commit;
    };

    static constexpr std::size_t slotsAtFirst = 32;

    /// The slot of the commit with that identifier, or the empty one where it belongs.
    Slot* Find(std::size_t hash, Commit const& commit) {
        for (std::size_t index = Spread(hash) & mask_;; index = (index + 1) & mask_) {
            Slot& slot = slots_[index];
            if (slot.commit == nullptr || (slot.hash == hash && slot.commit->HasSameId(commit)))
                return &slot;
        }
    }

    /// The sampled hash leaves its low bits nearly constant.
    static std::size_t Spread(std::size_t hash) noexcept {
        const std::uint64_t mixed = static_cast<std::uint64_t>(hash) * 0x9e3779b97f4a7c15U;
        return static_cast<std::size_t>(mixed >> 32);
    }

    void Grow();

    std::array<Slot, slotsAtFirst> first_{};
    std::vector<Slot> allocated_;
    Slot* slots_ = first_.data();
    std::size_t mask_ = slotsAtFirst - 1;
    std::size_t count_ = 0;
};

} // namespace KivVcs
