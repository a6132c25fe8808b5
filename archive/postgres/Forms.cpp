#include "postgres/Forms.h"

#include "postgres/Store.h"

namespace KivArchive::Postgres {

namespace {

/// A version is that many steps from one that is no difference at most, three for each digit of its number to the base of 4.
constexpr std::size_t maximumSteps = 96;
constexpr std::uint64_t maximumMade = std::uint64_t{32} * 1024 * 1024;

} // namespace

Row RowOf(std::int64_t type) {
    Row row;
    row.isRemoved = type >= removedTypes;
    std::int64_t const stored = row.isRemoved ? type - removedTypes : type;
    if (stored < 0 || stored > static_cast<std::int64_t>(StoredType::LargeBlob))
        throw Malformed();
    row.type = static_cast<StoredType>(stored);
    return row;
}

ObjectType ObjectTypeOf(StoredType type) noexcept {
    return type == StoredType::Tree     ? ObjectType::Tree
           : type == StoredType::Commit ? ObjectType::Commit
                                        : ObjectType::Blob;
}

void Forms::Read(Connection& connection, std::span<const Id> ids, std::uint64_t most) {
    RoundTrip trip(connection);
    AddTo(trip, ids, most);
    Take(trip.Run().front());
}

void Forms::AddTo(RoundTrip& trip, std::span<const Id> ids, std::uint64_t most) {
    trip.Add(Statement::ReadRows, Parameters().With(ids).With(most));
}

void Forms::Take(Rows const& rows) {
    for (int i = 0; i < rows.Count(); ++i) {
        Row row = RowOf(rows.Number(i, 1));
        row.size = static_cast<std::uint64_t>(rows.Number(i, 2));
        row.base = rows.Identifier(i, 3);
        row.storedSize = static_cast<std::uint64_t>(rows.Number(i, 4));
        if (rows.IsNull(i, 5))
            areWhole_ = false;
        else
            row.stored = rows.Value(i, 5);
        rows_.emplace(rows.Identifier(i, 0), std::move(row));
    }
    answers_.push_back(rows);
}

void Forms::Take(Id const& id, WholeRow const& whole) {
    whole_.Add(id, whole);
}

std::vector<Id> Forms::Ids() const {
    std::vector<Id> ids;
    ids.reserve(rows_.size());
    for (auto const& [id, row] : rows_)
        ids.push_back(id);
    return ids;
}

Row const* Forms::Find(Id const& id) const {
    auto const found = rows_.find(id);
    return found == rows_.end() ? nullptr : &found->second;
}

std::uint64_t Forms::StoredSizeOf(Id const& id) const {
    std::uint64_t size = 0;
    Row const* row = Find(id);
    for (std::size_t steps = 0; row != nullptr && steps <= maximumSteps; ++steps) {
        size += row->storedSize;
        row = row->base.IsEmpty() ? nullptr : Find(row->base);
    }
    return size;
}

std::shared_ptr<const Segment> Forms::StoredAt(Id const& id) {
    auto& stored = stored_[id];
    if (stored == nullptr) {
        Row const* const row = Find(id);
        if (row == nullptr)
            throw Malformed();
        auto const segment = std::make_shared<const Segment>(0, Bytes(row->stored.begin(), row->stored.end()));
        if (segment->Members().size() != 1 || segment->At(0).type != row->type)
            throw Malformed();
        stored = segment;
    }
    return stored;
}

Member const& Forms::MemberOf(Id const& id) {
    return StoredAt(id)->At(0);
}

Version Forms::VersionOf(Id const& id) {
    if (WholeRow const* const whole = whole_.Find(id))
        return whole->version;
    Member const& member = MemberOf(id);
    return {member.type, Find(id)->base, member.generation, member.formSize};
}

Form Forms::FormOf(Id const& id, Compressor& compressor) {
    if (WholeRow const* const whole = whole_.Find(id))
        return whole->form;
    // Down to a form that is no difference or that is known, and back up.
    std::vector<Id> steps;
    Form form;
    for (Id at = id; form.owner == nullptr; at = Find(at)->base) {
        auto const segment = StoredAt(at);
        Member const& member = segment->At(0);
        if (auto const made = made_.find(at); made != made_.end()) {
            form = {made->second, *made->second};
        } else if (member.encoding == Encoding::Plain) {
            form = {segment, member.own};
        } else if (member.encoding == Encoding::Shared) {
            auto const shared = std::make_shared<const Bytes>(segment->DecompressShared(compressor));
            Keep(at, shared);
            form = {shared, *shared};
        } else {
            steps.push_back(at);
        }
        if (steps.size() > maximumSteps)
            throw Malformed();
    }
    for (; !steps.empty(); steps.pop_back()) {
        Member const& member = MemberOf(steps.back());
        auto const made = std::make_shared<const Bytes>(
            ApplyDifference(compressor, form.bytes, member.own, static_cast<std::size_t>(member.formSize)));
        Keep(steps.back(), made);
        form = {made, *made};
    }
    return form;
}

void Forms::Keep(Id const& id, std::shared_ptr<const Bytes> const& form) {
    if (madeSize_ + form->size() > maximumMade) {
        made_.clear();
        madeSize_ = 0;
    }
    made_.emplace(id, form);
    madeSize_ += form->size();
}

} // namespace KivArchive::Postgres
