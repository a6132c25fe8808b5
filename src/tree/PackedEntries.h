#pragma once

#include "tree/TableNode.h"

namespace KivVcs::detail {

/// The number of bytes that `PackEntry` writes; 0 for a null child, which a packed form leaves out.
[[nodiscard]] std::uint64_t PackedSize(Entry const& entry) noexcept;

/// No less than `PackedSize`, without looking at the name's text.
[[nodiscard]] std::uint64_t MostPackedSize(Entry const& entry) noexcept;

/// Writes mode, blank, type, blank, name in UTF-8, zero byte and identifier, and returns the end of what was written.
/// Writes nothing for a null child. @throws std::bad_alloc if the child's identifier had yet to be computed
char* PackEntry(Entry const& entry, char* out);

/// Hands every entry of @p leaf that a packed form shows to @p visit: all but subtrees hidden behind a blob of the same
/// name.
template <class Visit>
void ForEachPackedEntry(TableNode const& leaf, Visit const& visit) {
    Entry const* blobBefore = nullptr;
    for (Entry const& entry : leaf.Entries()) {
        if (!entry.IsTree())
            blobBefore = &entry;
        else if (blobBefore != nullptr && blobBefore->Name() == entry.Name())
            continue;
        visit(entry);
    }
}

} // namespace KivVcs::detail
