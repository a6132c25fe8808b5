#include "Changes.h"
#include "Parallel.h"
#include "sqlite/Lineage.h"
#include "sqlite/SqliteStore.h"
#include "sqlite/Writer.h"

#include <KivVcs/SHADigest256.h>

namespace KivArchive {

namespace {

/// The most bytes that a segment holds, before it is compressed, unless it holds a single larger form.
constexpr std::uint64_t segmentSize = std::uint64_t{256} * 1024;
/// Up to this many bytes go into one segment instead of one for each type.
constexpr std::uint64_t smallChange = std::uint64_t{64} * 1024;
/// Fewer commits than this in one change are stored uncompressed, so that listing them is fast.
constexpr std::size_t fewCommits = 16;

/// Everything that is made from the items before the transaction that stores them.
class Preparation {
public:
    Preparation(std::vector<Item> const& items, Connection& connection, FormCache& cache, unsigned workers)
        : connection_(connection), workers_(workers) {
        Transaction transaction(connection.database, Transaction::Kind::Read);
        FormReader reader(connection, cache);
        SelectNew(items, reader);
        for (Prepared& one : prepared_)
            if (EarlierPrepared(one) == nullptr && !one.item->earlier.IsEmpty())
                FindBase(one, nullptr, reader, connection.database);
        ForEachInParallel(prepared_.size(), workers, connection.compressor, [this](std::size_t index, Compressor& own) {
            MakeForm(prepared_[index]);
            if (EarlierPrepared(prepared_[index]) == nullptr)
                MakeDifference(prepared_[index], own);
        });
        for (Prepared& one : prepared_)
            if (Prepared const* const earlier = EarlierPrepared(one)) {
                FindBase(one, earlier, reader, connection.database);
                MakeDifference(one, connection.compressor);
            }
        transaction.Commit();
        LayOut();
    }

    [[nodiscard]] std::vector<Prepared> const& Items() const noexcept { return prepared_; }
    [[nodiscard]] std::vector<Id> const& Present() const noexcept { return present_; }
    /// The items that are there, but damaged, and have to be stored anew.
    [[nodiscard]] std::vector<std::pair<Id, Place>> const& Damaged() const noexcept { return damaged_; }

    /// The forms of all segments, in order.
    [[nodiscard]] std::vector<Bytes> MakeSegments() const {
        std::vector<Bytes> forms(layout_.size());
        ForEachInParallel(layout_.size(), workers_, connection_.compressor,
                          [&](std::size_t index, Compressor& compressor) {
                              SegmentBuilder builder;
                              for (std::size_t const item : layout_[index])
                                  AddTo(builder, prepared_[item], index);
                              forms[index] = builder.Make(compressor);
                          });
        return forms;
    }

private:
    void SelectNew(std::vector<Item> const& items, FormReader& reader) {
        prepared_.reserve(items.size());
        for (Item const& item : items) {
            if (numbers_.count(item.id) != 0)
                continue;
            if (auto const row = FindRow(connection_.database, item.id)) {
                if (IsUsable(item, *row, reader)) {
                    present_.push_back(item.id);
                    continue;
                }
                damaged_.emplace_back(item.id, row->place);
            }
            numbers_.emplace(item.id, prepared_.size());
            prepared_.emplace_back().item = &item;
        }
    }

    /// A piece that is there already is checked, since otherwise only reading its content would find it damaged.
    static bool IsUsable(Item const& item, ObjectRow const& row, FormReader& reader) {
        bool isSame = item.type != StoredType::Piece;
        return isSame ||
               (IsSound([&] { isSame = DigestOfBytes(reader.FormAt(row.place).bytes) == item.id; }) && isSame);
    }

    /// The earlier version, if it is among the prepared items, before @p one.
    [[nodiscard]] Prepared const* EarlierPrepared(Prepared const& one) const {
        auto const found = numbers_.find(one.item->earlier);
        if (found == numbers_.end() || &prepared_[found->second] >= &one)
            return nullptr;
        return &prepared_[found->second];
    }

    /// Assigns items to segments, each of one type, in their order. What is left in the end shares one segment if it is
    /// small.
    void LayOut() {
        std::array<std::vector<std::size_t>, 3> open;
        std::array<std::uint64_t, 3> sizes{};
        auto const close = [&](std::size_t kind) {
            if (!open[kind].empty())
                layout_.push_back(std::move(open[kind]));
            open[kind] = {};
            sizes[kind] = 0;
        };
        for (std::size_t i = 0; i < prepared_.size(); ++i) {
            Prepared const& one = prepared_[i];
            std::size_t const kind = one.item->type == StoredType::Tree     ? 1
                                     : one.item->type == StoredType::Commit ? 2
                                                                            : 0;
            std::uint64_t const size =
                one.member.encoding == Encoding::Difference ? one.difference.size() : one.form.size();
            if (sizes[kind] + size > segmentSize)
                close(kind);
            open[kind].push_back(i);
            sizes[kind] += size;
        }
        if (sizes[0] + sizes[1] + sizes[2] <= smallChange) {
            if (open[2].size() < fewCommits)
                for (std::size_t const commit : open[2])
                    prepared_[commit].member.encoding = Encoding::Plain;
            open[0].insert(open[0].end(), open[1].begin(), open[1].end());
            open[0].insert(open[0].end(), open[2].begin(), open[2].end());
            open[1].clear();
            open[2].clear();
        }
        for (std::size_t kind = 0; kind < open.size(); ++kind)
            close(kind);
        for (std::size_t segment = 0; segment < layout_.size(); ++segment)
            for (std::size_t member = 0; member < layout_[segment].size(); ++member)
                prepared_[layout_[segment][member]].place = {segment, member};
    }

    static void AddTo(SegmentBuilder& builder, Prepared const& one, std::size_t segment) {
        Member member = one.member;
        if (one.preparedBase != nullptr)
            member.base = {true, segment - one.preparedBase->place.segment, one.preparedBase->place.member};
        else if (one.storedBase)
            member.base = {false, one.storedBase->segment, one.storedBase->member};
        bool const isDifference = member.encoding == Encoding::Difference;
        builder.Add(member, isDifference ? ByteView(one.difference) : one.form);
    }

    Connection& connection_;
    unsigned workers_;
    std::vector<Prepared> prepared_;
    std::vector<Id> present_;
    std::vector<std::pair<Id, Place>> damaged_;
    std::unordered_map<Id, std::size_t> numbers_;
    std::vector<std::vector<std::size_t>> layout_;
};

/// Writes what was prepared. @return false if it must be prepared anew, since the archive has changed
bool WriteItems(Writer& writer, Preparation const& preparation, std::vector<Bytes> const& forms) {
    for (Id const& id : preparation.Present())
        if (!writer.Use(id))
            return false;
    for (Prepared const& one : preparation.Items())
        if (one.relied && !writer.IsAt(one.relied->first, one.relied->second))
            return false;
    for (auto const& [id, place] : preparation.Damaged()) {
        if (!writer.IsAt(id, place))
            return false;
        writer.RemoveObject(id, place);
    }
    if (forms.empty())
        return true;
    std::uint64_t const first = writer.NextSegment();
    for (std::size_t i = 0; i < forms.size(); ++i)
        writer.AddSegment(first + i, forms[i]);
    for (Prepared const& one : preparation.Items()) {
        std::uint64_t const segment = first + one.place.segment;
        writer.AddObject(one.item->id, one.item->type, {segment, one.place.member});
        if (one.storedBase)
            writer.AddDependency(one.storedBase->segment, segment);
        else if (one.preparedBase != nullptr && one.preparedBase->place.segment != one.place.segment)
            writer.AddDependency(first + one.preparedBase->place.segment, segment);
    }
    return true;
}

} // namespace

ChangeOutcome SqliteStore::Store(std::vector<Item> const& items, Change const& change) {
    Lease const connection(*this);
    for (;;) {
        Preparation const preparation(items, *connection, cache, options.workers);
        std::vector<Bytes> const forms = preparation.MakeSegments();

        std::scoped_lock const turn(writing);
        Transaction transaction(connection->database, Transaction::Kind::Write);
        Writer writer(connection->database);
        ChangeOutcome outcome = writer.Compare(change);
        if (!outcome.applied)
            return outcome;
        if (!WriteItems(writer, preparation, forms))
            continue;
        writer.Write(change);
        transaction.Commit();
        return outcome;
    }
}

ChangeOutcome SqliteArchive::Apply(Change const& change) {
    CheckChange(change, store_->path);
    std::vector<Item> items;
    items.reserve(change.objects.size());
    for (NewObject const& object : change.objects)
        items.push_back({object.id, static_cast<StoredType>(object.type), object.data.GetSize(), Joined(object.data),
                         object.earlier});
    return store_->Store(items, change);
}

} // namespace KivArchive
