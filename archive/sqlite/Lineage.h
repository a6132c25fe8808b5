#pragma once

/// @file
/// What an item can be stored as a difference to.

#include "sqlite/SqliteStore.h"

#include <unordered_map>

namespace KivArchive {

/// An item on its way into a segment.
struct Prepared : ItemForm {
    Bytes difference;

    /// The base, if there is one: among the prepared items, or stored.
    Prepared const* preparedBase = nullptr;
    std::optional<Place> storedBase;
    Form baseForm;
    std::uint64_t generation = 0;
    /// The row of the earlier version, which must still be there when the item is stored.
    std::optional<std::pair<Id, Place>> relied;

    /// Its place, with the number of the segment among those stored together.
    Place place;
};

/// Finds the base of @p prepared, and its form. The base of version v is version v & (v - 1), so that no version is
/// more than log2(v) steps away from one that is stored whole.
/// @param earlier the earlier version if it is among the prepared items, and its base has been found; null to look for
/// it in the archive
void FindBase(Prepared& prepared, Prepared const* earlier, FormReader& reader, Database& database);

/// Decides how the form is stored, and makes the difference if it is worth it.
void MakeDifference(Prepared& prepared, Compressor& compressor);

} // namespace KivArchive
