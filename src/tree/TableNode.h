#pragma once

#include "KivVcs/Tree.h"

#include <algorithm>
#include <cstdint>
#include <memory>
#include <span>

namespace KivVcs::detail {

/// One entry of a tree: a name and a blob or a subtree, either of which may be null. The kind is kept in the lowest bit
/// of the child's address, since a repository holds an entry for every file of every directory.
class Entry {
public:
    Entry(KivStringT<char16_t> name, cow_ptr<Blob> child) noexcept
        : name_(std::move(name)), child_(AddressOf(cow_ptr<Object>(std::move(child)))) {}
    Entry(KivStringT<char16_t> name, cow_ptr<Tree> child) noexcept
        : name_(std::move(name)), child_(AddressOf(cow_ptr<Object>(std::move(child))) | treeBit) {}
    Entry(Entry const& other) noexcept : name_(other.name_), child_(other.child_) {
        if (Object const* child = Child())
            child->add_reference();
    }
    Entry(Entry&& other) noexcept
        : name_(std::move(other.name_)), child_(std::exchange(other.child_, other.child_ & treeBit)) {}
    Entry& operator=(Entry other) noexcept {
        name_.Swap(other.name_);
        std::swap(child_, other.child_);
        return *this;
    }
    ~Entry() { static_cast<void>(cow_ptr<Object>::attach(Child())); }

    [[nodiscard]] KivStringT<char16_t> const& Name() const noexcept { return name_; }
    [[nodiscard]] bool IsTree() const noexcept { return (child_ & treeBit) != 0; }
    [[nodiscard]] Object const* Child() const noexcept { return reinterpret_cast<Object const*>(child_ & ~treeBit); }
    [[nodiscard]] Blob const* BlobChild() const noexcept {
        return IsTree() ? nullptr : static_cast<Blob const*>(Child());
    }
    [[nodiscard]] Tree const* TreeChild() const noexcept {
        return IsTree() ? static_cast<Tree const*>(Child()) : nullptr;
    }

    /// Whether both are the same name and child, and not only equal ones.
    [[nodiscard]] bool Shares(Entry const& other) const noexcept {
        return child_ == other.child_ && name_.GetString() == other.name_.GetString();
    }

    /// Exchanges the child, and only that, for one of the same kind.
    void TakeChildOf(Entry& other) noexcept { std::swap(child_, other.child_); }

    /// Gives the child up, as a pointer of its own.
    [[nodiscard]] cow_ptr<Object> ReleaseChild() noexcept {
        cow_ptr<Object> child = cow_ptr<Object>::attach(Child());
        child_ &= treeBit;
        return child;
    }

    /// The order of a table: by name, and of one name the blob first.
    [[nodiscard]] bool ComesBefore(KivStringViewT<char16_t> name, bool isTree) const noexcept {
        const int order = name_.Compare(name);
        return order < 0 || (order == 0 && !IsTree() && isTree);
    }

private:
    static constexpr std::uintptr_t treeBit = 1;

    static std::uintptr_t AddressOf(cow_ptr<Object> child) noexcept {
        return reinterpret_cast<std::uintptr_t>(child.detach());
    }

    KivStringT<char16_t> name_;
    std::uintptr_t child_;
};

/// What a node's entries add up to.
struct Tally {
    std::uint32_t blobs = 0;
    std::uint32_t trees = 0;
    /// Names that are held both as a blob and as a subtree.
    std::uint32_t doubled = 0;
    /// The size of the entries' packed form.
    std::uint64_t packedSize = 0;

    Tally& operator+=(Tally const& other) noexcept {
        blobs += other.blobs;
        trees += other.trees;
        doubled += other.doubled;
        packedSize += other.packedSize;
        return *this;
    }
    Tally& operator-=(Tally const& other) noexcept {
        blobs -= other.blobs;
        trees -= other.trees;
        doubled -= other.doubled;
        packedSize -= other.packedSize;
        return *this;
    }
};

/// What @p entries add up to; both entries of a doubled name must be among them, or neither.
[[nodiscard]] Tally TallyOf(std::span<Entry const> entries) noexcept;

/// A reference to a child node of an inner node and a name that no entry of the child comes before (but for the first
/// child, which takes all smaller names) and all entries of the children to its left do.
struct Branch {
    KivStringT<char16_t> first;
    TableNode* child;
};

/// A node of a persistent B-tree, in one allocation with its elements: a leaf has entries, an inner node branches. Both
/// entries of a doubled name are always in one leaf. A node is changed only while it has one owner; owners count
/// themselves.
class TableNode final : public KivUtils::reference_counted {
public:
    static constexpr int mostElements = 32;
    static constexpr int greatestHeight = 16;

    /// A node without elements, with one owner. @throws std::bad_alloc
    [[nodiscard]] static TableNode* Make(int height, int capacity);
    /// A node with copies of the elements [@p from, @p to) and room for @p room more. @throws std::bad_alloc
    [[nodiscard]] TableNode* CopyOf(int from, int to, int room) const;
    /// Destroys a node without elements.
    static void Free(TableNode* node) noexcept;

    [[nodiscard]] bool IsLeaf() const noexcept { return height_ == 0; }
    [[nodiscard]] int Height() const noexcept { return height_; }
    [[nodiscard]] int Count() const noexcept { return count_; }
    [[nodiscard]] int Room() const noexcept { return capacity_ - count_; }
    [[nodiscard]] bool IsFull() const noexcept { return count_ == mostElements; }
    [[nodiscard]] Tally const& Total() const noexcept { return total_; }
    [[nodiscard]] std::uint64_t ElementCount() const noexcept { return std::uint64_t{total_.blobs} + total_.trees; }

    [[nodiscard]] std::span<Entry const> Entries() const noexcept { return {Elements<Entry>(), Size()}; }
    [[nodiscard]] std::span<Entry> Entries() noexcept { return {Elements<Entry>(), Size()}; }
    [[nodiscard]] std::span<Branch const> Branches() const noexcept { return {Elements<Branch>(), Size()}; }
    [[nodiscard]] std::span<Branch> Branches() noexcept { return {Elements<Branch>(), Size()}; }

    /// The index of the branch whose child holds @p name, if any does.
    [[nodiscard]] int BranchFor(KivStringViewT<char16_t> name) const noexcept;
    /// The index of the first entry that does not come before (@p name, @p isTree).
    [[nodiscard]] int EntryFor(KivStringViewT<char16_t> name, bool isTree) const noexcept;
    /// The same, found at once if it is the end, as when names are added in their order.
    [[nodiscard]] int EntryToInsert(KivStringViewT<char16_t> name, bool isTree) const noexcept;
    /// Whether the entry (@p name, @p isTree) is at @p index.
    [[nodiscard]] bool IsEntryAt(int index, KivStringViewT<char16_t> name, bool isTree) const noexcept;

    /// Inserts and erases elements; the total is the caller's. @pre there is room
    void Insert(int index, Entry&& entry) noexcept { InsertElement(index, std::move(entry)); }
    void Insert(int index, Branch&& branch) noexcept { InsertElement(index, std::move(branch)); }
    void EraseEntries(int from, int to) noexcept { EraseElements<Entry>(from, to); }
    void EraseBranches(int from, int to) noexcept { EraseElements<Branch>(from, to); }
    /// Appends all elements of @p other to this node: moved if @p other has no other owner, copied otherwise.
    void Absorb(TableNode& other) noexcept;

    void SetTotal(Tally const& total) noexcept { total_ = total; }
    void AddToTotal(Tally const& difference) noexcept { total_ += difference; }
    void CountTotal() noexcept;

    /// The packed form of a leaf's entries, made on first use and kept with the leaf.
    [[nodiscard]] Buffer const& PackedRun() const;
    void DropPackedRun() noexcept { packedRun_.Reset(); }

private:
    friend class TableRelease;

    TableNode(int height, int capacity) noexcept
        : capacity_(static_cast<std::uint8_t>(capacity)), height_(static_cast<std::uint8_t>(height)) {}
    ~TableNode() = default;

    [[nodiscard]] static std::size_t Bytes(int capacity) noexcept;
    [[nodiscard]] std::size_t Size() const noexcept { return count_; }

    template <class Element>
    [[nodiscard]] Element* Elements() noexcept {
        return reinterpret_cast<Element*>(this + 1);
    }
    template <class Element>
    [[nodiscard]] Element const* Elements() const noexcept {
        return reinterpret_cast<Element const*>(this + 1);
    }
    template <class Element>
    void InsertElement(int index, Element element) noexcept;
    template <class Element>
    void EraseElements(int from, int to) noexcept;

    std::uint8_t count_ = 0;
    std::uint8_t capacity_;
    std::uint8_t height_;
    Tally total_;
    Published<Buffer> packedRun_;
    // Links the nodes that wait for destruction; there is no other use for a node then.
    TableNode* nextDying_ = nullptr;
};

/// The leaf below @p root that has the entries of that name, if any has.
[[nodiscard]] TableNode const& LeafFor(TableNode const& root, KivStringViewT<char16_t> name) noexcept;

/// The entry (@p name, @p isTree) of the table with the given root, or null.
[[nodiscard]] Entry const* FindEntry(TableNode const* root, KivStringViewT<char16_t> name, bool isTree) noexcept;

/// Hands every leaf below @p node, which may be null, to @p visit in order.
template <class Visit>
// NOLINTNEXTLINE(misc-no-recursion): as deep as the table is high
void ForEachLeaf(TableNode const* node, Visit const& visit) {
    if (node == nullptr)
        return;
    if (node->IsLeaf()) {
        visit(*node);
        return;
    }
    for (Branch const& branch : node->Branches())
        ForEachLeaf(branch.child, visit);
}

/// Hands every entry below @p node, which may be null, to @p visit in order.
template <class Visit>
void ForEachEntry(TableNode const* node, Visit const& visit) {
    ForEachLeaf(node, [&visit](TableNode const& leaf) {
        for (Entry const& entry : leaf.Entries())
            visit(entry);
    });
}

/// The entries of a tree, for the files that the tree is implemented in.
struct TableAccess {
    [[nodiscard]] static TableNode const* Root(Tree const& tree) noexcept { return tree.entries_.Root(); }

    /// As `AddBlob` and `AddTree` of @p tree, for an object that the caller may be the only one to hold.
    template <class T>
    static void AddRead(Tree& tree, IRepository& repo, KivStringT<char16_t> const& name, cow_ptr<T> object);
};

} // namespace KivVcs::detail
