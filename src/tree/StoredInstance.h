#pragma once

#include "KivVcs/Tree.h"
#include "tree/OwnTables.h"

namespace KivVcs {

/// The storage's instance of @p object, an object of one of the library's classes: what StoredInstance finds out, by one look
/// at the table. Nothing if it takes the calls to find out; @p own has not been called then.
template <class T, class Own>
optional<cow_ptr<T>> OwnStoredInstance(detail::ObjectTable<T>& table, T const& object, Own own) {
    Id::Digest const* const digest = object.GetKnownDigest();
    // Another thread may be about to publish it.
    if (digest == nullptr)
        return {};
    const auto place = table.PlaceOf(*digest);
    // One of a host's class would be asked for its identifier.
    if (place.object != nullptr && place.object->IsOfHostClass())
        return {};
    if (place.object != nullptr)
        return cow_ptr<T>::share(place.object);
    cow_ptr<T> stored = own();
    table.AddAt(place, stored.share_from_sole_owner());
    return stored;
}

/// The storage's instance of @p object: what is held under its identifier already, otherwise what @p own makes of it, a
/// copy or the object itself, which is stored then.
///
/// Everything that a tree takes in goes through here, so that equal content is one object however often it is added. The
/// repository is asked first because most objects are there, and an own copy is made only of those that are not; what it
/// synchronises has the last word, even if that is null or something else.
template <class T, class Own>
cow_ptr<T> StoredInstance(IRepository& repo, T const& object, Own own) {
    if (!object.IsOfHostClass()) {
        // Before the table is looked at, since hosts' objects in a tree are asked for theirs.
        if (object.GetKnownDigest() == nullptr)
            static_cast<void>(object.GetId());
        if (auto* const table = detail::OwnTables::Behind(repo).Of<T>()) {
            if (auto stored = OwnStoredInstance(*table, object, own))
                return *std::move(stored);
        }
    }
    cow_ptr<T> stored;
    if constexpr (std::is_same_v<T, Blob>)
        stored = repo.GetBlobFromStorage(object.GetId());
    else
        stored = repo.GetTreeFromStorage(object.GetId());
    return repo.SyncWithStorage(stored ? std::move(stored) : own());
}

} // namespace KivVcs
