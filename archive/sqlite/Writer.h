#pragma once

/// @file
/// The statements of a transaction that writes.

#include "sqlite/SqliteStore.h"

namespace KivArchive {

/// Writes within one transaction of a connection.
class Writer {
public:
    explicit Writer(Database& database);

    /// Whether branches and records are as @p change expects them.
    [[nodiscard]] ChangeOutcome Compare(Change const& change);
    /// Removes the mark of an object. @return false if the object is not there
    bool Use(Id const& id);
    [[nodiscard]] bool IsAt(Id const& id, Place const& place);

    /// The number of the next segment. None is used twice.
    [[nodiscard]] std::uint64_t NextSegment();
    void AddSegment(std::uint64_t number, ByteView form);
    /// If there is an object with that identifier it stays, and @p place is left to be cleared.
    void AddObject(Id const& id, StoredType type, Place const& place);
    /// Leaves its place to be cleared.
    void RemoveObject(Id const& id, Place const& place);
    void AddDependency(std::uint64_t base, std::uint64_t segment);

    /// Writes facts, branches and records, and uses what is relied on. @throws ArchiveError of kind `Collected`
    void Write(Change const& change);

private:
    void WriteAncestry(std::vector<Ancestry> const& ancestry);

    Database& database_;
    bool hasMarks_;
};

} // namespace KivArchive
