#include "sqlite/Compaction.h"

#include "Changes.h"

#include <algorithm>
#include <set>

namespace KivArchive {

namespace {

/// How many seconds pieces that no content names are kept, since their content may still be on its way.
constexpr std::int64_t graceOfPieces = std::int64_t{14} * 24 * 3600;

void MakeSparse(Database& database, std::uint64_t segment) {
    Query(database, "INSERT INTO sparse(segment) VALUES(?) ON CONFLICT DO NOTHING").With(segment).Run();
}

/// The identifiers of the members of a segment, found by hashing their forms. Null for those that are removed, for
/// those that cannot be read, which are kept, and for large contents, which the table of objects is searched for.
std::vector<Id> IdentifyMembers(FormReader& reader, Segment const& segment) {
    std::vector<Id> ids(segment.Members().size());
    for (std::size_t i = 0; i < ids.size(); ++i) {
        Member const& member = segment.Members()[i];
        if (member.encoding == Encoding::Removed || member.type == StoredType::LargeBlob)
            continue;
        try {
            Form const form = reader.FormAt({segment.Number(), i});
            ids[i] = member.type == StoredType::Piece ? DigestOfBytes(form.bytes)
                     : member.isCompact
                         ? Identify(TypeOf(member.type), ByteView(ExpandForm(member.type, form.bytes, member.size)))
                         : Identify(TypeOf(member.type), form.bytes);
        } catch (Malformed const&) {
            ids[i] = Id();
        }
    }
    return ids;
}

std::vector<std::uint64_t> DependantsOf(Database& database, std::uint64_t segment) {
    std::vector<std::uint64_t> dependants;
    Query query(database, "SELECT segment FROM dependencies WHERE base=?");
    query.With(segment);
    while (query.Next())
        dependants.push_back(static_cast<std::uint64_t>(query.Number(0)));
    return dependants;
}

/// Which members of a segment have to stay.
class Decision {
public:
    Decision(Connection& connection, FormCache& cache, Segment const& segment, std::vector<Id> const& ids)
        : segment_(segment), stays_(ids.size()) {
        FormReader reader(connection, cache);
        for (std::size_t i = 0; i < ids.size(); ++i)
            stays_[i] = segment.Members()[i].encoding != Encoding::Removed &&
                        (ids[i].IsEmpty() ? segment.Members()[i].type != StoredType::LargeBlob
                                          : IsAt(connection.database, ids[i], {segment.Number(), i}));
        KeepLargeContents(connection.database);
        for (std::uint64_t const dependant : DependantsOf(connection.database, segment.Number()))
            KeepBasesOf(*reader.SegmentAt(dependant));
        // Backwards, since bases come before the differences to them, and are themselves differences to others.
        for (std::size_t i = stays_.size(); i-- > 0;)
            if (stays_[i])
                KeepBaseOf(segment, segment.Members()[i]);
    }

    [[nodiscard]] std::vector<bool> const& Stays() const noexcept { return stays_; }

private:
    static bool IsAt(Database& database, Id const& id, Place const& place) {
        auto const row = FindRow(database, id);
        return row && row->place == place;
    }

    void KeepLargeContents(Database& database) {
        bool const hasSome =
            std::any_of(segment_.Members().begin(), segment_.Members().end(), [](Member const& member) {
                return member.type == StoredType::LargeBlob && member.encoding != Encoding::Removed;
            });
        if (!hasSome)
            return;
        Query query(database, "SELECT member FROM objects WHERE type=4 AND segment=?");
        query.With(segment_.Number());
        while (query.Next())
            if (auto const member = static_cast<std::uint64_t>(query.Number(0)); member < stays_.size())
                stays_[static_cast<std::size_t>(member)] = true;
    }

    void KeepBasesOf(Segment const& dependant) {
        for (Member const& member : dependant.Members())
            KeepBaseOf(dependant, member);
    }

    void KeepBaseOf(Segment const& segment, Member const& member) {
        if (member.encoding != Encoding::Difference)
            return;
        Place const base = segment.BaseOf(member);
        if (base.segment == segment_.Number() && base.member < stays_.size())
            stays_[static_cast<std::size_t>(base.member)] = true;
    }

    Segment const& segment_;
    std::vector<bool> stays_;
};

Bytes FormWithout(Connection& connection, Segment const& segment, std::vector<bool> const& stays) {
    Bytes const shared = segment.DecompressShared(connection.compressor);
    SegmentBuilder builder;
    for (std::size_t i = 0; i < stays.size(); ++i) {
        Member member = segment.Members()[i];
        ByteView const own = member.encoding == Encoding::Shared
                                 ? ByteView(shared).subspan(static_cast<std::size_t>(member.sharedOffset),
                                                            static_cast<std::size_t>(member.formSize))
                                 : member.own;
        if (stays[i]) {
            builder.Add(member, own);
        } else {
            member.encoding = Encoding::Removed;
            builder.Add(member, {});
        }
    }
    return builder.Make(connection.compressor);
}

std::set<std::uint64_t> BasesOf(Segment const& segment, std::vector<bool> const& stays) {
    std::set<std::uint64_t> bases;
    for (std::size_t i = 0; i < stays.size(); ++i)
        if (Member const& member = segment.Members()[i]; stays[i] && member.encoding == Encoding::Difference)
            bases.insert(segment.BaseOf(member).segment);
    bases.erase(segment.Number());
    return bases;
}

/// Writes a segment that has lost members, or removes it if none is left, and notes that the segments to which nothing
/// in it refers any more may be cleared, too.
void WriteCleared(Database& database, Segment const& segment, std::vector<bool> const& stays, Bytes const& form) {
    std::vector<bool> const all(stays.size(), true);
    std::set<std::uint64_t> const bases = BasesOf(segment, stays);
    for (std::uint64_t const base : BasesOf(segment, all))
        if (bases.count(base) == 0) {
            Query(database, "DELETE FROM dependencies WHERE base=? AND segment=?")
                .With(base)
                .With(segment.Number())
                .Run();
            MakeSparse(database, base);
        }
    // The newest segment stays even if it is empty, so that its number is not given to another one.
    bool const isNewest =
        static_cast<std::uint64_t>(database.Ask("SELECT max(number) FROM segments")) == segment.Number();
    if (std::find(stays.begin(), stays.end(), true) == stays.end() && !isNewest)
        Query(database, "DELETE FROM segments WHERE number=?").With(segment.Number()).Run();
    else
        Query(database, "UPDATE segments SET form=? WHERE number=?").With(form).With(segment.Number()).Run();
}

bool LosesSome(Segment const& segment, std::vector<bool> const& stays) {
    for (std::size_t i = 0; i < stays.size(); ++i)
        if (!stays[i] && segment.Members()[i].encoding != Encoding::Removed)
            return true;
    return false;
}

void DoneWith(Database& database, std::uint64_t number) {
    Query(database, "DELETE FROM sparse WHERE segment=?").With(number).Run();
}

/// @return false if the archive has changed meanwhile
bool TryToClear(Connection& connection, SqliteStore& store, Segment const& segment, std::vector<Id> const& ids) {
    Database& database = connection.database;
    std::vector<bool> stays;
    Bytes form;
    {
        Transaction const transaction(database, Transaction::Kind::Read);
        stays = Decision(connection, store.cache, segment, ids).Stays();
        form = FormWithout(connection, segment, stays);
    }
    std::scoped_lock const turn(store.writing);
    Transaction transaction(database, Transaction::Kind::Write);
    if (Decision(connection, store.cache, segment, ids).Stays() != stays ||
        FormReader(connection, store.cache).SegmentAt(segment.Number())->Check() != segment.Check())
        return false;
    if (LosesSome(segment, stays))
        WriteCleared(database, segment, stays, form);
    DoneWith(database, segment.Number());
    transaction.Commit();
    return true;
}

} // namespace

void RemoveObject(Database& database, Id const& id, Place const& place) {
    Query(database, "DELETE FROM objects WHERE id=?").With(id).Run();
    Query(database, "DELETE FROM marks WHERE id=?").With(id).Run();
    MakeSparse(database, place.segment);
}

std::optional<std::uint64_t> FirstSparse(Database& database) {
    Query query(database, "SELECT segment FROM sparse LIMIT 1");
    if (!query.Next())
        return std::nullopt;
    return static_cast<std::uint64_t>(query.Number(0));
}

std::uint64_t ClearSegment(Connection& connection, SqliteStore& store, std::uint64_t number) {
    try {
        for (;;) {
            std::shared_ptr<const Segment> segment;
            std::vector<Id> ids;
            {
                Transaction const transaction(connection.database, Transaction::Kind::Read);
                FormReader reader(connection, store.cache);
                segment = reader.SegmentAt(number);
                ids = IdentifyMembers(reader, *segment);
            }
            if (TryToClear(connection, store, *segment, ids))
                return segment->FormSize();
        }
    } catch (Malformed const&) {
        // A segment that is gone needs no clearing, and a damaged one stays as it is.
        std::scoped_lock const turn(store.writing);
        DoneWith(connection.database, number);
        return 1;
    }
}

void SweepPieces(Connection& connection, SqliteStore& store) {
    Database& database = connection.database;
    std::set<Id::Digest> inUse;
    std::vector<Id> unused;
    try {
        Transaction const transaction(database, Transaction::Kind::Read);
        FormReader reader(connection, store.cache);
        Query contents(database, "SELECT segment, member FROM objects WHERE type=4");
        while (contents.Next()) {
            Place const place{static_cast<std::uint64_t>(contents.Number(0)),
                              static_cast<std::uint64_t>(contents.Number(1))};
            for (Id const& piece : SqliteStore::PiecesOf(reader, {StoredType::LargeBlob, place}))
                inUse.insert(DigestOf(piece));
        }
        Query pieces(database, "SELECT id FROM objects WHERE type=3");
        while (pieces.Next())
            if (Id const id = pieces.Identifier(0); inUse.count(DigestOf(id)) == 0)
                unused.push_back(id);
    } catch (Malformed const&) {
        // The pieces of a damaged content are not known, so that none may be removed.
        return;
    }
    if (unused.empty())
        return;
    std::scoped_lock const turn(store.writing);
    Transaction transaction(database, Transaction::Kind::Write);
    std::int64_t const now = SecondsNow();
    for (Id const& id : unused) {
        Query(database, "INSERT INTO marks(id, time) VALUES(?, ?) ON CONFLICT DO NOTHING").With(id).With(now).Run();
        Query query(database, "SELECT time FROM marks WHERE id=?");
        bool const isOld = query.With(id).Next() && query.Number(0) <= now - graceOfPieces;
        if (auto const row = isOld ? FindRow(database, id) : std::nullopt)
            RemoveObject(database, id, row->place);
    }
    transaction.Commit();
}

} // namespace KivArchive
