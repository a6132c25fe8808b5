#include "Changes.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>

namespace KivArchive {

namespace {

/// How much is read in one transaction before it is handed over.
constexpr std::uint64_t windowSize = 4 * largestWholeContent;

struct Wanted {
    Id id;
    ObjectRow row;
};

/// What was found for an identifier; no form if it cannot be read.
struct Found {
    Wanted const* wanted = nullptr;
    Member member;
    Form form;
};

ObjectType TypeOf(StoredType type) noexcept {
    return type == StoredType::Tree     ? ObjectType::Tree
           : type == StoredType::Commit ? ObjectType::Commit
                                        : ObjectType::Blob;
}

/// Those of @p ids that are objects here, in the order in which they are stored.
std::vector<Wanted> Locate(Database& database, std::span<const Id> ids, std::vector<Id>* missing) {
    std::vector<Wanted> wanted;
    for (Id const& id : ids) {
        auto const row = FindRow(database, id);
        if (row && row->type != StoredType::Piece)
            wanted.push_back({id, *row});
        else if (missing != nullptr)
            missing->push_back(id);
    }
    std::stable_sort(wanted.begin(), wanted.end(),
                     [](Wanted const& left, Wanted const& right) { return left.row.place < right.row.place; });
    return wanted;
}

/// Runs @p read. @return whether what it reads is sound
template <class Read>
bool IsSound(Read read) {
    try {
        read();
        return true;
    } catch (Malformed const&) {
        return false;
    } catch (ArchiveError const& error) {
        // One damaged page hides what is on it, not the rest.
        if (error.GetKind() != Failure::Damaged)
            throw;
        return false;
    }
}

Found ReadOne(FormReader& reader, Wanted const& wanted) {
    Found found{&wanted, {}, {}};
    Form form;
    bool const isSound = IsSound([&] {
        found.member = reader.SegmentAt(wanted.row.place.segment)->At(wanted.row.place.member);
        form = wanted.row.type == StoredType::LargeBlob ? Form{std::make_shared<int>(), {}, 0}
                                                        : reader.FormAt(wanted.row.place);
    });
    if (isSound && found.member.type == wanted.row.type)
        found.form = form;
    return found;
}

/// Hands over what is what its identifier says. @return false if it is not
bool HandOver(Found const& found, ObjectReceiver const& receiver) {
    if (found.form.owner == nullptr)
        return false;
    Id const& id = found.wanted->id;
    ObjectType const type = TypeOf(found.member.type);
    if (found.member.type == StoredType::LargeBlob) {
        receiver({id, type, found.member.size, {}});
        return true;
    }
    Bytes expanded;
    ByteView data = found.form.bytes;
    if (found.member.isCompact) {
        if (!IsSound([&] { expanded = ExpandForm(found.member, found.form.bytes); }))
            return false;
        data = expanded;
    }
    if (!(Identify(type, data) == id))
        return false;
    receiver({id, type, data.size(), data});
    return true;
}

} // namespace

std::vector<Id> SqliteArchive::FindMissing(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    std::vector<Id> missing;
    static_cast<void>(Locate(connection->database, ids, &missing));
    transaction.Commit();
    return missing;
}

std::vector<ObjectInfo> DescribeRows(Connection& connection, FormCache& cache, std::span<const Id> ids, bool all) {
    FormReader reader(connection, cache);
    std::vector<ObjectInfo> described;
    described.reserve(ids.size());
    for (Id const& id : ids) {
        auto const row = FindRow(connection.database, id);
        if (!row || row->type == StoredType::Piece)
            continue;
        std::uint64_t size = 0;
        bool const isSound = IsSound([&] { size = reader.SegmentAt(row->place.segment)->At(row->place.member).size; });
        if (isSound || all)
            described.push_back({id, TypeOf(row->type), size});
    }
    return described;
}

std::vector<ObjectInfo> SqliteArchive::Describe(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    Transaction const transaction(connection->database, Transaction::Kind::Read);
    return DescribeRows(*connection, store_->cache, ids, false);
}

ReadOutcome SqliteArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    ReadOutcome outcome;
    SqliteStore::Lease const connection(*store_);
    std::vector<Wanted> wanted;
    bool isLocated = false;
    for (std::size_t next = 0; !isLocated || next < wanted.size();) {
        std::vector<Found> window;
        {
            Transaction transaction(connection->database, Transaction::Kind::Read);
            if (!isLocated)
                wanted = Locate(connection->database, ids, &outcome.missing);
            isLocated = true;
            FormReader reader(*connection, store_->cache);
            for (std::uint64_t size = 0; next < wanted.size() && size < windowSize; ++next) {
                window.push_back(ReadOne(reader, wanted[next]));
                Form const& form = window.back().form;
                bool const isHeldAlready = window.size() > 1 && window[window.size() - 2].form.owner == form.owner;
                size += isHeldAlready ? 0 : form.held;
            }
            transaction.Commit();
        }
        for (Found& found : window) {
            if (!HandOver(found, receiver)) {
                // What has been collected since it was located is not damaged.
                bool const isThere = FindRow(connection->database, found.wanted->id).has_value();
                (isThere ? outcome.damaged : outcome.missing).push_back(found.wanted->id);
            }
            found.form = {};
        }
    }
    return outcome;
}

std::optional<Buffer> SqliteArchive::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    auto const row = FindRow(connection->database, id);
    if (!row || (row->type != StoredType::Blob && row->type != StoredType::LargeBlob))
        return std::nullopt;
    Buffer content;
    std::uint64_t const end = offset > UINT64_MAX - size ? UINT64_MAX : offset + size;
    auto const append = [&](ByteView data, std::uint64_t begin) {
        std::uint64_t const from = std::max(offset, begin);
        std::uint64_t const to = std::min(end, begin + data.size());
        if (from < to)
            content.Append(data.data() + (from - begin), to - from);
    };
    FormReader reader(*connection, store_->cache);
    bool const isSound = IsSound([&] {
        if (row->type == StoredType::Blob) {
            Form const form = reader.FormAt(row->place);
            if (!(Identify(ObjectType::Blob, form.bytes) == id))
                throw Malformed();
            append(form.bytes, 0);
            return;
        }
        std::vector<Id> const pieces = SqliteStore::PiecesOf(reader, *row);
        for (std::uint64_t piece = offset / largestWholeContent;
             piece < pieces.size() && piece * largestWholeContent < end; ++piece) {
            Id const& digest = pieces[static_cast<std::size_t>(piece)];
            auto const place = FindRow(connection->database, digest);
            if (!place)
                throw Malformed();
            Form const form = reader.FormAt(place->place);
            if (!(DigestOfBytes(form.bytes) == digest))
                throw Malformed();
            append(form.bytes, piece * largestWholeContent);
        }
    });
    transaction.Commit();
    if (!isSound)
        store_->ThrowDamaged("A content");
    return content;
}

} // namespace KivArchive
