#pragma once

/// @file
/// Giving back the space of removed objects.

#include "sqlite/SqliteStore.h"

namespace KivArchive {

/// Takes an object out of the tables; its form stays until its segment is cleared.
void RemoveObject(Database& database, Id const& id, Place const& place);

/// A segment that may have members to be cleared; nothing if there is none.
[[nodiscard]] std::optional<std::uint64_t> FirstSparse(Database& database);

/// Clears those members of a segment that are no objects any more and that no difference refers to.
/// @return how many bytes were read, at least 1
std::uint64_t ClearSegment(Connection& connection, SqliteStore& store, std::uint64_t number);

/// Removes the pieces that no content has named for their grace time.
void SweepPieces(Connection& connection, SqliteStore& store);

} // namespace KivArchive
