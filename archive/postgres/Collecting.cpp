#include "Changes.h"
#include "Pieces.h"
#include "postgres/Forms.h"
#include "postgres/Store.h"

#include <algorithm>
#include <unordered_set>

namespace KivArchive {

using namespace Postgres;

namespace {

/// Pieces that no content names are kept that long, for the content that they may be meant for.
constexpr std::chrono::seconds graceOfPieces{std::chrono::hours{14 * 24}};
/// How long an answer that was lost can be looked up.
constexpr std::chrono::seconds memoryOfAttempts{std::chrono::hours{24}};
constexpr std::size_t pageSize = 4096;

std::int64_t CountOf(std::chrono::seconds time) noexcept {
    return static_cast<std::int64_t>(time.count());
}

std::vector<Id> IdsIn(Rows const& rows) {
    std::vector<Id> ids;
    ids.reserve(static_cast<std::size_t>(rows.Count()));
    for (int i = 0; i < rows.Count(); ++i)
        ids.push_back(rows.Identifier(i, 0));
    return ids;
}

std::unordered_set<Id> SetOf(std::vector<Id> const& ids) {
    return {ids.begin(), ids.end()};
}

void RunInTransaction(Connection& connection, std::vector<std::pair<Statement, Parameters>> const& statements) {
    RoundTrip trip(connection);
    trip.Add(Statement::Begin);
    for (auto const& [statement, parameters] : statements)
        trip.Add(statement, parameters);
    trip.Add(Statement::Commit);
    trip.Run();
}

/// A transaction that removes rows, begun by holding them.
class Removing {
public:
    /// @param token null if it does not matter whether it is done twice
    Removing(Connection& connection, std::span<const Id> ids, std::chrono::seconds grace, Token const* token)
        : connection_(connection) {
        RoundTrip trip(connection);
        trip.Add(Statement::Begin);
        std::size_t const remember =
            token == nullptr ? SIZE_MAX : trip.Add(Statement::RememberAttempt, Parameters().With(ByteView(*token)));
        std::size_t const lock = trip.Add(Statement::LockRows, Parameters().With(ids));
        std::size_t const marked = trip.Add(Statement::FindMarked, Parameters().With(ids).With(CountOf(grace)));
        std::size_t const bases = trip.Add(Statement::FindBases, Parameters().With(ids));
        try {
            auto const answers = trip.Run();
            for (int i = 0; i < answers[lock].Count(); ++i)
                rows_.emplace(answers[lock].Identifier(i, 0), RowOf(answers[lock].Number(i, 1)));
            marked_ = SetOf(IdsIn(answers[marked]));
            bases_ = SetOf(IdsIn(answers[bases]));
        } catch (Refused const& refused) {
            if (!IsRepeated(refused, remember))
                throw;
            isDone_ = true;
        }
    }

    /// Whether an earlier attempt has done it already.
    [[nodiscard]] bool IsDone() const noexcept { return isDone_; }
    [[nodiscard]] bool IsMarked(Id const& id) const { return marked_.count(id) != 0; }
    [[nodiscard]] bool IsBase(Id const& id) const { return bases_.count(id) != 0; }
    /// Null if it is not there.
    [[nodiscard]] Row const* Find(Id const& id) const {
        auto const found = rows_.find(id);
        return found == rows_.end() ? nullptr : &found->second;
    }

    void GiveUp() {
        RoundTrip trip(connection_);
        trip.Add(Statement::Rollback);
        trip.Run();
    }

    /// Removes @p ids but for their facts; what others are differences to stays for them. @param pieces are let go, too
    void Remove(std::vector<Id> const& ids, std::vector<Id> const& pieces) {
        std::vector<Id> kept;
        std::vector<Id> gone;
        for (Id const& id : ids)
            (IsBase(id) ? kept : gone).push_back(id);
        RoundTrip trip(connection_);
        std::vector<Id> soon = kept;
        soon.insert(soon.end(), pieces.begin(), pieces.end());
        if (!kept.empty())
            trip.Add(Statement::KeepAsBases, Parameters().With(kept));
        if (!soon.empty())
            trip.Add(Statement::MarkForNow, Parameters().With(soon));
        if (!gone.empty()) {
            trip.Add(Statement::KeepFacts, Parameters().With(gone));
            trip.Add(Statement::RemoveRows, Parameters().With(gone));
            trip.Add(Statement::DeleteMarks, Parameters().With(gone));
        }
        trip.Add(Statement::Commit);
        trip.Run();
    }

private:
    Connection& connection_;
    bool isDone_ = false;
    std::unordered_map<Id, Row> rows_;
    std::unordered_set<Id> marked_;
    std::unordered_set<Id> bases_;
};

/// The pieces of those of @p ids that are large contents.
std::vector<Id> PiecesOf(Connection& connection, Removing const& removing, std::span<const Id> ids) {
    std::vector<Id> contents;
    for (Id const& id : ids)
        if (Row const* const row = removing.Find(id); row != nullptr && row->type == StoredType::LargeBlob)
            contents.push_back(id);
    std::vector<Id> pieces;
    if (contents.empty())
        return pieces;
    Forms forms;
    forms.Read(connection, contents, UINT64_MAX / 2);
    for (Id const& id : contents)
        try {
            auto const named = ReadDigests(forms.FormOf(id, connection.compressor).bytes);
            pieces.insert(pieces.end(), named.begin(), named.end());
        } catch (Malformed const&) {
            // They go when their time has come, as those that nothing names.
            continue;
        }
    return pieces;
}

/// Removes what is no object and no base any more. @return how many bytes that were
std::uint64_t RemoveUnusedBases(Connection& connection) {
    RoundTrip trip(connection);
    trip.Add(Statement::FindUnusedBases, Parameters().With(std::uint64_t{pageSize}));
    Rows const found = trip.Run().front();
    if (found.Count() == 0)
        return 0;
    std::vector<Id> const ids = IdsIn(found);
    Removing removing(connection, ids, std::chrono::seconds(0), nullptr);
    std::vector<Id> unused;
    for (Id const& id : ids)
        if (Row const* const row = removing.Find(id); row != nullptr && row->isRemoved && !removing.IsBase(id))
            unused.push_back(id);
    removing.Remove(unused, {});
    std::uint64_t bytes = 1;
    for (int i = 0; i < found.Count(); ++i)
        bytes += static_cast<std::uint64_t>(found.Number(i, 1));
    return bytes;
}

/// Calls `take(rows)` for all rows of a statement that gives pages.
template <class Take>
void ForEachPage(Connection& connection, Statement statement, Take take) {
    for (Id after;;) {
        RoundTrip trip(connection);
        trip.Add(statement, Parameters().With(after).With(std::uint64_t{pageSize}));
        Rows const rows = trip.Run().front();
        take(rows);
        if (static_cast<std::size_t>(rows.Count()) < pageSize)
            return;
        after = rows.Identifier(rows.Count() - 1, 0);
    }
}

/// Removes the pieces that no content has named for long enough.
void SweepPieces(Connection& connection) {
    std::unordered_set<Id> inUse;
    ForEachPage(connection, Statement::ReadPieceLists, [&](Rows const& rows) {
        for (int i = 0; i < rows.Count(); ++i) {
            ByteView const stored = rows.Value(i, 1);
            Segment const segment(0, Bytes(stored.begin(), stored.end()));
            Member const& member = segment.At(0);
            Bytes const shared = segment.DecompressShared(connection.compressor);
            for (Id& id : ReadDigests(member.encoding == Encoding::Shared ? ByteView(shared) : member.own))
                inUse.insert(std::move(id));
        }
    });
    std::vector<Id> unused;
    ForEachPage(connection, Statement::ListPieces, [&](Rows const& rows) {
        for (Id& id : IdsIn(rows))
            if (inUse.count(id) == 0)
                unused.push_back(std::move(id));
    });
    if (unused.empty())
        return;
    RunInTransaction(connection, {{Statement::LockRows, Parameters().With(unused)},
                                  {Statement::AddMarks, Parameters().With(unused)}});
    Removing removing(connection, unused, graceOfPieces, nullptr);
    std::erase_if(unused, [&removing](Id const& id) { return !removing.IsMarked(id); });
    removing.Remove(unused, {});
}

} // namespace

void PostgresArchive::Mark(std::span<const Id> ids) {
    if (ids.empty())
        return;
    // Whoever uses some of them is waited for: a mark must not be older than what was committed before it.
    store_->Run([ids](Connection& connection) {
        RunInTransaction(
            connection, {{Statement::LockRows, Parameters().With(ids)}, {Statement::AddMarks, Parameters().With(ids)}});
    });
}

void PostgresArchive::Unmark(std::span<const Id> ids) {
    if (ids.empty())
        return;
    store_->Run([ids](Connection& connection) {
        RoundTrip trip(connection);
        trip.Add(Statement::DeleteMarks, Parameters().With(ids));
        trip.Run();
    });
}

std::vector<Id> PostgresArchive::ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) {
    constexpr std::size_t maximumRows = 1U << 17U;
    return store_->Run([&](Connection& connection) {
        RoundTrip trip(connection);
        trip.Add(Statement::ListMarked, Parameters()
                                            .With(CountOf(grace))
                                            .With(after)
                                            .With(static_cast<std::uint64_t>(std::min(limit, maximumRows))));
        return IdsIn(trip.Run().front());
    });
}

std::vector<Id> PostgresArchive::Remove(std::span<const Id> ids, std::chrono::seconds grace) {
    if (ids.empty())
        return {};
    Token const token = store_->MakeToken();
    return store_->Run([&](Connection& connection) {
        Removing removing(connection, ids, grace, &token);
        std::vector<Id> kept;
        if (removing.IsDone())
            return kept;
        for (Id const& id : ids)
            if (!removing.IsMarked(id))
                kept.push_back(id);
        if (!kept.empty())
            removing.GiveUp();
        else
            removing.Remove({ids.begin(), ids.end()}, PiecesOf(connection, removing, ids));
        return kept;
    });
}

std::uint64_t PostgresArchive::Compact(std::uint64_t /*bytes*/) {
    return store_->Run([](Connection& connection) {
        std::uint64_t const removed = RemoveUnusedBases(connection);
        if (removed == 0) {
            SweepPieces(connection);
            RoundTrip trip(connection);
            trip.Add(Statement::ForgetAttempts, Parameters().With(CountOf(memoryOfAttempts)));
            trip.Run();
        }
        return removed;
    });
}

} // namespace KivArchive
