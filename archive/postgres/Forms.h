#pragma once

/// @file
/// Stored forms as the server gives them, with what they are differences to.

#include "Segment.h"
#include "SmallTable.h"
#include "postgres/Connection.h"

#include <unordered_map>

namespace KivArchive::Postgres {

/// A stored form, and what keeps its bytes.
struct Form {
    std::shared_ptr<const void> owner;
    ByteView bytes;
};

/// A row of the table of objects.
struct Row {
    StoredType type = StoredType::Blob;
    /// Whether it is no object any more, and stays for those that are differences to it, or for its facts.
    bool isRemoved = false;
    std::uint64_t size = 0;
    /// Null if it is no difference.
    Id base;
    /// The size of what is stored, and that itself; nothing if it was too much.
    std::uint64_t storedSize = 0;
    ByteView stored;
};

/// What is to be known of a version for the next one to be a difference to it.
struct Version {
    StoredType type = StoredType::Blob;
    Id base;
    std::uint64_t generation = 0;
    std::uint64_t formSize = 0;
};

/// Of version @p generation, which is not the first: what it is a difference to. That one's number has the last digit that is
/// not zero one less, to the base of 4. No version is more than three steps for each digit from one that is whole, and three of
/// four are differences to the version before.
[[nodiscard]] inline std::uint64_t GenerationOfBase(std::uint64_t generation) noexcept {
    constexpr std::uint64_t firstBits = 0x5555555555555555;
    std::uint64_t const lowest = generation & (~generation + 1);
    return generation - ((lowest & firstBits) != 0 ? lowest : lowest / 2);
}

/// A row with its form, which is no difference any more. Rows never change; whether the server still has one is for the
/// server to say.
struct WholeRow {
    Version version;
    Form form;
};

/// Rows that were read together. Used by one thread at a time.
class Forms {
public:
    /// Reads the rows of @p ids and of all that they are differences to, in one round trip; the stored forms only if they
    /// take at most @p most bytes together.
    void Read(Connection& connection, std::span<const Id> ids, std::uint64_t most);
    /// The same, as a part of a round trip whose answer is taken then.
    static void AddTo(RoundTrip& trip, std::span<const Id> ids, std::uint64_t most);
    void Take(Rows const& rows);
    /// A row that was read or stored before.
    void Take(Id const& id, WholeRow const& whole);
    /// Every row that was read.
    [[nodiscard]] std::vector<Id> Ids() const;

    /// Null if no such row was read.
    [[nodiscard]] Row const* Find(Id const& id) const;
    /// Whether the stored forms are there, too.
    [[nodiscard]] bool AreWhole() const noexcept { return areWhole_; }
    /// How much is stored for @p id and what it is a difference to.
    [[nodiscard]] std::uint64_t StoredSizeOf(Id const& id) const;

    /// How the form of @p id, which must have been read, is stored. @throws Malformed
    [[nodiscard]] Member const& MemberOf(Id const& id);
    /// @throws Malformed
    [[nodiscard]] Version VersionOf(Id const& id);
    /// The form itself. @throws Malformed
    [[nodiscard]] Form FormOf(Id const& id, Compressor& compressor);

private:
    [[nodiscard]] std::shared_ptr<const Segment> StoredAt(Id const& id);
    void Keep(Id const& id, std::shared_ptr<const Bytes> const& form);

    std::vector<Rows> answers_;
    std::unordered_map<Id, Row> rows_;
    SmallTable<Id, WholeRow> whole_;
    std::unordered_map<Id, std::shared_ptr<const Segment>> stored_;
    std::unordered_map<Id, std::shared_ptr<const Bytes>> made_;
    std::uint64_t madeSize_ = 0;
    bool areWhole_ = true;
};

/// The type of a stored thing. @throws Malformed
[[nodiscard]] Row RowOf(std::int64_t type);

[[nodiscard]] ObjectType ObjectTypeOf(StoredType type) noexcept;

/// Whether the row is what is left of a commit. No row is a difference to a commit.
[[nodiscard]] inline bool HasFactsOnly(Row const& row) noexcept {
    return row.isRemoved && row.type == StoredType::Commit;
}

/// Whether the row is an object of the archive, rather than a part of one.
[[nodiscard]] inline bool IsObject(Row const& row) noexcept {
    return !row.isRemoved && row.type != StoredType::Piece;
}

} // namespace KivArchive::Postgres
