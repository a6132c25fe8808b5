#pragma once

#include "KivVcs/Id.h"
#include "KivVcs/detail/PublishedWord.h"

#include <cstddef>
#include <cstdint>
#include <unordered_map>
#include <vector>

namespace KivVcs::detail {

/// The objects of one kind that a storage holds, one reference to each, by identifier.
///
/// They are listed in the order in which they came, beside an open table of places in that list: a third of the memory that
/// a table of the standard library takes, and one visit to it where that takes several. Hosts are shown such a table, though.
/// It is made when somebody asks for it, and from the next change on it is what holds the objects. So it is if an object is
/// held under another identifier than its own digest, which hosts' classes may report.
///
/// Threads: the `const` operations may run concurrently; everything else needs exclusive use.
template <class T>
class ObjectTable {
public:
    using Table = std::unordered_map<Id, cow_ptr<T>>;

    ObjectTable() noexcept = default;
    ObjectTable(ObjectTable const& other);
    ObjectTable& operator=(ObjectTable const&) = delete;
    ~ObjectTable();

    [[nodiscard]] std::size_t Size() const noexcept;
    /// The object of that identifier, or null.
    [[nodiscard]] cow_ptr<T> Find(Id const& id) const noexcept;
    /// The table for hosts; valid as long as this one. @throws std::bad_alloc when it is asked for first
    [[nodiscard]] Table const& Show() const;

    /// Holds the object under the identifier that it reports, unless there is one already.
    /// @throws std::bad_alloc and what the object's `GetId` throws; everything is as before then
    void Add(cow_ptr<T> object);

    /// Where the object of a digest is held, or belongs; until the next change.
    struct Place {
        T const* object = nullptr;
        std::size_t slot = 0;
    };
    /// Whether objects are found and held by their digests alone, which is so until hosts are shown the table.
    [[nodiscard]] bool GoesByDigests() const noexcept { return shown_.Get() == nullptr; }
    /// @pre `GoesByDigests()`, here and below
    [[nodiscard]] Place PlaceOf(Id::Digest const& digest) const noexcept;
    /// Holds an object of that digest, which has been identified, where it belongs; that place is free.
    /// @throws std::bad_alloc; everything is as before then
    void AddAt(Place place, cow_ptr<T> object);
    /// Has the processor fetch what `PlaceOf` will look at.
    void Prefetch(Id::Digest const& digest) const noexcept;

    void Remove(Id const& id) noexcept;

    /// How far a walk along all objects has come, on which any of them may be taken out.
    struct Walk {
        std::size_t next = 0;
        typename Table::iterator nextShown{};
    };
    [[nodiscard]] Walk Begin() noexcept;
    /// Goes on to the next object that nobody else holds, and takes it out; null if there is none.
    [[nodiscard]] cow_ptr<T> TakeNextUnused(Walk& walk) noexcept;
    /// Takes out the very object @p object; null if it is not held under the identifier that it reports.
    /// @throws what its `GetId` throws
    [[nodiscard]] cow_ptr<T> TakeOut(T const& object, Walk& walk);

private:
    /// A place in the list, beside the beginning of the digest of what is there.
    struct Slot {
        std::uint32_t tag;
        std::uint32_t number;
    };
    struct Shown {
        Shown() = default;
        Shown(Shown const&) = delete;
        Shown& operator=(Shown const&) = delete;
        ~Shown();

        Table table;
        /// Until the next change the list holds the objects, and the table only names them.
        bool isHolder = false;
    };

    static constexpr std::uint32_t nowhere = 0x7fffffff;

    [[nodiscard]] bool IsTable() const noexcept { return list_.empty() && shown_.Get() != nullptr; }
    void LeaveToTable() noexcept;

    static std::uint32_t TagOf(Id::Digest const& digest) noexcept;
    static std::uint8_t MarkOf(std::uint32_t tag) noexcept { return static_cast<std::uint8_t>(tag | 0x80U); }
    /// In the order of the tags, so that a table that grows is read and written from its beginning to its end.
    static std::size_t HomeOf(std::uint32_t tag, std::size_t slots) noexcept {
        return static_cast<std::size_t>(std::uint64_t{tag} * slots >> 32U);
    }
    [[nodiscard]] std::size_t Behind(std::size_t slot) const noexcept { return slot + 1 == slotCount_ ? 0 : slot + 1; }
    [[nodiscard]] std::uint8_t* Marks() noexcept { return reinterpret_cast<std::uint8_t*>(slots_.data() + slotCount_); }
    [[nodiscard]] const std::uint8_t* Marks() const noexcept {
        return reinterpret_cast<const std::uint8_t*>(slots_.data() + slotCount_);
    }
    [[nodiscard]] bool IsFree(std::size_t slot) const noexcept { return Marks()[slot] == 0; }
    void Fill(std::size_t slot, Slot with) noexcept;
    void AddSlots();
    /// The slot of the object with that digest, or of this very object with it, or the free one where it would be.
    /// @pre there are slots
    [[nodiscard]] std::size_t SlotOf(Id::Digest const& digest) const noexcept;
    [[nodiscard]] std::size_t SlotOf(Id::Digest const& digest, T const* object) const noexcept;
    template <class IsWanted>
    [[nodiscard]] std::size_t FindSlot(std::uint32_t tag, IsWanted isWanted) const noexcept;
    [[nodiscard]] bool MakeRoom();
    [[nodiscard]] cow_ptr<T> TakeOutOf(std::size_t slot) noexcept;

    /// Addresses of objects are even; a place that is free has an odd word, which leads to the next one.
    static std::uintptr_t WordOfFree(std::uint32_t next) noexcept { return (std::uintptr_t{next} << 1U) | 1U; }
    [[nodiscard]] T const* ObjectAt(std::size_t number) const noexcept {
        const std::uintptr_t word = list_[number];
        return (word & 1U) != 0 ? nullptr : reinterpret_cast<T const*>(word);
    }

    std::vector<std::uintptr_t> list_;
    /// The slots, and behind them a mark for each, a byte: 0 if it is free, otherwise one that few tags have. Most lookups are
    /// for objects that are new, and visit nothing else, all of which the processor keeps near.
    std::vector<Slot> slots_;
    std::size_t slotCount_ = 0;
    std::size_t size_ = 0;
    std::uint32_t firstFree_ = nowhere;
    PublishedWord<Shown*> shown_;
};

} // namespace KivVcs::detail
