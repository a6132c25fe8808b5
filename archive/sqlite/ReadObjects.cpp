#include "Changes.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>

namespace KivArchive {

namespace {

/// How many bytes are read in one transaction before they are passed on.
constexpr std::uint64_t windowSize = largestWholeContent / 4;

/// What was found for an identifier. Has no form if it cannot be read.
struct Found {
    Id const* id = nullptr;
    StoredType type = StoredType::Blob;
    bool isCompact = false;
    std::uint64_t size = 0;
    Form form;
};

bool ByPlace(FoundRow const& left, FoundRow const& right) noexcept {
    return left.row.place < right.row.place;
}

/// The rows of those of @p ids that are there, in the order in which their objects are stored.
std::vector<FoundRow> Locate(Database& database, std::span<const Id> ids, std::vector<Id>* missing) {
    std::vector<FoundRow> found;
    found.reserve(ids.size());
    auto const rows = FindRows(database, ids);
    for (std::size_t i = 0; i < ids.size(); ++i) {
        if (rows[i] && rows[i]->type != StoredType::Piece)
            found.push_back({i, *rows[i]});
        else if (missing != nullptr)
            missing->push_back(ids[i]);
    }
    std::stable_sort(found.begin(), found.end(), ByPlace);
    return found;
}

Found ReadOne(FormReader& reader, Id const& id, ObjectRow const& row) {
    Found found{&id, row.type, false, 0, {}};
    Form form;
    bool isOfType = false;
    bool const isSound = IsSound([&] {
        bool const isLarge = row.type == StoredType::LargeBlob;
        // Nobody compares a large content with its identifier here, so that its segment must be verified.
        auto const segment = reader.SegmentAt(row.place.segment, isLarge ? Trust::Verified : Trust::Unverified);
        Member const& member = segment->At(row.place.member);
        isOfType = member.type == row.type;
        found.isCompact = member.isCompact;
        found.size = member.size;
        form = isLarge ? Form{std::make_shared<int>(), {}, 0} : reader.FormAt(row.place, Trust::Unverified);
    });
    if (isSound && isOfType)
        found.form = std::move(form);
    return found;
}

/// Passes an object on if it matches its identifier. @return false if not
bool PassOn(Found const& found, ObjectReceiver const& receiver) {
    if (found.form.owner == nullptr)
        return false;
    ObjectType const type = TypeOf(found.type);
    if (found.type == StoredType::LargeBlob) {
        receiver({*found.id, type, found.size, {}});
        return true;
    }
    Bytes expanded;
    ByteView data = found.form.bytes;
    if (found.isCompact) {
        if (!IsSound([&] { expanded = ExpandForm(found.type, found.form.bytes, found.size); }))
            return false;
        data = expanded;
    }
    if (!(Identify(type, data) == *found.id))
        return false;
    receiver({*found.id, type, data.size(), data});
    return true;
}

} // namespace

ObjectType TypeOf(StoredType type) noexcept {
    return type == StoredType::Tree     ? ObjectType::Tree
           : type == StoredType::Commit ? ObjectType::Commit
                                        : ObjectType::Blob;
}

std::vector<Id> SqliteArchive::FindMissing(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    Transaction transaction(connection->database, Transaction::Kind::Read);
    std::vector<Id> missing;
    static_cast<void>(Locate(connection->database, ids, &missing));
    transaction.Commit();
    return missing;
}

std::vector<std::optional<std::uint64_t>> SizesOf(Connection& connection, FormCache& cache,
                                                  std::vector<FoundRow> rows) {
    std::vector<std::optional<std::uint64_t>> sizes(rows.size());
    for (std::size_t i = 0; i < rows.size(); ++i)
        rows[i].wanted = i;
    std::sort(rows.begin(), rows.end(), ByPlace);
    FormReader reader(connection, cache);
    for (auto const& [number, row] : rows)
        static_cast<void>(IsSound([&, index = number, place = row.place] {
            sizes[index] = reader.SegmentAt(place.segment)->At(place.member).size;
        }));
    return sizes;
}

std::vector<ObjectInfo> SqliteArchive::Describe(std::span<const Id> ids) {
    SqliteStore::Lease const connection(*store_);
    Transaction const transaction(connection->database, Transaction::Kind::Read);
    auto const rows = Locate(connection->database, ids, nullptr);
    auto const sizes = SizesOf(*connection, store_->cache, rows);
    std::vector<ObjectInfo> described;
    described.reserve(rows.size());
    for (std::size_t i = 0; i < rows.size(); ++i)
        if (sizes[i])
            described.push_back({ids[rows[i].wanted], TypeOf(rows[i].row.type), *sizes[i]});
    return described;
}

ReadOutcome SqliteArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    ReadOutcome outcome;
    SqliteStore::Lease const connection(*store_);
    std::vector<FoundRow> rows;
    bool isLocated = false;
    std::vector<Found> window;
    for (std::size_t next = 0; !isLocated || next < rows.size(); window.clear()) {
        {
            Transaction transaction(connection->database, Transaction::Kind::Read);
            if (!isLocated)
                rows = Locate(connection->database, ids, &outcome.missing);
            isLocated = true;
            FormReader reader(*connection, store_->cache);
            for (std::uint64_t size = 0; next < rows.size() && size < windowSize; ++next) {
                window.push_back(ReadOne(reader, ids[rows[next].wanted], rows[next].row));
                Form const& form = window.back().form;
                bool const isHeldAlready = window.size() > 1 && window[window.size() - 2].form.owner == form.owner;
                size += isHeldAlready ? 0 : form.held;
            }
            transaction.Commit();
        }
        for (Found& found : window) {
            if (!PassOn(found, receiver)) {
                store_->cache.Clear();
                // It may have been collected since it was located.
                bool const isThere = FindRow(connection->database, *found.id).has_value();
                (isThere ? outcome.damaged : outcome.missing).push_back(*found.id);
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
            Form const form = reader.FormAt(row->place, Trust::Unverified);
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
            Form const form = reader.FormAt(place->place, Trust::Unverified);
            if (!(DigestOfBytes(form.bytes) == digest))
                throw Malformed();
            append(form.bytes, piece * largestWholeContent);
        }
    });
    transaction.Commit();
    if (!isSound) {
        store_->cache.Clear();
        store_->ThrowDamaged("A content");
    }
    return content;
}

} // namespace KivArchive
