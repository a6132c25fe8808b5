#include "Changes.h"
#include "KivArchive/Upkeep.h"
#include "Pieces.h"
#include "sqlite/RawPages.h"
#include "sqlite/SqliteStore.h"

#include <algorithm>
#include <iterator>
#include <set>

namespace KivArchive {

namespace {

constexpr std::uint64_t changeSize = 4 * largestWholeContent;
constexpr std::uint64_t cacheSize = std::uint64_t{32} * 1024 * 1024;

bool IsDigest(RawValue const& value) noexcept {
    return !value.isNumber && value.bytes.size() == std::tuple_size_v<Id::Digest>;
}

bool IsDigestOrNull(RawValue const& value) noexcept {
    return IsDigest(value) || (!value.isNumber && value.bytes.empty());
}

Id IdOf(RawValue const& value) {
    if (value.bytes.empty())
        return {};
    Id::Digest digest{};
    std::copy(value.bytes.begin(), value.bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
    return Id::FromDigest(digest);
}

/// Calls @p use for every row of every page, first in the newest state of the file, then in the one without its log.
template <class Use>
void ForAllRows(RawPages const& pages, IProgress* progress, Use use) {
    // Each page belongs to at most one row, in each of the states; the rest is to spare.
    std::uint64_t budget = 4 * pages.Count();
    for (auto const state : {RawPages::State::Newest, RawPages::State::Checkpointed})
        for (std::uint64_t page = 1; page <= pages.Count(); ++page) {
            constexpr std::uint64_t pagesAtOnce = 1024;
            if (page % pagesAtOnce == 0)
                ReportProgress(progress, {"looking through pages", page, pages.Count()}, {});
            if (state == RawPages::State::Newest || pages.IsLogged(page))
                ForEachRow(pages, page, state, budget, use);
        }
}

/// A name, and the head of a branch or the value of a record.
using Pair = std::pair<KivStringT<char16_t>, Buffer>;

/// What the tables other than that of the segments hold.
struct RawTables {
    std::map<Id::Digest, Ancestry> facts;
    /// Rows of two columns. A page does not say whether they are branches or records.
    std::vector<Pair> pairs;
};

/// The segments of a file, wherever they are.
class RawSegments final : public SegmentReader {
public:
    RawSegments(RawPages const& pages, Compressor& compressor, FormCache& cache)
        : SegmentReader(compressor, cache), pages_(pages) {}

    void Add(std::uint64_t number, RawPlace const& place) { places_[number].push_back(place); }

    [[nodiscard]] std::vector<std::uint64_t> Numbers() const {
        std::vector<std::uint64_t> numbers;
        for (auto const& [number, places] : places_)
            numbers.push_back(number);
        return numbers;
    }

private:
    /// The newest form that is as it was stored.
    Bytes Load(std::uint64_t number) override {
        auto const found = places_.find(number);
        if (found == places_.end())
            throw Malformed();
        for (RawPlace const& place : found->second)
            if (auto const row = RowAt(pages_, place); row && row->values.size() == 2) {
                ByteView const form = row->values[1].bytes;
                Bytes copy(form.begin(), form.end());
                if (IsSound([&] { Segment const segment(number, copy); }))
                    return copy;
            }
        throw Malformed();
    }

    RawPages const& pages_;
    std::map<std::uint64_t, std::vector<RawPlace>> places_;
};

/// The pieces of a large content, one after the other.
class PieceStream final : public KivVcs::IStream {
public:
    PieceStream(SegmentReader& reader, std::vector<Place> pieces, std::uint64_t size)
        : reader_(reader), pieces_(std::move(pieces)), size_(size) {}

    bool Read(void* destination, std::uint64_t size) override {
        auto* to = static_cast<std::byte*>(destination);
        while (size > 0) {
            if (inPiece_ == piece_.size() && !Next())
                return false;
            std::size_t const part = std::min<std::size_t>(static_cast<std::size_t>(size), piece_.size() - inPiece_);
            std::copy_n(piece_.begin() + static_cast<std::ptrdiff_t>(inPiece_), part, to);
            to += part;
            inPiece_ += part;
            position_ += part;
            size -= part;
        }
        return true;
    }
    bool Write(const void* /*source*/, std::uint64_t /*size*/) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return size_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    bool Next() {
        if (next_ == pieces_.size())
            return false;
        Form const form = reader_.FormAt(pieces_[next_++]);
        piece_.assign(form.bytes.begin(), form.bytes.end());
        inPiece_ = 0;
        return true;
    }

    SegmentReader& reader_;
    std::vector<Place> pieces_;
    std::uint64_t size_;
    std::uint64_t position_ = 0;
    std::size_t next_ = 0;
    std::size_t inPiece_ = 0;
    Bytes piece_;
};

class Salvaging {
public:
    Salvaging(std::string const& path, IArchive& to, IProgress* progress)
        : to_(to), progress_(progress), pages_(path), cache_(cacheSize), segments_(pages_, compressor_, cache_) {}

    SalvageReport Run() {
        ForAllRows(pages_, progress_, [this](RawPlace const& place, RawRow const& row) { TakeRow(place, row); });
        auto const numbers = segments_.Numbers();
        for (std::size_t i = 0; i < numbers.size(); ++i) {
            ReportProgress(progress_, {"salvaging objects", i, numbers.size()}, {});
            SalvageSegment(numbers[i]);
        }
        Flush();
        FindLastCommits();
        SalvageFacts();
        SalvageTables();
        return std::move(report_);
    }

private:
    void TakeRow(RawPlace const& place, RawRow const& row) {
        auto const& values = row.values;
        if (row.isOfTable) {
            // The row's number is the value of the first column, which is stored empty.
            if (row.number > 0 && values.size() == 2 && !values[1].isNumber)
                segments_.Add(static_cast<std::uint64_t>(row.number), place);
            return;
        }
        if (IsPair(row))
            tables_.pairs.push_back(PairOf(row));
        if (values.size() != 3 || !IsDigest(values[0]) || !IsDigestOrNull(values[2]))
            return;
        Ancestry& facts = tables_.facts[DigestOf(IdOf(values[0]))];
        facts.commit = IdOf(values[0]);
        if (values[1].isNumber && values[1].number <= static_cast<std::int64_t>(Containment::FoundEqual)) {
            if (IsDigest(values[2]))
                AddContained(facts.contains, {{static_cast<Containment>(values[1].number), IdOf(values[2])}});
        } else if (IsDigestOrNull(values[1])) {
            facts.parent = IdOf(values[1]);
            facts.tree = IdOf(values[2]);
        }
    }

    /// Segments, and objects in them, are in the order in which they were stored: each after those that it names.
    void SalvageSegment(std::uint64_t number) {
        std::shared_ptr<const Segment> segment;
        if (!IsSound([&] { segment = segments_.SegmentAt(number); })) {
            ++report_.damagedSegments;
            return;
        }
        for (std::size_t i = 0; i < segment->Members().size(); ++i) {
            Member const& member = segment->Members()[i];
            if (member.encoding != Encoding::Removed && !IsSound([&] { SalvageMember(*segment, {number, i}); }))
                ++report_.lostObjects;
        }
    }

    void SalvageMember(Segment const& segment, Place const& place) {
        Member const& member = segment.At(place.member);
        Form const form = segments_.FormAt(place);
        if (member.type == StoredType::Piece) {
            pieces_[DigestOf(DigestOfBytes(form.bytes))] = place;
            return;
        }
        if (member.type == StoredType::LargeBlob)
            return SalvageContent(member, ReadDigests(form.bytes));
        ObjectType const type = TypeOf(member.type);
        Bytes const data = ExpandForm(member, form.bytes);
        NewObject object{Identify(type, data), type, {}, {}};
        object.data.Append(data.data(), data.size());
        // The base is an earlier version, though not always the last one before it.
        if (member.encoding == Encoding::Difference)
            if (auto const base = ids_.find(segment.BaseOf(member)); base != ids_.end())
                object.earlier = Id::FromDigest(base->second);
        if (type == ObjectType::Commit)
            SalvageFactsOf(object.id, data, place);
        ids_.emplace(place, DigestOf(object.id));
        size_ += data.size();
        change_.objects.push_back(std::move(object));
        if (size_ > changeSize)
            Flush();
    }

    void SalvageContent(Member const& member, std::vector<Id> const& digests) {
        std::vector<Place> places;
        for (Id const& digest : digests) {
            auto const piece = pieces_.find(DigestOf(digest));
            if (piece == pieces_.end())
                throw Malformed();
            places.push_back(piece->second);
        }
        KivVcs::SHADigest256 digest = BeginPackedForm(ObjectType::Blob, member.size);
        for (Place const& place : places) {
            Form const form = segments_.FormAt(place);
            digest.InitData(form.bytes.data(), form.bytes.size());
        }
        Id::Digest bytes{};
        digest.FinalDigest(bytes.data());
        StreamIO content(KivVcs::Stream(std::make_unique<PieceStream>(segments_, places, member.size)));
        if (!to_.StoreContent(Id::FromDigest(bytes), content, {}, progress_))
            throw Malformed();
        ++report_.objects;
    }

    /// Takes a commit's parent and tree from its data.
    void SalvageFactsOf(Id const& id, ByteView data, Place const& place) {
        std::vector<Link> links;
        if (!ReadLinks(ObjectType::Commit, data, links))
            return;
        Ancestry& facts = tables_.facts[DigestOf(id)];
        facts.commit = id;
        facts.parent = {};
        facts.tree = {};
        for (Link const& link : links)
            (link.type == ObjectType::Tree ? facts.tree : facts.parent) = link.id;
        commits_[DigestOf(id)] = place;
    }

    void Flush() {
        report_.objects += change_.objects.size();
        to_.Apply(change_);
        change_ = {};
        size_ = 0;
    }

    void FindLastCommits() {
        std::set<Id::Digest> named;
        for (auto const& [digest, facts] : tables_.facts) {
            if (!facts.parent.IsEmpty())
                named.insert(DigestOf(facts.parent));
            for (ContainedCommit const& contained : facts.contains)
                named.insert(DigestOf(contained.id));
        }
        for (auto const& [digest, place] : commits_)
            if (named.count(digest) == 0)
                report_.lastCommits.push_back(Id::FromDigest(digest));
    }

    void SalvageFacts() {
        for (auto& [digest, facts] : tables_.facts) {
            change_.ancestry.push_back(std::move(facts));
            constexpr std::size_t factsAtOnce = 4096;
            if (change_.ancestry.size() == factsAtOnce)
                FlushFacts();
        }
        FlushFacts();
    }

    void FlushFacts() {
        report_.ancestries += change_.ancestry.size();
        to_.Apply(change_);
        change_ = {};
    }

    static bool IsPair(RawRow const& row) noexcept {
        return row.values.size() == 2 && !row.values[0].isNumber && !row.values[1].isNumber;
    }

    static Pair PairOf(RawRow const& row) {
        Buffer value;
        value.Append(row.values[1].bytes.data(), row.values[1].bytes.size());
        return {NameOfBytes(row.values[0].bytes), std::move(value)};
    }

    /// Takes the tables as they are if they can be read to their ends, and otherwise what pages show.
    void SalvageTables() {
        auto const pairsOf = [this](std::string_view table) -> std::optional<std::vector<Pair>> {
            auto const rows = RowsOfTable(pages_, table);
            if (!rows || !std::all_of(rows->begin(), rows->end(), IsPair))
                return std::nullopt;
            std::vector<Pair> pairs;
            std::transform(rows->begin(), rows->end(), std::back_inserter(pairs), PairOf);
            return pairs;
        };
        std::vector<Pair> maybeRecords;
        auto const guessed = GuessHeads(maybeRecords);
        if (auto const branches = pairsOf("branches"))
            for (auto const& [name, head] : *branches)
                MakeBranch({name, HeadOf(head).value_or(Id())});
        else
            for (auto const& [name, head] : guessed)
                MakeBranch({name, head});
        for (auto const& [name, value] : pairsOf("records").value_or(maybeRecords))
            SetRecord({name, value});
    }

    /// The value as a head; nothing if it cannot be one.
    static std::optional<Id> HeadOf(Buffer const& value) {
        Buffer const joined = Joined(value);
        RawValue const raw{false, 0, BytesOf(joined)};
        return IsDigest(raw) ? std::optional(IdOf(raw)) : std::nullopt;
    }

    /// Takes for branches what names a commit; of several rows with one name, that of the commit stored last.
    /// @param others receives all other rows
    std::map<KivStringT<char16_t>, Id> GuessHeads(std::vector<Pair>& others) const {
        std::map<KivStringT<char16_t>, std::pair<Place, Id>> latest;
        for (Pair const& pair : tables_.pairs) {
            auto const head = HeadOf(pair.second);
            auto const commit = head ? commits_.find(DigestOf(*head)) : commits_.end();
            if (commit == commits_.end()) {
                others.push_back(pair);
                continue;
            }
            auto& known = latest[pair.first];
            if (known.second.IsEmpty() || known.first < commit->second)
                known = {commit->second, *head};
        }
        std::map<KivStringT<char16_t>, Id> heads;
        for (auto const& [name, known] : latest)
            heads.emplace(name, known.second);
        return heads;
    }

    void MakeBranch(Branch const& branch) {
        Change change;
        change.branches = {{branch.name, {}, branch.head}};
        bool const isThere = !branch.head.IsEmpty() && to_.FindMissing({&branch.head, 1}).empty();
        (isThere && to_.Apply(change).applied ? report_.branches : report_.lostBranches).push_back(branch);
    }

    /// Sets a record unless there is one with that name.
    void SetRecord(Record const& record) {
        Change change;
        change.records.push_back({record, true, std::nullopt});
        report_.records += to_.Apply(change).applied ? 1U : 0U;
    }

    IArchive& to_;
    IProgress* progress_;
    RawPages pages_;
    FormCache cache_;
    Compressor compressor_;
    RawSegments segments_;
    RawTables tables_;
    std::map<Place, Id::Digest> ids_;
    std::map<Id::Digest, Place> pieces_;
    std::map<Id::Digest, Place> commits_;
    Change change_;
    std::uint64_t size_ = 0;
    SalvageReport report_;
};

} // namespace

SalvageReport Salvage(std::string const& path, IArchive& to, IProgress* progress) {
    return Salvaging(path, to, progress).Run();
}

} // namespace KivArchive
