#pragma once

#include "KivVcs/IRepository.h"
#include "KivVcs/Tree.h"

namespace KivVcs {

inline cow_ptr<Blob> GetFromStorage(IRepository& repo, Id const& id, Blob const*) {
    return repo.GetBlobFromStorage(id);
}
inline cow_ptr<Tree> GetFromStorage(IRepository& repo, Id const& id, Tree const*) {
    return repo.GetTreeFromStorage(id);
}

/// The storage's instance of @p object: what is held under its identifier already, otherwise what @p own makes of it, a
/// copy or the object itself, which is stored then.
///
/// Everything that a tree takes in goes through here, so that equal content is one object however often it is added. The
/// repository is asked first because most objects are there, and an own copy is made only of those that are not; what it
/// synchronises has the last word, even if that is null or something else.
template <class T, class Own>
[[nodiscard]] cow_ptr<T> StoredInstance(IRepository& repo, T const& object, Own own) {
    cow_ptr<T> stored = GetFromStorage(repo, object.GetId(), &object);
    return repo.SyncWithStorage(stored ? std::move(stored) : own());
}

} // namespace KivVcs
