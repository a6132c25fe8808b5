#include "sqlite/Writer.h"

#include "Changes.h"
#include "sqlite/Compaction.h"

#include <algorithm>

namespace KivArchive {

namespace {

Id HeadOf(Database& database, Bytes const& name) {
    Query query(database, "SELECT head FROM branches WHERE name=?");
    return query.With(name).Next() ? query.Identifier(0) : Id();
}

std::optional<Buffer> ValueOf(Database& database, Bytes const& name) {
    Query query(database, "SELECT value FROM records WHERE name=?");
    if (!query.With(name).Next())
        return std::nullopt;
    ByteView const bytes = query.Blob(0);
    Buffer value;
    value.Append(bytes.data(), bytes.size());
    return value;
}

} // namespace

Writer::Writer(Database& database)
    : database_(database), hasMarks_(database.Ask("SELECT EXISTS(SELECT 1 FROM marks)") != 0) {}

ChangeOutcome Writer::Compare(Change const& change) {
    ChangeOutcome outcome;
    for (BranchMove const& move : change.branches)
        if (Id head = HeadOf(database_, BytesOfName(move.name)); !(head == move.expected))
            outcome.movedBranches.push_back({move.name, std::move(head)});
    for (RecordChange const& record : change.records)
        if (record.compared)
            if (auto value = ValueOf(database_, BytesOfName(record.record.name)); !SameValue(value, record.expected))
                outcome.changedRecords.push_back({record.record.name, std::move(value)});
    outcome.applied = outcome.movedBranches.empty() && outcome.changedRecords.empty();
    return outcome;
}

bool Writer::Use(Id const& id) {
    if (!FindRow(database_, id))
        return false;
    if (hasMarks_)
        Query(database_, "DELETE FROM marks WHERE id=?").With(id).Run();
    return true;
}

bool Writer::IsAt(Id const& id, Place const& place) {
    auto const row = FindRow(database_, id);
    return row && row->place == place;
}

std::uint64_t Writer::NextSegment() {
    return static_cast<std::uint64_t>(database_.Ask("SELECT coalesce(max(number), 0) + 1 FROM segments"));
}

void Writer::AddSegment(std::uint64_t number, ByteView form) {
    Query(database_, "INSERT INTO segments(number, form) VALUES(?, ?)").With(number).With(form).Run();
}

void Writer::AddObject(Id const& id, StoredType type, Place const& place) {
    Query(database_, "INSERT INTO objects(id, type, segment, member) VALUES(?, ?, ?, ?) ON CONFLICT DO NOTHING")
        .With(id)
        .With(static_cast<std::int64_t>(type))
        .With(place.segment)
        .With(place.member)
        .Run();
    if (sqlite3_changes(database_.Handle()) != 0)
        return;
    Query(database_, "INSERT INTO sparse(segment) VALUES(?) ON CONFLICT DO NOTHING").With(place.segment).Run();
    Use(id);
}

void Writer::RemoveObject(Id const& id, Place const& place) {
    KivArchive::RemoveObject(database_, id, place);
}

void Writer::AddDependency(std::uint64_t base, std::uint64_t segment) {
    Query(database_, "INSERT INTO dependencies(base, segment) VALUES(?, ?) ON CONFLICT DO NOTHING")
        .With(base)
        .With(segment)
        .Run();
}

void Writer::WriteAncestry(std::vector<Ancestry> const& ancestry) {
    for (Ancestry const& facts : ancestry) {
        Query(database_, "INSERT INTO ancestry(id, parent, tree) VALUES(?, ?, ?) ON CONFLICT DO NOTHING")
            .With(facts.commit)
            .With(facts.parent)
            .With(facts.tree)
            .Run();
        for (ContainedCommit const& contained : facts.contains)
            Query(database_, "INSERT INTO contained(id, how, other) VALUES(?, ?, ?) ON CONFLICT DO NOTHING")
                .With(facts.commit)
                .With(static_cast<std::int64_t>(contained.how))
                .With(contained.id)
                .Run();
    }
}

void Writer::Write(Change const& change) {
    for (Id const& id : change.relied)
        if (!Use(id))
            ThrowCollected(id, database_.Path());
    WriteAncestry(change.ancestry);
    for (BranchMove const& move : change.branches) {
        Bytes const name = BytesOfName(move.name);
        if (move.head.IsEmpty()) {
            Query(database_, "DELETE FROM branches WHERE name=?").With(name).Run();
            continue;
        }
        if (!Use(move.head))
            ThrowCollected(move.head, database_.Path());
        Query(database_,
              "INSERT INTO branches(name, head) VALUES(?, ?) ON CONFLICT(name) DO UPDATE SET head=excluded.head")
            .With(name)
            .With(move.head)
            .Run();
    }
    for (RecordChange const& record : change.records) {
        Bytes const name = BytesOfName(record.record.name);
        if (!record.record.value) {
            Query(database_, "DELETE FROM records WHERE name=?").With(name).Run();
            continue;
        }
        Buffer const value = Joined(*record.record.value);
        Query(database_,
              "INSERT INTO records(name, value) VALUES(?, ?) ON CONFLICT(name) DO UPDATE SET value=excluded.value")
            .With(name)
            .With(BytesOf(value))
            .Run();
    }
}

} // namespace KivArchive
