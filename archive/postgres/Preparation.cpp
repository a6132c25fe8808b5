#include "postgres/Preparation.h"

#include "Changes.h"
#include "Parallel.h"

#include <algorithm>
#include <iterator>
#include <numeric>

namespace KivArchive::Postgres {

namespace {

/// Beyond this, differences take more memory than is good.
constexpr std::uint64_t largestDifferenced = 16 * largestWholeContent;
/// A difference must be this many times smaller than the form.
constexpr std::size_t worthwhile = 3;
/// How much of earlier versions is fetched at once.
constexpr std::uint64_t windowSize = 8 * largestWholeContent;
/// Who changes more at once will hardly go on with the same.
constexpr std::size_t mostRowsKept = 256;
/// Less is made sooner than another thread has begun.
constexpr std::uint64_t worthSharing = std::uint64_t{128} * 1024;
/// Of what is smaller, a difference or compression saves less than a row takes beside its form.
constexpr std::uint64_t worthMakingSmaller = 512;

/// Whether a row has its form as it is, neither compressed nor a difference. A log reads commits so.
bool IsStoredPlain(Item const& item) {
    return item.type == StoredType::Commit || item.data.GetSize() < worthMakingSmaller;
}

/// Whether it may be a difference, or the base of one. Of a content in pieces, `data` only lists these.
bool MayDiffer(Item const& item) {
    return item.type != StoredType::Commit && item.size >= worthMakingSmaller;
}

/// Whether it is stored as a difference, if that makes it much smaller.
bool IsToDiffer(Item const& item) {
    return !item.earlier.IsEmpty() && MayDiffer(item);
}

/// Data may be a part of more memory than it needs.
Form CopyOf(ByteView bytes) {
    auto const copy = std::make_shared<const Bytes>(bytes.begin(), bytes.end());
    return {copy, *copy};
}

void MakeDifference(Prepared& prepared, Compressor& compressor) {
    bool const isTried = prepared.baseForm.owner != nullptr && prepared.form.size() <= largestDifferenced;
    if (isTried && AppendDifference(compressor, prepared.baseForm.bytes, prepared.form,
                                    prepared.form.size() / worthwhile, worthMakingSmaller, prepared.difference)) {
        prepared.member.encoding = Encoding::Difference;
        prepared.member.generation = prepared.generation;
    } else {
        prepared.base = Id();
    }
    prepared.baseForm = {};
}

void MakeStored(Prepared& prepared, Compressor& compressor) {
    bool const isDifference = prepared.member.encoding == Encoding::Difference;
    prepared.stored =
        MakeSegment(prepared.member, isDifference ? ByteView(prepared.difference) : prepared.form, compressor);
}

} // namespace

Preparation::Preparation(std::vector<Item> const& items, Connection& connection, RecentRows& recent, unsigned workers,
                         bool looksForPresent)
    : recent_(recent) {
    Select(items);
    if (std::accumulate(items.begin(), items.end(), std::uint64_t{0},
                        [](std::uint64_t sum, Item const& item) { return sum + item.size; }) < worthSharing)
        workers = 1;
    std::vector<Id> const earlier = EarlierRows();
    bool const hasEarlier = !earlier.empty();
    bool const isEdit =
        std::any_of(items.begin(), items.end(), [](Item const& item) { return !item.earlier.IsEmpty(); });
    areNew_ = isEdit && !looksForPresent && recent_.GiveAll(earlier, forms_);
    if (looksForPresent || (hasEarlier && !areNew_)) {
        forms_ = Forms();
        Ask(connection);
    }
    ForEachInParallel(prepared_.size(), workers, connection.compressor, [this](std::size_t index, Compressor&) {
        Prepared& one = prepared_[index];
        if (IsStoredPlain(*one.item)) {
            MakeForm(one);
            one.member.encoding = Encoding::Plain;
        } else {
            // Compact trees would hardly become smaller by compression or as differences, and take longer to make.
            MakePackedForm(one);
        }
    });
    if (hasEarlier)
        MakeDifferencesToRows(connection, workers);
    for (Prepared& one : prepared_)
        if (EarlierPrepared(one) != nullptr) {
            FindBase(one, connection.compressor);
            MakeDifference(one, connection.compressor);
        }
    ForEachInParallel(prepared_.size(), workers, connection.compressor,
                      [this](std::size_t index, Compressor& own) { MakeStored(prepared_[index], own); });
    numbers_.Clear();
    auto const first = std::partition(prepared_.begin(), prepared_.end(),
                                      [this](Prepared const& one) { return !factsOnly_.contains(one.item->id); });
    std::move(first, prepared_.end(), std::back_inserter(forFacts_));
    prepared_.erase(first, prepared_.end());
    std::sort(prepared_.begin(), prepared_.end(),
              [](Prepared const& left, Prepared const& right) { return IsBefore(left.item->id, right.item->id); });
}

void Preparation::Select(std::vector<Item> const& items) {
    prepared_.reserve(items.size());
    for (Item const& item : items)
        if (numbers_.Add(item.id, prepared_.size()))
            prepared_.emplace_back().item = &item;
}

std::vector<Id> Preparation::EarlierRows() const {
    std::vector<Id> earlier;
    for (Prepared const& one : prepared_)
        if (IsToDiffer(*one.item) && EarlierPrepared(one) == nullptr)
            earlier.push_back(one.item->earlier);
    return earlier;
}

void Preparation::KeepRead(Compressor& compressor) {
    std::vector<Id> const ids = forms_.Ids();
    if (!forms_.AreWhole() || ids.size() > mostRowsKept)
        return;
    for (Id const& id : ids)
        try {
            Version version = forms_.VersionOf(id);
            ByteView const form = forms_.FormOf(id, compressor).bytes;
            recent_.Keep(id, {std::move(version), CopyOf(form)});
        } catch (Malformed const&) {
            // What is damaged is no base.
            continue;
        }
}

void Preparation::KeepStored() const {
    if (!areNew_)
        return;
    for (Id const& id : passed_)
        recent_.Drop(id);
    for (Prepared const& one : prepared_) {
        if (!MayDiffer(*one.item))
            continue;
        recent_.Keep(one.item->id, {VersionOf(one), CopyOf(one.form)});
    }
}

void Preparation::Ask(Connection& connection) {
    std::vector<Id> ids;
    std::vector<Id> earlier;
    for (Prepared const& one : prepared_) {
        ids.push_back(one.item->id);
        if (IsToDiffer(*one.item))
            earlier.push_back(one.item->earlier);
    }
    RoundTrip trip(connection);
    trip.Add(Statement::FindRows, Parameters().With(ids));
    Forms::AddTo(trip, earlier, windowSize);
    auto const answers = trip.Run();
    forms_.Take(answers[1]);
    KeepRead(connection.compressor);
    Rows const& rows = answers[0];
    std::unordered_set<Id> present;
    for (int i = 0; i < rows.Count(); ++i) {
        Id id = rows.Identifier(i, 0);
        Row const row = RowOf(rows.Number(i, 1));
        present_.push_back(id);
        if (HasFactsOnly(row)) {
            factsOnly_.insert(std::move(id));
            continue;
        }
        if (row.isRemoved)
            removed_.push_back(id);
        present.insert(std::move(id));
    }
    std::erase_if(prepared_, [&present](Prepared const& one) { return present.count(one.item->id) != 0; });
    numbers_.Clear();
    for (std::size_t i = 0; i < prepared_.size(); ++i)
        numbers_.Add(prepared_[i].item->id, i);
    areNew_ = true;
}

Prepared const* Preparation::EarlierPrepared(Prepared const& one) const {
    std::size_t const* const found = IsToDiffer(*one.item) ? numbers_.Find(one.item->earlier) : nullptr;
    return found == nullptr || &prepared_[*found] >= &one ? nullptr : &prepared_[*found];
}

Version Preparation::VersionOf(Id const& id) {
    std::size_t const* const found = numbers_.Find(id);
    return found == nullptr ? forms_.VersionOf(id) : VersionOf(prepared_[*found]);
}

Version Preparation::VersionOf(Prepared const& one) {
    return {one.member.type, one.base, one.member.generation, one.member.formSize};
}

void Preparation::FindBase(Prepared& one, Compressor& compressor) {
    // What is damaged, or was too much to be fetched, is no base.
    try {
        Id at = one.item->earlier;
        Version version = VersionOf(at);
        std::uint64_t const generation = 1 + version.generation;
        std::uint64_t const wanted = GenerationOfBase(generation);
        std::vector<Id> passed;
        while (version.generation > wanted) {
            std::uint64_t const after = version.generation;
            if (!numbers_.Contains(at))
                passed.push_back(at);
            at = version.base;
            version = VersionOf(at);
            if (version.generation >= after)
                throw Malformed();
        }
        if (version.type != one.item->type || version.formSize > largestDifferenced)
            return;
        std::size_t const* const prepared = numbers_.Find(at);
        one.baseForm = prepared != nullptr ? Form{std::make_shared<int>(), prepared_[*prepared].form}
                                           : forms_.FormOf(at, compressor);
        if (prepared == nullptr && !passed.empty())
            farBases_.emplace(at, version.base);
        passed_.insert(passed_.end(), passed.begin(), passed.end());
        one.base = std::move(at);
        one.generation = generation;
    } catch (Malformed const&) {
        one.baseForm = {};
    }
}

void Preparation::MakeDifferences(std::span<const std::size_t> window, unsigned workers, Compressor& compressor) {
    for (std::size_t const number : window)
        FindBase(prepared_[number], compressor);
    ForEachInParallel(window.size(), workers, compressor,
                      [&](std::size_t index, Compressor& own) { MakeDifference(prepared_[window[index]], own); });
}

void Preparation::MakeDifferencesToRows(Connection& connection, unsigned workers) {
    std::vector<std::size_t> window;
    if (forms_.AreWhole()) {
        for (std::size_t i = 0; i < prepared_.size(); ++i)
            if (IsToDiffer(*prepared_[i].item) && EarlierPrepared(prepared_[i]) == nullptr)
                window.push_back(i);
        MakeDifferences(window, workers, connection.compressor);
        return;
    }
    Forms const sizes = std::move(forms_);
    std::vector<Id> ids;
    std::uint64_t size = 0;
    auto const close = [&] {
        forms_ = Forms();
        forms_.Read(connection, ids, UINT64_MAX / 2);
        MakeDifferences(window, workers, connection.compressor);
        window.clear();
        ids.clear();
        size = 0;
    };
    for (std::size_t i = 0; i < prepared_.size(); ++i) {
        Id const& earlier = prepared_[i].item->earlier;
        if (!IsToDiffer(*prepared_[i].item) || EarlierPrepared(prepared_[i]) != nullptr ||
            sizes.Find(earlier) == nullptr)
            continue;
        window.push_back(i);
        ids.push_back(earlier);
        size += sizes.StoredSizeOf(earlier);
        if (size >= windowSize)
            close();
    }
    if (!window.empty())
        close();
}

Prepared const* Preparation::Find(Id const& id) const {
    auto const found =
        std::lower_bound(prepared_.begin(), prepared_.end(), id,
                         [](Prepared const& one, Id const& wanted) { return IsBefore(one.item->id, wanted); });
    return found != prepared_.end() && found->item->id == id ? &*found : nullptr;
}

std::vector<Id> Preparation::Bases(std::vector<Id> const& inherited) const {
    // What an earlier version is a difference to stays for as long as that does.
    auto const isInherited = [&](Prepared const& one) {
        Id const* earlier = &one.item->earlier;
        for (std::size_t steps = 0; steps < prepared_.size() && !earlier->IsEmpty(); ++steps) {
            Prepared const* const own = Find(*earlier);
            if (own == nullptr)
                break;
            earlier = &own->item->earlier;
        }
        return !earlier->IsEmpty() && Contains(inherited, *earlier);
    };
    std::vector<Id> bases;
    for (Prepared const& one : prepared_)
        if (!one.base.IsEmpty() && Find(one.base) == nullptr && (inherited.empty() || !isInherited(one)))
            bases.push_back(one.base);
    SortUnique(bases);
    return bases;
}

} // namespace KivArchive::Postgres
