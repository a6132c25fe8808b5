#pragma once

#include "KivVcs/IRepository.h"
#include "KivVcs/detail/ObjectTable.h"

#include <type_traits>

namespace KivVcs {

class Blob;
class Tree;

namespace detail {

/// The tables behind a repository, if it is exactly a `Repository` on exactly a `MemObjectsStorage`: their operations are
/// nobody else's then, so that nobody can tell whether these are called or the tables asked at once. Otherwise null.
struct OwnTables {
    /// Defined where repositories are.
    [[nodiscard]] static OwnTables Behind(IRepository& repo) noexcept;

    /// The table of one kind, as long as it goes by digests; otherwise null.
    template <class T>
    [[nodiscard]] ObjectTable<T>* Of() const noexcept {
        ObjectTable<T>* table = nullptr;
        if constexpr (std::is_same_v<T, Blob>)
            table = blobs;
        else
            table = trees;
        return table != nullptr && table->GoesByDigests() ? table : nullptr;
    }

    ObjectTable<Blob>* blobs = nullptr;
    ObjectTable<Tree>* trees = nullptr;
};

} // namespace detail

} // namespace KivVcs
