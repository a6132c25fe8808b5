#include "caching/NearArchive.h"

#include "Bytes.h"
#include "Changes.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <exception>
#include <map>
#include <set>
#include <string_view>
#include <unordered_set>

namespace KivArchive {

namespace {

/// How many objects are listed or removed at once.
constexpr std::size_t pageSize = 4096;
/// Uses are stored in so many records, by the first digits of the identifiers.
constexpr std::size_t usesRecords = 16;
/// The size is looked at each time that this part of it has been stored.
constexpr std::uint64_t partWatched = 16;

/// Calls @p work. @return false if the near archive fails
template <class Work>
bool Try(Work work) {
    try {
        work();
        return true;
    } catch (ArchiveError const&) {
        // What is not here is read from where it came from.
        return false;
    }
}

/// Uses are noted by the hour, so that most sessions have nothing to note.
std::uint64_t HourNow() {
    auto const now = std::chrono::system_clock::now().time_since_epoch();
    return static_cast<std::uint64_t>(std::chrono::duration_cast<std::chrono::hours>(now).count());
}

KivStringT<char16_t> NameOfUses(std::size_t number) {
    char16_t const name[] = {u'u', u's', u'e', u's', u'/', static_cast<char16_t>(u'a' + number), u'\0'};
    return {name};
}

KivStringT<char16_t> NameOfRecord(KivStringT<char16_t> const& name) {
    static constexpr std::string_view prefix = "record/";
    Bytes bytes;
    Append(bytes, std::as_bytes(std::span(prefix)));
    Append(bytes, BytesOfName(name));
    return NameOfBytes(bytes);
}

constexpr char16_t const* nameOfBranches = u"branches";
/// What a record begins with that the far archive had, or was seen not to have.
constexpr std::byte isThere{1};
constexpr std::byte isMissing{0};

Buffer BufferOf(ByteView bytes) {
    Buffer buffer;
    buffer.Append(bytes.data(), bytes.size());
    return buffer;
}

void AppendDigest(Bytes& bytes, Id::Digest const& digest) {
    Append(bytes, std::as_bytes(std::span(digest)));
}

Id::Digest TakeDigest(ByteReader& reader) {
    Id::Digest digest{};
    ByteView const bytes = reader.Take(digest.size());
    std::copy(bytes.begin(), bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
    return digest;
}

} // namespace

NearArchive::NearArchive(std::shared_ptr<IArchive> archive, std::uint64_t maximumBytes)
    : archive_(std::move(archive)), maximumBytes_(maximumBytes) {}

NearArchive::~NearArchive() {
    try {
        SaveUses();
    } catch (...) {
        // These uses count as older than they are then.
        return;
    }
}

std::size_t NearArchive::HashOfDigest::operator()(Id::Digest const& digest) const noexcept {
    std::size_t hash = 0;
    std::memcpy(&hash, digest.data(), sizeof hash);
    return hash;
}

void NearArchive::Use(std::span<const Id> ids) {
    std::scoped_lock const lock(mutex_);
    for (Id const& id : ids)
        used_[id] = ++useCount_;
}

std::vector<Id> NearArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    std::vector<Id> given;
    given.reserve(ids.size());
    ReadOutcome outcome;
    std::exception_ptr thrown;
    bool const isRead = Try([&] {
        outcome = archive_->Read(ids, [&](ArchivedObject const& object) {
            given.push_back(object.id);
            try {
                receiver(object);
            } catch (...) {
                thrown = std::current_exception();
                throw;
            }
        });
    });
    // What the receiver throws, which may be a failure of another archive, is no failure of this one.
    if (!isRead && thrown)
        std::rethrow_exception(thrown);
    Use(given);
    if (!outcome.damaged.empty())
        Drop(outcome.damaged);
    std::vector<Id> others;
    if (isRead && outcome.missing.empty() && outcome.damaged.empty())
        return others;
    std::unordered_set<Id> met(given.begin(), given.end());
    for (Id const& id : ids)
        if (met.insert(id).second)
            others.push_back(id);
    return others;
}

std::vector<ObjectInfo> NearArchive::Describe(std::span<const Id> ids) {
    std::vector<ObjectInfo> described;
    Try([&] { described = archive_->Describe(ids); });
    return described;
}

std::optional<Buffer> NearArchive::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    std::optional<Buffer> content;
    if (!Try([&] { content = archive_->ReadContent(id, offset, size); }))
        Drop({&id, 1});
    if (content)
        Use({&id, 1});
    return content;
}

void NearArchive::Keep(std::vector<NewObject> objects) {
    std::uint64_t size = 0;
    std::vector<Id> ids;
    ids.reserve(objects.size());
    for (NewObject const& object : objects) {
        size += object.data.GetSize();
        ids.push_back(object.id);
    }
    Use(ids);
    Change change;
    change.objects = std::move(objects);
    if (!change.objects.empty() && Try([&] { archive_->Apply(change); }))
        NoteStored(size);
}

bool NearArchive::KeepContent(Id const& id, StreamIO& content) {
    std::uint64_t const size = content.GetSize();
    bool isStored = false;
    Try([&] { isStored = archive_->StoreContent(id, content, {}, nullptr); });
    if (!isStored)
        return false;
    Use({&id, 1});
    NoteStored(size);
    return true;
}

void NearArchive::Drop(std::span<const Id> ids) {
    Try([&] { RemoveAll(ids); });
}

void NearArchive::RemoveAll(std::span<const Id> ids) {
    std::vector<Id> present(ids.begin(), ids.end());
    auto const missing = archive_->FindMissing(ids);
    std::unordered_set<Id> const absent(missing.begin(), missing.end());
    std::erase_if(present, [&absent](Id const& id) { return absent.count(id) != 0; });
    if (present.empty())
        return;
    archive_->Mark(present);
    archive_->Remove(present, std::chrono::seconds(0));
}

void NearArchive::NoteStored(std::uint64_t bytes) {
    {
        std::scoped_lock const lock(mutex_);
        if (bytes < unwatched_) {
            unwatched_ -= bytes;
            return;
        }
        unwatched_ = maximumBytes_ / partWatched;
    }
    if (std::unique_lock const turn(removing_, std::try_to_lock); turn)
        Try([this] { RemoveOldest(); });
}

std::vector<NearArchive::Candidate> NearArchive::ListByUse() {
    Uses const uses = ReadUses();
    std::uint64_t const now = HourNow();
    std::vector<Candidate> candidates;
    for (Id after;;) {
        auto const page = archive_->ListObjects(after, pageSize);
        std::scoped_lock const lock(mutex_);
        for (ObjectInfo const& info : page) {
            auto const used = used_.find(info.id);
            auto const noted = uses.find(DigestOf(info.id));
            bool const isUsed = used != used_.end();
            std::uint64_t const hour = isUsed ? now : noted == uses.end() ? 0 : noted->second;
            candidates.push_back({hour, isUsed ? used->second : 0, info});
        }
        if (page.size() < pageSize)
            break;
        after = page.back().id;
    }
    std::sort(candidates.begin(), candidates.end(), [](Candidate const& left, Candidate const& right) {
        return std::pair(left.use, left.hour) < std::pair(right.use, right.hour);
    });
    return candidates;
}

void NearArchive::RemoveOldest() {
    ArchiveStatistics const statistics = archive_->GetStatistics();
    std::uint64_t const taken = statistics.bytes - std::min(statistics.bytes, statistics.unusedBytes);
    if (taken <= maximumBytes_)
        return;
    std::vector<Candidate> const candidates = ListByUse();
    std::uint64_t sum = 0;
    for (Candidate const& candidate : candidates)
        sum += candidate.info.size;
    // A quarter more than has to go; sizes are those before compression.
    std::uint64_t const excess = taken - (maximumBytes_ - maximumBytes_ / 4);
    double const share = static_cast<double>(excess) / static_cast<double>(taken);
    auto const wanted = static_cast<std::uint64_t>(share * static_cast<double>(sum));
    std::vector<Id> page;
    Uses kept;
    std::uint64_t removed = 0;
    for (Candidate const& candidate : candidates) {
        if (removed >= wanted) {
            kept.emplace(DigestOf(candidate.info.id), candidate.hour);
            continue;
        }
        removed += candidate.info.size;
        page.push_back(candidate.info.id);
        if (page.size() == pageSize)
            RemoveAll(std::exchange(page, {}));
    }
    RemoveAll(page);
    WriteUses(kept);
    while (archive_->Compact(maximumBytes_ / partWatched) > 0) {
    }
}

NearArchive::Uses NearArchive::ReadUses() {
    std::vector<KivStringT<char16_t>> names;
    for (std::size_t i = 0; i < usesRecords; ++i)
        names.push_back(NameOfUses(i));
    Uses uses;
    for (Record const& record : archive_->ReadRecords(names)) {
        Buffer const value = Joined(*record.value);
        uses.reserve(uses.size() + BytesOf(value).size() / sizeof(Id::Digest));
        try {
            for (ByteReader reader(BytesOf(value)); !reader.Rest().empty();) {
                Id::Digest const digest = TakeDigest(reader);
                uses[digest] = reader.TakeNumber();
            }
        } catch (Malformed const&) {
            continue;
        }
    }
    return uses;
}

void NearArchive::WriteUses(Uses const& uses) {
    std::array<Bytes, usesRecords> values;
    for (auto const& [digest, hour] : uses) {
        Bytes& value = values[digest[0] % usesRecords];
        AppendDigest(value, digest);
        AppendNumber(value, hour);
    }
    Change change;
    for (std::size_t i = 0; i < usesRecords; ++i)
        if (values[i].size() <= largestRecord)
            change.records.push_back({{NameOfUses(i), BufferOf(values[i])}, false, {}});
    archive_->Apply(change);
}

void NearArchive::SaveUses() {
    std::scoped_lock const lock(mutex_);
    if (used_.empty())
        return;
    Uses uses = ReadUses();
    std::uint64_t const now = HourNow();
    bool isNew = false;
    for (auto const& [id, use] : used_) {
        std::uint64_t& hour = uses[DigestOf(id)];
        isNew = isNew || hour != now;
        hour = now;
    }
    if (isNew)
        WriteUses(uses);
}

void NearArchive::KeepRecord(KivStringT<char16_t> const& name, Bytes const& value) {
    Try([&] {
        // Most of the time nothing has changed, and reading must not write.
        auto const kept = archive_->ReadRecords({&name, 1});
        std::optional<Buffer> const wanted(BufferOf(value));
        if (!kept.empty() && SameValue(kept.front().value, wanted))
            return;
        Change change;
        change.records.push_back({{name, wanted}, false, {}});
        archive_->Apply(change);
    });
}

void NearArchive::KeepBranches(std::vector<Branch> const& branches) {
    Bytes bytes;
    for (Branch const& branch : branches) {
        Bytes const name = BytesOfName(branch.name);
        AppendNumber(bytes, name.size());
        Append(bytes, name);
        AppendDigest(bytes, DigestOf(branch.head));
    }
    KeepRecord(nameOfBranches, bytes);
}

std::optional<std::vector<Branch>> NearArchive::ReadBranches() {
    KivStringT<char16_t> const name(nameOfBranches);
    auto const records = archive_->ReadRecords({&name, 1});
    if (records.empty())
        return std::nullopt;
    Buffer const value = Joined(*records.front().value);
    std::vector<Branch> branches;
    try {
        for (ByteReader reader(BytesOf(value)); !reader.Rest().empty();) {
            KivStringT<char16_t> branch = NameOfBytes(reader.Take(reader.TakeNumber()));
            branches.push_back({std::move(branch), Id::FromDigest(TakeDigest(reader))});
        }
    } catch (Malformed const&) {
        return std::nullopt;
    }
    return branches;
}

void NearArchive::KeepRecords(std::span<const KivStringT<char16_t>> names, std::vector<Record> const& records) {
    for (auto const& name : names) {
        auto const found =
            std::find_if(records.begin(), records.end(), [&name](Record const& record) { return record.name == name; });
        Bytes kept{found == records.end() ? isMissing : isThere};
        if (found != records.end())
            Append(kept, BytesOf(Joined(found->value.value_or(Buffer()))));
        KeepRecord(NameOfRecord(name), kept);
    }
}

void NearArchive::KeepChanged(Change const& change) {
    for (RecordChange const& changed : change.records)
        KeepRecords({&changed.record.name, 1},
                    changed.record.value ? std::vector{changed.record} : std::vector<Record>());
    if (change.branches.empty())
        return;
    std::optional<std::vector<Branch>> seen;
    Try([&] { seen = ReadBranches(); });
    if (!seen)
        return;
    std::map<KivStringT<char16_t>, Id> heads;
    for (Branch& branch : *seen)
        heads.emplace(std::move(branch.name), std::move(branch.head));
    for (BranchMove const& move : change.branches) {
        if (move.head.IsEmpty())
            heads.erase(move.name);
        else
            heads[move.name] = move.head;
    }
    std::vector<Branch> branches;
    branches.reserve(heads.size());
    for (auto& [name, head] : heads)
        branches.push_back({name, std::move(head)});
    KeepBranches(branches);
}

std::optional<std::vector<Record>> NearArchive::ReadRecords(std::span<const KivStringT<char16_t>> names) {
    std::vector<Record> records;
    for (std::set<KivStringT<char16_t>> const ordered(names.begin(), names.end()); auto const& name : ordered) {
        auto const nearName = NameOfRecord(name);
        auto const kept = archive_->ReadRecords({&nearName, 1});
        if (kept.empty())
            return std::nullopt;
        Buffer const joined = Joined(*kept.front().value);
        ByteView const value = BytesOf(joined);
        if (value.empty())
            return std::nullopt;
        if (value.front() == isThere)
            records.push_back({name, BufferOf(value.subspan(1))});
    }
    return records;
}

void NearArchive::KeepAncestry(std::vector<Ancestry> const& facts) {
    std::vector<Ancestry const*> unknown;
    {
        std::scoped_lock const lock(mutex_);
        for (Ancestry const& one : facts) {
            auto const known = knownFacts_.find(one.commit);
            if (known == knownFacts_.end() || known->second < one.contains.size())
                unknown.push_back(&one);
        }
    }
    if (unknown.empty())
        return;
    Try([&] {
        Change change;
        std::vector<Id> ids;
        ids.reserve(unknown.size());
        for (Ancestry const* const one : unknown)
            ids.push_back(one->commit);
        std::unordered_map<Id, std::size_t> kept;
        for (Ancestry const& one : archive_->ReadAncestry(ids, Follow::Parents, 0))
            kept.emplace(one.commit, one.contains.size());
        for (Ancestry const* const one : unknown)
            if (auto const found = kept.find(one->commit); found == kept.end() || found->second < one->contains.size())
                change.ancestry.push_back(*one);
        if (!change.ancestry.empty())
            archive_->Apply(change);
        std::scoped_lock const lock(mutex_);
        for (Ancestry const* const one : unknown)
            knownFacts_[one->commit] = one->contains.size();
    });
}

std::optional<std::vector<Ancestry>> NearArchive::ReadAncestry(std::span<const Id> commits, Follow follow,
                                                               std::size_t more) {
    auto facts = archive_->ReadAncestry(commits, follow, more);
    std::unordered_set<Id> known;
    for (Ancestry const& one : facts)
        known.insert(one.commit);
    // The far archive may have facts that are not near. Without them two histories would seem to have nothing in common.
    if (!std::all_of(commits.begin(), commits.end(), [&known](Id const& id) { return known.contains(id); }))
        return std::nullopt;
    return facts;
}

} // namespace KivArchive
