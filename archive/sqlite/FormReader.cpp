#include "Pieces.h"
#include "sqlite/Lookup.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>

namespace KivArchive {

namespace {

constexpr std::uint64_t maximumHeldSegments = std::uint64_t{8} * 1024 * 1024;
/// The flag under which the cache keeps what the members of a segment share, beside the check of its form: that changes
/// when members are removed.
constexpr std::uint64_t sharedFlag = std::uint64_t{1} << 63U;
/// A version is that many steps from one that is no difference at most, one for each bit of its number.
constexpr std::size_t maximumSteps = 64;

} // namespace

std::shared_ptr<const Bytes> FormCache::Find(Place const& place) {
    std::scoped_lock const lock(mutex_);
    auto const found = entries_.find(place);
    if (found == entries_.end())
        return nullptr;
    newestFirst_.splice(newestFirst_.begin(), newestFirst_, found->second);
    return found->second->form;
}

void FormCache::Keep(Place const& place, std::shared_ptr<const Bytes> const& form) {
    std::scoped_lock const lock(mutex_);
    if (form->size() > budget_ || entries_.count(place) != 0)
        return;
    newestFirst_.push_front({place, form});
    try {
        entries_.emplace(place, newestFirst_.begin());
    } catch (...) {
        newestFirst_.pop_front();
        throw;
    }
    size_ += form->size();
    while (size_ > budget_) {
        size_ -= newestFirst_.back().form->size();
        entries_.erase(newestFirst_.back().place);
        newestFirst_.pop_back();
    }
}

Bytes FormReader::Load(std::uint64_t number) {
    auto form = forms_.Read(number);
    if (!form)
        throw Malformed();
    return *std::move(form);
}

std::shared_ptr<const Segment> SegmentReader::UnverifiedSegmentAt(std::uint64_t number) {
    auto const found = segments_.find(number);
    if (found != segments_.end())
        return found->second;
    auto segment = std::make_shared<const Segment>(number, Load(number), Segment::Verified::Later);
    if (held_ + segment->FormSize() > maximumHeldSegments) {
        segments_.clear();
        held_ = 0;
    }
    segments_.emplace(number, segment);
    held_ += segment->FormSize();
    return segment;
}

std::shared_ptr<const Segment> SegmentReader::SegmentAt(std::uint64_t number) {
    auto segment = UnverifiedSegmentAt(number);
    segment->Verify();
    return segment;
}

Form SegmentReader::SharedForm(Segment const& segment, Member const& member) {
    Place const place{segment.Number(), sharedFlag | segment.Check()};
    std::shared_ptr<const Bytes> shared = cache_.Find(place);
    if (shared == nullptr) {
        shared = std::make_shared<const Bytes>(segment.DecompressShared(compressor_));
        cache_.Keep(place, shared);
    }
    if (member.sharedOffset > shared->size() || member.formSize > shared->size() - member.sharedOffset)
        throw Malformed();
    return {shared,
            ByteView(*shared).subspan(static_cast<std::size_t>(member.sharedOffset),
                                      static_cast<std::size_t>(member.formSize)),
            shared->size()};
}

Form SegmentReader::FormAt(Place place) {
    static_cast<void>(SegmentAt(place.segment));
    return UnverifiedFormAt(place);
}

Form SegmentReader::UnverifiedFormAt(Place place) {
    auto segment = UnverifiedSegmentAt(place.segment);
    Member const& member = segment->At(place.member);
    if (member.encoding == Encoding::Plain)
        return {segment, member.own, segment->FormSize()};
    // What others are made of must be what was stored.
    segment->Verify();
    return member.encoding == Encoding::Shared ? SharedForm(*segment, member) : DifferentForm(place);
}

Form SegmentReader::DifferentForm(Place place) {
    struct Step {
        std::shared_ptr<const Segment> segment;
        Member const& member;
        Place place;
    };
    // Down to a form that is no difference or that is known, and back up.
    std::vector<Step> steps;
    Form form;
    while (form.owner == nullptr) {
        auto segment = SegmentAt(place.segment);
        Member const& member = segment->At(place.member);
        if (member.encoding == Encoding::Plain) {
            form = {segment, member.own, segment->FormSize()};
        } else if (member.encoding == Encoding::Shared) {
            form = SharedForm(*segment, member);
        } else if (auto const known = cache_.Find(place)) {
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
        cache_.Keep(step.place, made);
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
    constexpr std::size_t few = 8;
    std::vector<std::optional<ObjectRow>> rows;
    rows.reserve(ids.size());
    if (ids.size() <= few) {
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
