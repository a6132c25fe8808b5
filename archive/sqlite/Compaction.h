#pragma once

/// @file
/// Giving back what removed objects took.

#include "sqlite/SqliteStore.h"

namespace KivArchive {

/// Takes an object out of the tables; its form stays until its segment is cleared.
void RemoveObject(Database& database, Id const& id, Place const& place);

/// A segment that has members to be cleared away; none if there is none.
[[nodiscard]] std::optional<std::uint64_t> FirstSparse(Database& database);

/// Clears the members of a segment away that are no objects any more, and that no difference refers to.
/// @return how many bytes were looked at, at least 1
std::uint64_t ClearSegment(Connection& connection, SqliteStore& store, std::uint64_t number);

/// Removes the pieces that no content has named for long enough.
void SweepPieces(Connection& connection, SqliteStore& store);

} // namespace KivArchive
