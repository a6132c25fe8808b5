#pragma once

/// @file
/// What an item that is to be stored can be a difference to.

#include "sqlite/SqliteStore.h"

#include <unordered_map>

namespace KivArchive {

/// An item on its way into a segment.
struct Prepared : ItemForm {
    Bytes difference;

    /// The base, if there may be one: among those prepared, or stored.
    Prepared const* preparedBase = nullptr;
    std::optional<Place> storedBase;
    Form baseForm;
    std::uint64_t generation = 0;
    /// The row of the version before, which must still be there when the item is stored.
    std::optional<std::pair<Id, Place>> relied;

    /// Where it is laid out: the number of the segment among those stored together.
    Place place;
};

/// Finds the base of @p prepared and its form: that of version v is version v & (v - 1), so that no version is more than
/// log2(v) steps from one that is whole.
/// @param earlier the version before if it is among those prepared, and decided; otherwise null, and it is looked for in
/// the archive
void FindBase(Prepared& prepared, Prepared const* earlier, FormReader& reader, Database& database);

/// Makes the difference, if that is worth it, and decides how the form is stored.
void MakeDifference(Prepared& prepared, Compressor& compressor);

} // namespace KivArchive
