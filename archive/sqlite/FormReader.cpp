#include "Pieces.h"
#include "sqlite/Lookup.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>

namespace KivArchive {

namespace {

constexpr std::uint64_t maximumHeldSegments = std::uint64_t{8} * 1024 * 1024;
/// The most bytes of segments that a connection keeps for the next call.
constexpr std::uint64_t maximumKeptSegments = std::uint64_t{512} * 1024;
/// A place with this flag, and the check of a segment's form instead of a member, stands for the frame that its members
/// share. The check changes when members are removed.
constexpr std::uint64_t sharedFlag = std::uint64_t{1} << 63U;
/// The most steps from a version to one that is no difference: one for each bit of its generation.
constexpr std::size_t maximumSteps = 64;

} // namespace

std::shared_ptr<const Bytes> FormCache::Find(Place const& place, Trust trust) {
    std::scoped_lock const lock(mutex_);
    auto found = entries_.find({place, Trust::Verified});
    if (found == entries_.end() && trust == Trust::Unverified)
        found = entries_.find({place, trust});
    if (found == entries_.end())
        return nullptr;
    newestFirst_.splice(newestFirst_.begin(), newestFirst_, found->second);
    return found->second->form;
}

void FormCache::Keep(Place const& place, Trust trust, std::shared_ptr<const Bytes> const& form) {
    std::scoped_lock const lock(mutex_);
    Key const key{place, trust};
    if (form->size() > budget_ || entries_.count(key) != 0)
        return;
    newestFirst_.push_front({key, form});
    try {
        entries_.emplace(key, newestFirst_.begin());
    } catch (...) {
        newestFirst_.pop_front();
        throw;
    }
    size_ += form->size();
    while (size_ > budget_) {
        size_ -= newestFirst_.back().form->size();
        entries_.erase(newestFirst_.back().key);
        newestFirst_.pop_back();
    }
}

void FormCache::Clear() noexcept {
    std::scoped_lock const lock(mutex_);
    entries_.clear();
    newestFirst_.clear();
    size_ = 0;
}

std::shared_ptr<const Segment> HeldSegments::Find(std::uint64_t number) const {
    auto const found = segments_.find(number);
    return found == segments_.end() ? nullptr : found->second;
}

void HeldSegments::Hold(std::shared_ptr<const Segment> const& segment) {
    if (size_ + segment->FormSize() > maximumHeldSegments) {
        segments_.clear();
        size_ = 0;
    }
    segments_.emplace(segment->Number(), segment);
    size_ += segment->FormSize();
}

FormReader::FormReader(Connection& connection, FormCache& cache)
    : SegmentReader(connection.compressor, cache), connection_(connection),
      forms_(connection.database, "segments", "form"), version_(connection.database.VersionRead()) {
    if (version_ && version_ == connection.heldVersion)
        std::swap(held_, connection.held);
}

FormReader::~FormReader() {
    if (!version_ || held_.GetSize() > maximumKeptSegments)
        return;
    connection_.held = std::move(held_);
    connection_.heldVersion = version_;
}

Bytes FormReader::Load(std::uint64_t number) {
    auto form = forms_.Read(number);
    if (!form)
        throw Malformed();
    return *std::move(form);
}

std::shared_ptr<const Segment> SegmentReader::SegmentAt(std::uint64_t number, Trust trust) {
    auto segment = held_.Find(number);
    if (segment == nullptr) {
        segment = std::make_shared<const Segment>(number, Load(number), Segment::Verified::Later);
        held_.Hold(segment);
    }
    if (trust == Trust::Verified)
        segment->Verify();
    return segment;
}

Form SegmentReader::SharedForm(Segment const& segment, Member const& member, Trust trust) {
    Place const place{segment.Number(), sharedFlag | segment.Check()};
    std::shared_ptr<const Bytes> shared = cache_.Find(place, trust);
    if (shared == nullptr) {
        shared = std::make_shared<const Bytes>(segment.DecompressShared(compressor_));
        cache_.Keep(place, trust, shared);
    }
    if (member.sharedOffset > shared->size() || member.formSize > shared->size() - member.sharedOffset)
        throw Malformed();
    return {shared,
            ByteView(*shared).subspan(static_cast<std::size_t>(member.sharedOffset),
                                      static_cast<std::size_t>(member.formSize)),
            shared->size()};
}

Form SegmentReader::FormAt(Place place, Trust trust) {
    struct Step {
        std::shared_ptr<const Segment> segment;
        Member const& member;
        Place place;
    };
    // Follows bases to a form that is no difference or is cached, and applies the differences on the way back.
    std::vector<Step> steps;
    Form form;
    while (form.owner == nullptr) {
        auto segment = SegmentAt(place.segment, trust);
        Member const& member = segment->At(place.member);
        if (member.encoding == Encoding::Plain) {
            form = {segment, member.own, segment->FormSize()};
        } else if (member.encoding == Encoding::Shared) {
            form = SharedForm(*segment, member, trust);
        } else if (auto const known = cache_.Find(place, trust)) {
            form = {known, *known, known->size()};
        } else {
            Place const base = segment->BaseOf(member);
            steps.push_back({std::move(segment), member, place});
            place = base;
        }
        if (steps.size() > maximumSteps)
            throw Malformed();
    }
    for (; !steps.empty(); steps.pop_back()) {
        Step const& step = steps.back();
        auto const made = std::make_shared<const Bytes>(
            ApplyDifference(compressor_, form.bytes, step.member.own, static_cast<std::size_t>(step.member.formSize)));
        cache_.Keep(step.place, trust, made);
        form = {made, *made, made->size()};
    }
    return form;
}

ObjectRow RowOf(Database const& database, Query const& query, int firstColumn) {
    std::int64_t const type = query.Number(firstColumn);
    if (type < 0 || type > static_cast<std::int64_t>(StoredType::LargeBlob))
        database.Fail(SQLITE_CORRUPT);
    return {static_cast<StoredType>(type),
            {static_cast<std::uint64_t>(query.Number(firstColumn + 1)),
             static_cast<std::uint64_t>(query.Number(firstColumn + 2))}};
}

std::optional<ObjectRow> FindRow(Database& database, Id const& id) {
    Query query(database, "SELECT type, segment, member FROM objects WHERE id=?");
    if (!query.With(DigestOf(id)).Next())
        return std::nullopt;
    return RowOf(database, query, 0);
}

std::vector<std::optional<ObjectRow>> FindRows(Database& database, std::span<const Id> ids) {
    std::vector<std::optional<ObjectRow>> rows;
    rows.reserve(ids.size());
    if (ids.size() <= worthLookup) {
        for (Id const& id : ids)
            rows.push_back(FindRow(database, id));
        return rows;
    }
    Lookup lookup(database, "SELECT type, segment, member FROM asked(?) LEFT JOIN objects ON objects.id=asked.id");
    for (Id const& id : ids) {
        Query const& row = lookup.At(id);
        rows.push_back(row.IsNull(0) ? std::nullopt : std::optional(RowOf(database, row, 0)));
    }
    return rows;
}

std::vector<Id> SqliteStore::PiecesOf(SegmentReader& reader, ObjectRow const& row) {
    return ReadDigests(reader.FormAt(row.place).bytes);
}

} // namespace KivArchive
