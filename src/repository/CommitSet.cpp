#include "repository/CommitSet.h"

namespace KivVcs {

void CommitSet::Grow() {
    const std::size_t slotCount = 2 * (mask_ + 1);
    std::vector<Slot> larger(slotCount);
    for (std::size_t old = 0; old <= mask_; ++old) {
        if (slots_[old].commit == nullptr)
            continue;
        std::size_t index = static_cast<std::size_t>(slots_[old].prefix) & (slotCount - 1);
        while (larger[index].commit != nullptr)
            index = (index + 1) & (slotCount - 1);
        larger[index] = slots_[old];
    }
    allocated_ = std::move(larger);
    slots_ = allocated_.data();
    mask_ = slotCount - 1;
    free_ = slotCount / 4 * 3 - slotCount / 8 * 3;
}

} // namespace KivVcs
