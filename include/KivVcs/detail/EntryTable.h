#pragma once

#include "KivVcs/Foundation.h"

namespace KivVcs {

class Blob;
class Tree;

namespace detail {

class TableNode;
class TableRelease;
struct TableAccess;

/// The entries of a tree: an ordered table whose copies share their nodes. Copying is O(1), an edit O(log n).
class EntryTable {
public:
    EntryTable() noexcept = default;
    EntryTable(EntryTable const& other) noexcept;
    EntryTable(EntryTable&& other) noexcept : root_(std::exchange(other.root_, nullptr)) {}
    EntryTable& operator=(EntryTable other) noexcept {
        std::swap(root_, other.root_);
        return *this;
    }
    ~EntryTable();

    /// Null while there are no entries.
    [[nodiscard]] TableNode const* Root() const noexcept { return root_; }

    /// Sets the entry @p name of the kind of @p child, which may be null; the entry of the other kind stays.
    void Set(KivStringViewT<char16_t> name, cow_ptr<Blob> child);
    void Set(KivStringViewT<char16_t> name, cow_ptr<Tree> child);
    /// The same with a text that a new entry shares.
    void Set(KivStringT<char16_t> const& name, cow_ptr<Blob> child);
    void Set(KivStringT<char16_t> const& name, cow_ptr<Tree> child);

    /// Removes the entries @p name of both kinds. @pre There is one.
    void Erase(KivStringViewT<char16_t> name);

private:
    friend class TableRelease;
    struct TableAccess;

    TableNode* root_ = nullptr;
};

} // namespace detail

} // namespace KivVcs
