#pragma once

#include "KivVcs/Foundation.h"

namespace KivVcs {

class Blob;
class Tree;

namespace detail {

class Held;
class Node;

/// The entries of a tree: an ordered table whose copies share their nodes. Copying is O(1), an edit O(log n). An edit that
/// throws leaves the entries as they were.
class EntryTable {
public:
    EntryTable() noexcept;
    explicit EntryTable(cow_ptr<Node> top) noexcept;
    EntryTable(EntryTable const& other) noexcept;
    EntryTable(EntryTable&& other) noexcept;
    EntryTable& operator=(EntryTable const& other) noexcept;
    EntryTable& operator=(EntryTable&& other) noexcept;
    ~EntryTable();

    /// The topmost node; null while there are no entries.
    [[nodiscard]] cow_ptr<Node> const& Top() const noexcept { return top_; }

    /// What is held under @p name; null if nothing is. Valid until the next edit.
    [[nodiscard]] Held const* Find(KivStringViewT<char16_t> name) const noexcept;

    /// Makes @p child, a blob or a tree or null, what is held of its kind under @p name; the other kind stays beside it. A
    /// new entry shares @p text, which is the name, if that is given.
    template <class T>
    void Set(KivStringViewT<char16_t> name, cow_ptr<T> child, KivStringT<char16_t> const* text = nullptr);

    /// Removes all that is held under @p name. @pre something is
    void Erase(KivStringViewT<char16_t> name);

private:
    struct Place;
    struct Edit;

    [[nodiscard]] Place FindPlace(KivStringViewT<char16_t> name) const noexcept;
    void Put(Place const& place, KivStringViewT<char16_t> name, KivStringT<char16_t> text, Held held);

    cow_ptr<Node> top_;
};

} // namespace detail

} // namespace KivVcs
