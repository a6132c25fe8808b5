#include "AncestryWalk.h"
#include "postgres/Forms.h"
#include "postgres/Store.h"

#include <algorithm>
#include <map>
#include <unordered_map>

namespace KivArchive {

using namespace Postgres;

namespace {

/// The most rows that one answer has, whatever a host asks for.
constexpr std::size_t maximumRows = 1U << 17U;

std::uint64_t LimitOf(std::size_t limit) noexcept {
    return std::min(limit, maximumRows);
}

Rows Ask(Store& store, Statement statement, Parameters const& parameters = {}) {
    return store.Run([&](Connection& connection) {
        RoundTrip trip(connection);
        trip.Add(statement, parameters);
        return trip.Run().front();
    });
}

/// The facts in rows of identifier, parent, tree, how it contains another one, and that; all but the identifier may be
/// missing.
class Facts {
public:
    void Take(Rows const& rows) {
        for (int i = 0; i < rows.Count(); ++i) {
            Id const id = rows.Identifier(i, 0);
            if (rows.IsNull(i, 1)) {
                known_.try_emplace(id);
                continue;
            }
            auto& facts = known_[id];
            if (!facts)
                facts = Ancestry{id, rows.Identifier(i, 1), rows.Identifier(i, 2), {}};
            if (!rows.IsNull(i, 3))
                AddContained(facts->contains, {ContainedOf(rows.Number(i, 3), rows.Identifier(i, 4))});
        }
    }

    [[nodiscard]] bool IsKnown(Id const& id) const { return known_.count(id) != 0; }
    [[nodiscard]] std::optional<Ancestry> const& At(Id const& id) const { return known_.at(id); }

private:
    static ContainedCommit ContainedOf(std::int64_t how, Id id) {
        if (how < 0 || how > static_cast<std::int64_t>(Containment::FoundEqual))
            throw Malformed();
        return {static_cast<Containment>(how), std::move(id)};
    }

    std::unordered_map<Id, std::optional<Ancestry>> known_;
};

Statement WalkAlong(Follow follow) noexcept {
    return follow == Follow::Parents     ? Statement::WalkParents
           : follow == Follow::Reachable ? Statement::WalkReachable
                                         : Statement::WalkEverything;
}

Buffer BufferOf(ByteView bytes) {
    Buffer buffer;
    buffer.Append(bytes.data(), bytes.size());
    return buffer;
}

} // namespace

std::vector<Branch> PostgresArchive::ReadBranches() {
    Rows const rows = Ask(*store_, Statement::ReadBranches);
    // UTF-8 and UTF-16 order characters beyond U+FFFF differently.
    std::map<KivStringT<char16_t>, Id> heads;
    for (int i = 0; i < rows.Count(); ++i)
        heads.emplace(NameOfBytes(rows.Value(i, 0)), rows.Identifier(i, 1));
    std::vector<Branch> branches;
    branches.reserve(heads.size());
    for (auto const& [name, head] : heads)
        branches.push_back({name, head});
    return branches;
}

std::vector<Record> PostgresArchive::ReadRecords(std::span<const KivStringT<char16_t>> names) {
    if (names.empty())
        return {};
    std::vector<Bytes> bytes;
    bytes.reserve(names.size());
    for (auto const& name : names)
        bytes.push_back(BytesOfName(name));
    Rows const rows = Ask(*store_, Statement::ReadRecords, Parameters().With(bytes));
    std::map<KivStringT<char16_t>, Buffer> values;
    for (int i = 0; i < rows.Count(); ++i)
        values.emplace(NameOfBytes(rows.Value(i, 0)), BufferOf(rows.Value(i, 1)));
    std::vector<Record> records;
    records.reserve(values.size());
    for (auto const& [name, value] : values)
        records.push_back({name, value});
    return records;
}

std::vector<KivStringT<char16_t>> PostgresArchive::ListRecords() {
    Rows const rows = Ask(*store_, Statement::ListRecords);
    std::vector<KivStringT<char16_t>> names;
    names.reserve(static_cast<std::size_t>(rows.Count()));
    for (int i = 0; i < rows.Count(); ++i)
        names.push_back(NameOfBytes(rows.Value(i, 0)));
    std::sort(names.begin(), names.end());
    return names;
}

std::vector<Ancestry> PostgresArchive::ReadAncestry(std::span<const Id> commits, Follow follow, std::size_t more) {
    for (Id const& id : commits)
        static_cast<void>(DigestOf(id));
    Facts facts;
    for (;;) {
        // The server walks ahead; what it has not come to is asked for next.
        std::vector<Id> unknown;
        auto walked = WalkAncestry(commits, follow, more, [&](Id const& id) -> std::optional<Ancestry> {
            if (facts.IsKnown(id))
                return facts.At(id);
            unknown.push_back(id);
            return std::nullopt;
        });
        if (unknown.empty())
            return walked;
        auto const limit = static_cast<std::uint64_t>(unknown.size()) + LimitOf(more);
        facts.Take(Ask(*store_, WalkAlong(follow), Parameters().With(unknown).With(limit)));
        if (!std::all_of(unknown.begin(), unknown.end(), [&facts](Id const& id) { return facts.IsKnown(id); }))
            store_->ThrowDamaged("The ancestry");
    }
}

std::vector<Ancestry> PostgresArchive::ListAncestry(Id const& after, std::size_t limit) {
    Rows const rows = Ask(*store_, Statement::ListAncestry, Parameters().With(after).With(LimitOf(limit)));
    Facts facts;
    facts.Take(rows);
    std::vector<Ancestry> listed;
    for (int i = 0; i < rows.Count(); ++i)
        if (Id const id = rows.Identifier(i, 0); listed.empty() || !(listed.back().commit == id))
            listed.push_back(*facts.At(id));
    return listed;
}

std::vector<ObjectInfo> PostgresArchive::ListObjects(Id const& after, std::size_t limit) {
    Rows const rows = Ask(*store_, Statement::ListObjects, Parameters().With(after).With(LimitOf(limit)));
    std::vector<ObjectInfo> listed;
    listed.reserve(static_cast<std::size_t>(rows.Count()));
    for (int i = 0; i < rows.Count(); ++i)
        listed.push_back({rows.Identifier(i, 0), ObjectTypeOf(RowOf(rows.Number(i, 1)).type),
                          static_cast<std::uint64_t>(rows.Number(i, 2))});
    return listed;
}

ArchiveStatistics PostgresArchive::GetStatistics() {
    auto const answers = store_->Run([](Connection& connection) {
        RoundTrip trip(connection);
        trip.Add(Statement::CountObjects);
        trip.Add(Statement::CountRows);
        return trip.Run();
    });
    ArchiveStatistics statistics;
    for (int i = 0; i < answers[0].Count(); ++i) {
        Row const row = RowOf(answers[0].Number(i, 0));
        auto const count = static_cast<std::uint64_t>(answers[0].Number(i, 1));
        auto const bytes = static_cast<std::uint64_t>(answers[0].Number(i, 2));
        statistics.bytes += bytes;
        if (row.isRemoved)
            statistics.unusedBytes += bytes;
        else if (row.type == StoredType::Blob || row.type == StoredType::LargeBlob)
            statistics.blobs += count;
        else if (row.type == StoredType::Tree)
            statistics.trees = count;
        else if (row.type == StoredType::Commit)
            statistics.commits = count;
    }
    auto const number = [&answers](int column) { return static_cast<std::uint64_t>(answers[1].Number(0, column)); };
    statistics.ancestries = number(0);
    statistics.branches = number(1);
    statistics.records = number(2);
    statistics.marked = number(3);
    return statistics;
}

} // namespace KivArchive
