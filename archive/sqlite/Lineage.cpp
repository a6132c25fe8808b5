#include "sqlite/Lineage.h"

namespace KivArchive {

namespace {

/// Differences between larger forms would take too much memory.
constexpr std::uint64_t largestDifferenced = 16 * largestWholeContent;
/// A difference must be this many times smaller than the form.
constexpr std::size_t worthwhile = 3;
/// Of fewer bytes that differ, compressing saves nothing.
constexpr std::size_t worthCompressing = 48;

/// Goes back from @p place to the version of generation @p wanted, or to the nearest one before it.
void FindStoredBase(Prepared& prepared, Place place, std::uint64_t wanted, FormReader& reader) {
    auto segment = reader.SegmentAt(place.segment);
    Member member = segment->At(place.member);
    while (member.generation > wanted) {
        place = segment->BaseOf(member);
        segment = reader.SegmentAt(place.segment);
        Member const base = segment->At(place.member);
        if (base.generation >= member.generation)
            throw Malformed();
        member = base;
    }
    if (member.type != prepared.item->type || member.formSize > largestDifferenced)
        return;
    prepared.baseForm = reader.FormAt(place);
    prepared.storedBase = place;
}

} // namespace

void FindBase(Prepared& prepared, Prepared const* earlier, FormReader& reader, Database& database) {
    // A damaged version is no base. It is for reading to report it.
    try {
        std::optional<Place> place;
        std::optional<std::pair<Id, Place>> relied;
        if (earlier == nullptr) {
            auto const row = FindRow(database, prepared.item->earlier);
            if (!row)
                return;
            place = row->place;
            relied.emplace(prepared.item->earlier, row->place);
        }
        std::uint64_t const generation =
            1 + (place ? reader.SegmentAt(place->segment)->At(place->member) : earlier->member).generation;
        std::uint64_t const wanted = generation & (generation - 1);
        while (!place && earlier->member.generation > wanted) {
            place = earlier->storedBase;
            relied = earlier->relied;
            earlier = earlier->preparedBase;
        }
        if (place)
            FindStoredBase(prepared, *place, wanted, reader);
        else if (earlier->member.type == prepared.item->type)
            prepared.baseForm = {std::make_shared<int>(), earlier->form, 0};
        prepared.preparedBase = place ? nullptr : earlier;
        prepared.relied = relied;
        prepared.generation = generation;
    } catch (Malformed const&) {
        prepared.baseForm = {};
    }
}

void MakeDifference(Prepared& prepared, Compressor& compressor) {
    bool const isTried = prepared.baseForm.owner != nullptr && prepared.form.size() <= largestDifferenced &&
                         prepared.item->type != StoredType::Commit;
    if (isTried && AppendDifference(compressor, prepared.baseForm.bytes, prepared.form,
                                    prepared.form.size() / worthwhile, worthCompressing, prepared.difference)) {
        prepared.member.encoding = Encoding::Difference;
        prepared.member.generation = prepared.generation;
    } else {
        prepared.preparedBase = nullptr;
        prepared.storedBase.reset();
        prepared.relied.reset();
    }
    prepared.baseForm = {};
}

} // namespace KivArchive
