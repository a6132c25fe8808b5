#include "KivArchive/MemArchive.h"

#include "AncestryWalk.h"

#include <algorithm>
#include <map>
#include <mutex>

namespace KivArchive {

namespace {

struct StoredObject {
    ObjectType type = ObjectType::Blob;
    Buffer data;
};

using Digest = Id::Digest;

/// What @p make returns for each of up to @p limit entries after @p after.
template <class Table, class Make>
auto List(Table const& table, Id const& after, std::size_t limit, Make make) {
    std::vector<decltype(make(*table.begin()))> listed;
    auto entry = after.IsEmpty() ? table.begin() : table.upper_bound(DigestOf(after));
    for (; entry != table.end() && listed.size() < limit; ++entry)
        listed.push_back(make(*entry));
    return listed;
}

} // namespace

struct MemArchive::State {
    mutable std::mutex mutex;
    Clock clock;
    std::map<Digest, StoredObject> objects;
    std::map<Digest, std::chrono::seconds> marks;
    std::map<Digest, Ancestry> ancestry;
    std::map<KivStringT<char16_t>, Id> branches;
    std::map<KivStringT<char16_t>, Buffer> records;

    [[nodiscard]] Id HeadOf(KivStringT<char16_t> const& branch) const {
        auto const found = branches.find(branch);
        return found == branches.end() ? Id() : found->second;
    }
    [[nodiscard]] std::optional<Buffer> ValueOf(KivStringT<char16_t> const& record) const {
        auto const found = records.find(record);
        return found == records.end() ? std::nullopt : std::optional(found->second);
    }
    [[nodiscard]] bool IsMarkedSince(Id const& id, std::chrono::seconds grace) const {
        auto const mark = marks.find(DigestOf(id));
        return mark != marks.end() && mark->second + grace <= clock();
    }

    [[nodiscard]] ChangeOutcome Compare(Change const& change) const {
        ChangeOutcome outcome;
        for (BranchMove const& move : change.branches)
            if (Id head = HeadOf(move.name); !(head == move.expected))
                outcome.movedBranches.push_back({move.name, std::move(head)});
        for (RecordChange const& record : change.records)
            if (auto value = ValueOf(record.record.name); record.compared && !SameValue(value, record.expected))
                outcome.changedRecords.push_back({record.record.name, std::move(value)});
        outcome.applied = outcome.movedBranches.empty() && outcome.changedRecords.empty();
        return outcome;
    }

    void CheckPresence(Change const& change, std::map<Digest, StoredObject> const& added) const {
        auto const check = [&](Id const& id) {
            if (objects.count(DigestOf(id)) == 0 && added.count(DigestOf(id)) == 0)
                ThrowCollected(id, {});
        };
        for (Id const& id : change.relied)
            check(id);
        for (BranchMove const& move : change.branches)
            if (!move.head.IsEmpty())
                check(move.head);
    }

    [[nodiscard]] std::map<Digest, Ancestry> CompleteAncestry(Change const& change) const {
        std::map<Digest, Ancestry> complete;
        for (Ancestry const& facts : change.ancestry) {
            Digest const& digest = DigestOf(facts.commit);
            auto const known = ancestry.find(digest);
            auto const entry = complete.try_emplace(digest, known == ancestry.end() ? facts : known->second).first;
            AddContained(entry->second.contains, facts.contains);
        }
        return complete;
    }

    void Unmark(Change const& change) noexcept {
        for (NewObject const& object : change.objects)
            marks.erase(*object.id.GetDigest());
        for (Id const& id : change.relied)
            marks.erase(*id.GetDigest());
        for (BranchMove const& move : change.branches)
            if (!move.head.IsEmpty())
                marks.erase(*move.head.GetDigest());
    }
};

MemArchive::MemArchive(Clock clock) : state_(std::make_unique<State>()) {
    if (!clock)
        clock = [] {
            return std::chrono::duration_cast<std::chrono::seconds>(
                std::chrono::steady_clock::now().time_since_epoch());
        };
    state_->clock = std::move(clock);
}

MemArchive::~MemArchive() = default;

std::vector<Id> MemArchive::FindMissing(std::span<const Id> ids) {
    std::scoped_lock const lock(state_->mutex);
    std::vector<Id> missing;
    std::copy_if(ids.begin(), ids.end(), std::back_inserter(missing),
                 [this](Id const& id) { return state_->objects.count(DigestOf(id)) == 0; });
    return missing;
}

std::vector<ObjectInfo> MemArchive::Describe(std::span<const Id> ids) {
    std::scoped_lock const lock(state_->mutex);
    std::vector<ObjectInfo> described;
    for (Id const& id : ids)
        if (auto const found = state_->objects.find(DigestOf(id)); found != state_->objects.end())
            described.push_back({id, found->second.type, found->second.data.GetSize()});
    return described;
}

ReadOutcome MemArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    ReadOutcome outcome;
    std::vector<std::pair<Id, StoredObject>> found;
    {
        std::scoped_lock const lock(state_->mutex);
        for (Id const& id : ids)
            if (auto const object = state_->objects.find(DigestOf(id)); object != state_->objects.end())
                found.emplace_back(id, object->second);
            else
                outcome.missing.push_back(id);
    }
    for (auto const& [id, object] : found) {
        std::uint64_t const size = object.data.GetSize();
        bool const isLarge = object.type == ObjectType::Blob && size > largestWholeContent;
        auto const data = isLarge ? std::span<const std::byte>() : BytesOf(object.data);
        if (!isLarge && !(Identify(object.type, data) == id))
            outcome.damaged.push_back(id);
        else
            receiver({id, object.type, size, data});
    }
    return outcome;
}

std::optional<Buffer> MemArchive::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    std::scoped_lock const lock(state_->mutex);
    auto const found = state_->objects.find(DigestOf(id));
    if (found == state_->objects.end() || found->second.type != ObjectType::Blob)
        return std::nullopt;
    Buffer content;
    content.Append(found->second.data, offset, size);
    return content;
}

bool MemArchive::StoreContent(Id const& id, StreamIO& content, Id const& /*earlier*/, IProgress* progress) {
    Digest const digest = DigestOf(id);
    std::map<Digest, StoredObject> added;
    Buffer& data = added[digest].data;
    std::uint64_t const size = content.GetSize();
    ReportProgress(progress, {"storing a content", 0, size}, {});
    if (!content.ReadRest(data) || !(Identify(ObjectType::Blob, data) == id))
        return false;
    data = Joined(data);
    ReportProgress(progress, {"storing a content", size, size}, {});
    std::scoped_lock const lock(state_->mutex);
    state_->objects.merge(added);
    state_->marks.erase(digest);
    return true;
}

ChangeOutcome MemArchive::Apply(Change const& change) {
    CheckChange(change, {});
    std::map<Digest, StoredObject> added;
    for (NewObject const& object : change.objects)
        added.try_emplace(DigestOf(object.id), StoredObject{object.type, Joined(object.data)});

    std::scoped_lock const lock(state_->mutex);
    ChangeOutcome outcome = state_->Compare(change);
    if (!outcome.applied)
        return outcome;
    state_->CheckPresence(change, added);
    std::map<Digest, Ancestry> ancestry = state_->CompleteAncestry(change);
    std::map<KivStringT<char16_t>, Id> branches;
    for (BranchMove const& move : change.branches)
        if (!move.head.IsEmpty())
            branches.insert_or_assign(move.name, move.head);
    std::map<KivStringT<char16_t>, Buffer> records;
    for (auto const& [record, compared, expected] : change.records)
        if (record.value)
            records.insert_or_assign(record.name, *record.value);

    // Nothing fails from here on: the entries made above are moved in.
    state_->objects.merge(added);
    for (auto const& [digest, facts] : ancestry)
        state_->ancestry.erase(digest);
    state_->ancestry.merge(ancestry);
    for (BranchMove const& move : change.branches)
        state_->branches.erase(move.name);
    state_->branches.merge(branches);
    for (RecordChange const& record : change.records)
        state_->records.erase(record.record.name);
    state_->records.merge(records);
    state_->Unmark(change);
    return outcome;
}

std::vector<Branch> MemArchive::ReadBranches() {
    std::scoped_lock const lock(state_->mutex);
    std::vector<Branch> branches;
    for (auto const& [name, head] : state_->branches)
        branches.push_back({name, head});
    return branches;
}

std::vector<Record> MemArchive::ReadRecords(std::span<const KivStringT<char16_t>> names) {
    std::scoped_lock const lock(state_->mutex);
    std::map<KivStringT<char16_t>, Buffer> found;
    for (auto const& name : names)
        if (auto const record = state_->records.find(name); record != state_->records.end())
            found.insert(*record);
    std::vector<Record> records;
    records.reserve(found.size());
    for (auto const& [name, value] : found)
        records.push_back({name, value});
    return records;
}

std::vector<KivStringT<char16_t>> MemArchive::ListRecords() {
    std::scoped_lock const lock(state_->mutex);
    std::vector<KivStringT<char16_t>> names;
    for (auto const& [name, value] : state_->records)
        names.push_back(name);
    return names;
}

std::vector<Ancestry> MemArchive::ReadAncestry(std::span<const Id> commits, Follow follow, std::size_t more) {
    std::scoped_lock const lock(state_->mutex);
    return WalkAncestry(commits, follow, more, [this](Id const& id) -> Ancestry const* {
        auto const found = state_->ancestry.find(DigestOf(id));
        return found == state_->ancestry.end() ? nullptr : &found->second;
    });
}

std::vector<Ancestry> MemArchive::ListAncestry(Id const& after, std::size_t limit) {
    std::scoped_lock const lock(state_->mutex);
    return List(state_->ancestry, after, limit, [](auto const& entry) { return entry.second; });
}

std::vector<ObjectInfo> MemArchive::ListObjects(Id const& after, std::size_t limit) {
    std::scoped_lock const lock(state_->mutex);
    return List(state_->objects, after, limit, [](auto const& entry) {
        return ObjectInfo{Id::FromDigest(entry.first), entry.second.type, entry.second.data.GetSize()};
    });
}

void MemArchive::Mark(std::span<const Id> ids) {
    std::scoped_lock const lock(state_->mutex);
    for (Id const& id : ids)
        if (state_->objects.count(DigestOf(id)) != 0)
            state_->marks.try_emplace(DigestOf(id), state_->clock());
}

void MemArchive::Unmark(std::span<const Id> ids) {
    std::scoped_lock const lock(state_->mutex);
    for (Id const& id : ids)
        state_->marks.erase(DigestOf(id));
}

std::vector<Id> MemArchive::ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) {
    std::scoped_lock const lock(state_->mutex);
    std::vector<Id> marked;
    auto mark = after.IsEmpty() ? state_->marks.begin() : state_->marks.upper_bound(DigestOf(after));
    for (; mark != state_->marks.end() && marked.size() < limit; ++mark)
        if (mark->second + grace <= state_->clock())
            marked.push_back(Id::FromDigest(mark->first));
    return marked;
}

std::vector<Id> MemArchive::Remove(std::span<const Id> ids, std::chrono::seconds grace) {
    std::scoped_lock const lock(state_->mutex);
    std::vector<Id> kept;
    std::copy_if(ids.begin(), ids.end(), std::back_inserter(kept),
                 [&](Id const& id) { return !state_->IsMarkedSince(id, grace); });
    if (!kept.empty())
        return kept;
    for (Id const& id : ids) {
        state_->objects.erase(DigestOf(id));
        state_->marks.erase(DigestOf(id));
    }
    return kept;
}

std::uint64_t MemArchive::Compact(std::uint64_t /*bytes*/) {
    return 0;
}

ArchiveStatistics MemArchive::GetStatistics() {
    std::scoped_lock const lock(state_->mutex);
    ArchiveStatistics statistics;
    for (auto const& [digest, object] : state_->objects) {
        ++(object.type == ObjectType::Blob   ? statistics.blobs
           : object.type == ObjectType::Tree ? statistics.trees
                                             : statistics.commits);
        statistics.bytes += object.data.GetSize();
    }
    statistics.ancestries = state_->ancestry.size();
    statistics.branches = state_->branches.size();
    statistics.records = state_->records.size();
    statistics.marked = state_->marks.size();
    return statistics;
}

} // namespace KivArchive
