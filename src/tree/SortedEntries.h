#pragma once

#include "tree/Node.h"

#include <vector>

namespace KivVcs::detail {

/// Entries that come one by one in the order of their names, and the table that they make: full leaves, each in one
/// allocation of exact size, and no look at what is there already.
class SortedEntries {
public:
    /// Whether @p name comes after all others.
    [[nodiscard]] bool IsNext(KivStringViewT<char16_t> name) const noexcept {
        return entries_.empty() || entries_.back().name.Compare(name) < 0;
    }

    /// @pre `IsNext(name)`, and something is held. @throws std::bad_alloc; the entries are of no use then
    void Add(KivStringT<char16_t> name, Held held);

    /// The table of all entries; none are left here. @throws std::bad_alloc
    [[nodiscard]] EntryTable Take();

private:
    void MakeLeaf();

    /// Those that no leaf holds yet, and at least the last one of all: a full leaf is made when the next entry comes.
    std::vector<Entry> entries_;
    std::vector<Child> leaves_;
};

} // namespace KivVcs::detail
