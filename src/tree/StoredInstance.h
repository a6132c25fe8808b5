#pragma once

#include "KivVcs/IRepository.h"
#include "KivVcs/Tree.h"

#include <type_traits>

namespace KivVcs {

/// The storage's instance of @p object: what is held under its identifier already, otherwise what @p own makes of it, a
/// copy or the object itself, which is stored then.
///
/// Everything that a tree takes in goes through here, so that equal content is one object however often it is added. The
/// repository is asked first because most objects are there, and an own copy is made only of those that are not; what it
/// synchronises has the last word, even if that is null or something else.
template <class T, class Own>
cow_ptr<T> StoredInstance(IRepository& repo, T const& object, Own own) {
    cow_ptr<T> stored;
    if constexpr (std::is_same_v<T, Blob>)
        stored = repo.GetBlobFromStorage(object.GetId());
    else
        stored = repo.GetTreeFromStorage(object.GetId());
    return repo.SyncWithStorage(stored ? std::move(stored) : own());
}

} // namespace KivVcs
