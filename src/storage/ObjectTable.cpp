#include "KivVcs/detail/ObjectTable.h"

#include "KivVcs/Commit.h"
#include "foundation/Prefetch.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <utility>

namespace KivVcs::detail {

template <class T>
ObjectTable<T>::Shown::~Shown() {
    if (isHolder)
        return;
    for (auto& entry : table)
        static_cast<void>(entry.second.detach());
}

template <class T>
ObjectTable<T>::ObjectTable(ObjectTable const& other) {
    if (Shown const* const shown = other.shown_.Get()) {
        auto copy = std::make_unique<Shown>();
        copy->isHolder = true;
        copy->table = shown->table;
        shown_.Set(copy.release());
        return;
    }
    list_ = other.list_;
    slots_ = other.slots_;
    slotCount_ = other.slotCount_;
    size_ = other.size_;
    firstFree_ = other.firstFree_;
    for (std::size_t number = 0; number < list_.size(); ++number)
        static_cast<void>(cow_ptr<T>::share(ObjectAt(number)).detach());
}

template <class T>
ObjectTable<T>::~ObjectTable() {
    LeaveToTable();
    for (std::size_t number = 0; number < list_.size(); ++number)
        static_cast<void>(cow_ptr<T>::attach(ObjectAt(number)));
    static_cast<void>(std::unique_ptr<Shown>(shown_.Take()));
}

template <class T>
std::size_t ObjectTable<T>::Size() const noexcept {
    return IsTable() ? shown_.Get()->table.size() : size_;
}

template <class T>
cow_ptr<T> ObjectTable<T>::Find(Id const& id) const noexcept {
    if (IsTable()) {
        Table const& table = shown_.Get()->table;
        const auto found = table.find(id);
        return found == table.end() ? nullptr : found->second;
    }
    Id::Digest const* const digest = id.GetDigest();
    return digest == nullptr ? nullptr : cow_ptr<T>::share(PlaceOf(*digest).object);
}

template <class T>
typename ObjectTable<T>::Table const& ObjectTable<T>::Show() const {
    Shown* known = shown_.Get();
    if (known != nullptr)
        return known->table;
    auto shown = std::make_unique<Shown>();
    shown->table.reserve(size_);
    for (std::size_t number = 0; number < list_.size(); ++number) {
        T const* const object = ObjectAt(number);
        if (object == nullptr)
            continue;
        // In two steps: where the first fails, there must be no handle yet that would give up the list's reference.
        cow_ptr<T>& named = shown->table.try_emplace(Id::FromDigest(*object->GetKnownDigest())).first->second;
        named = cow_ptr<T>::attach(object);
    }
    return shown_.Replace(known, shown.get()) ? shown.release()->table : known->table;
}

/// Lets the table that has been shown be what holds the objects.
template <class T>
void ObjectTable<T>::LeaveToTable() noexcept {
    Shown* const shown = shown_.Get();
    if (shown == nullptr || shown->isHolder)
        return;
    shown->isHolder = true;
    list_ = {};
    slots_ = {};
    slotCount_ = 0;
}

template <class T>
void ObjectTable<T>::Add(cow_ptr<T> object) {
    Id id = object->GetId();
    Id::Digest const* const own = object->GetKnownDigest();
    if (own == nullptr || id.GetDigest() == nullptr || *own != *id.GetDigest())
        static_cast<void>(Show());
    LeaveToTable();
    if (Shown* const shown = shown_.Get()) {
        shown->table.try_emplace(std::move(id), std::move(object));
        return;
    }
    // NOLINTNEXTLINE(clang-analyzer-core.NonNullParamChecker): without a digest there is a table by now
    if (const Place place = PlaceOf(*own); place.object == nullptr)
        AddAt(place, std::move(object));
}

template <class T>
typename ObjectTable<T>::Place ObjectTable<T>::PlaceOf(Id::Digest const& digest) const noexcept {
    if (slots_.empty())
        return {};
    const std::size_t slot = SlotOf(digest);
    return {IsFree(slot) ? nullptr : ObjectAt(slots_[slot].number), slot};
}

template <class T>
void ObjectTable<T>::AddAt(Place place, cow_ptr<T> object) {
    Id::Digest const& digest = *object->GetKnownDigest();
    if (MakeRoom())
        place.slot = SlotOf(digest);
    const std::uint32_t number = firstFree_;
    firstFree_ = static_cast<std::uint32_t>(list_[number] >> 1U);
    Fill(place.slot, {TagOf(digest), number});
    list_[number] = reinterpret_cast<std::uintptr_t>(object.detach());
    ++size_;
}

template <class T>
void ObjectTable<T>::Prefetch(Id::Digest const& digest) const noexcept {
    if (slots_.empty())
        return;
    const std::size_t home = HomeOf(TagOf(digest), slotCount_);
    KivUtils::Prefetch(&Marks()[home]);
    // Most objects are new, and are added near there.
    KivUtils::PrefetchToWrite(&slots_[home]);
}

template <class T>
void ObjectTable<T>::Remove(Id const& id) noexcept {
    LeaveToTable();
    if (Shown* const shown = shown_.Get()) {
        shown->table.erase(id);
        return;
    }
    Id::Digest const* const digest = id.GetDigest();
    if (digest == nullptr || slots_.empty())
        return;
    if (const std::size_t slot = SlotOf(*digest); !IsFree(slot))
        static_cast<void>(TakeOutOf(slot));
}

template <class T>
typename ObjectTable<T>::Walk ObjectTable<T>::Begin() noexcept {
    LeaveToTable();
    Shown* const shown = shown_.Get();
    return shown == nullptr ? Walk() : Walk{0, shown->table.begin()};
}

template <class T>
cow_ptr<T> ObjectTable<T>::TakeNextUnused(Walk& walk) noexcept {
    if (Shown* const shown = shown_.Get()) {
        while (walk.nextShown != shown->table.end()) {
            const auto entry = walk.nextShown++;
            if (entry->second.use_count() != 1)
                continue;
            cow_ptr<T> object = std::move(entry->second);
            shown->table.erase(entry);
            return object;
        }
        return nullptr;
    }
    while (walk.next < list_.size()) {
        T const* const object = ObjectAt(walk.next++);
        if (object != nullptr && object->reference_count() == 1)
            return TakeOutOf(SlotOf(*object->GetKnownDigest(), object));
    }
    return nullptr;
}

template <class T>
cow_ptr<T> ObjectTable<T>::TakeOut(T const& object, Walk& walk) {
    Shown* const shown = shown_.Get();
    if (shown == nullptr && !object.IsOfHostClass() && object.GetKnownDigest() != nullptr) {
        const std::size_t slot = slots_.empty() ? 0 : SlotOf(*object.GetKnownDigest(), &object);
        return slots_.empty() || IsFree(slot) ? nullptr : TakeOutOf(slot);
    }
    const Id id = object.GetId();
    if (shown != nullptr) {
        const auto entry = shown->table.find(id);
        if (entry == shown->table.end() || entry->second.get() != &object)
            return nullptr;
        if (entry == walk.nextShown)
            ++walk.nextShown;
        cow_ptr<T> taken = std::move(entry->second);
        shown->table.erase(entry);
        return taken;
    }
    Id::Digest const* const digest = id.GetDigest();
    if (digest == nullptr || slots_.empty())
        return nullptr;
    const std::size_t slot = SlotOf(*digest);
    return IsFree(slot) || ObjectAt(slots_[slot].number) != &object ? nullptr : TakeOutOf(slot);
}

template <class T>
std::uint32_t ObjectTable<T>::TagOf(Id::Digest const& digest) noexcept {
    std::uint32_t tag = 0;
    std::memcpy(&tag, digest.data(), sizeof tag);
    return tag;
}

template <class T>
template <class IsWanted>
std::size_t ObjectTable<T>::FindSlot(std::uint32_t tag, IsWanted isWanted) const noexcept {
    const std::uint8_t mark = MarkOf(tag);
    const std::uint8_t* const marks = Marks();
    std::size_t slot = HomeOf(tag, slotCount_);
    while (marks[slot] != 0 &&
           (marks[slot] != mark || slots_[slot].tag != tag || !isWanted(ObjectAt(slots_[slot].number))))
        slot = Behind(slot);
    return slot;
}

template <class T>
std::size_t ObjectTable<T>::SlotOf(Id::Digest const& digest) const noexcept {
    return FindSlot(TagOf(digest), [&digest](T const* object) { return *object->GetKnownDigest() == digest; });
}

template <class T>
std::size_t ObjectTable<T>::SlotOf(Id::Digest const& digest, T const* object) const noexcept {
    return FindSlot(TagOf(digest), [object](T const* other) { return other == object; });
}

template <class T>
void ObjectTable<T>::Fill(std::size_t slot, Slot with) noexcept {
    slots_[slot] = with;
    Marks()[slot] = MarkOf(with.tag);
}

template <class T>
void ObjectTable<T>::AddSlots() {
    constexpr std::size_t fewest = 16;
    const std::size_t before = slotCount_;
    const std::size_t count = std::max(2 * before, fewest);
    std::vector<Slot> slots(count + count / sizeof(Slot));
    slots.swap(slots_);
    slotCount_ = count;
    const auto* const marks = reinterpret_cast<const std::uint8_t*>(slots.data() + before);
    for (std::size_t from = 0; from < before; from += fewest) {
        // Which slots are free is as good as random, so that a branch for each would cost more than all the rest.
        std::array<Slot, fewest> filled;
        std::size_t filledCount = 0;
        for (std::size_t old = from; old < from + fewest; ++old) {
            filled[filledCount] = slots[old];
            filledCount += marks[old] == 0 ? 0 : 1;
        }
        for (std::size_t index = 0; index < filledCount; ++index) {
            std::size_t slot = HomeOf(filled[index].tag, count);
            while (!IsFree(slot))
                slot = Behind(slot);
            Fill(slot, filled[index]);
        }
    }
}

/// Makes room for one more object: a slot and a place in the list. @return whether objects are in other slots now
template <class T>
bool ObjectTable<T>::MakeRoom() {
    if (size_ == nowhere)
        throw std::length_error("more objects than a table can hold");
    if (firstFree_ == nowhere) {
        list_.push_back(WordOfFree(nowhere));
        firstFree_ = static_cast<std::uint32_t>(list_.size() - 1);
    }
    if (8 * (size_ + 1) <= 5 * slotCount_)
        return false;
    AddSlots();
    return true;
}

template <class T>
cow_ptr<T> ObjectTable<T>::TakeOutOf(std::size_t slot) noexcept {
    const std::uint32_t number = slots_[slot].number;
    // Those after it move up as far as they would have been put without it.
    const auto distance = [this](std::size_t from, std::size_t to) {
        return to >= from ? to - from : to + slotCount_ - from;
    };
    for (std::size_t next = Behind(slot); !IsFree(next); next = Behind(next)) {
        if (distance(HomeOf(slots_[next].tag, slotCount_), next) >= distance(slot, next))
            Fill(std::exchange(slot, next), slots_[next]);
    }
    Marks()[slot] = 0;
    auto object = cow_ptr<T>::attach(ObjectAt(number));
    list_[number] = WordOfFree(std::exchange(firstFree_, number));
    --size_;
    return object;
}

template class ObjectTable<Commit>;
template class ObjectTable<Tree>;
template class ObjectTable<Blob>;

} // namespace KivVcs::detail
