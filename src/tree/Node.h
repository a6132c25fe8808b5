#pragma once

#include "tree/Held.h"

#include <algorithm>
#include <new>
#include <span>

namespace KivVcs::detail {

/// One entry of a directory.
struct Entry {
    KivStringT<char16_t> name;
    Held held;

    /// Whether versions share both, the text of the name included.
    [[nodiscard]] bool IsSharedWith(Entry const& other) const noexcept {
        return held.IsSame(other.held) && name.IsSharedWith(other.name);
    }
};

/// A child of an inner node and what separates it from its left neighbour: no name below the child comes before the
/// separator, and all names to the left do. The first child takes all smaller names, whatever its separator.
struct Child {
    KivStringT<char16_t> separator;
    cow_ptr<Node> node;
};

/// What entries add up to.
struct Tally {
    std::uint32_t names = 0;
    std::uint32_t blobs = 0;
    std::uint32_t trees = 0;
    /// Names for which the packed form shows an object of a host's class, which is asked what that is.
    std::uint32_t hosts = 0;
    /// The size of what the packed form shows for the other names.
    std::uint64_t packedSize = 0;

    [[nodiscard]] std::uint64_t Objects() const noexcept { return std::uint64_t{blobs} + trees; }
    /// Whether any name holds both a blob and a subtree.
    [[nodiscard]] bool HasSharedNames() const noexcept { return Objects() != names; }

    Tally& operator+=(Tally const& other) noexcept;
    Tally& operator-=(Tally const& other) noexcept;
};

/// What an entry adds; nothing if nothing is held.
[[nodiscard]] Tally TallyOf(KivStringViewT<char16_t> name, Held const& held) noexcept;

/// Whether both add the same under one name.
[[nodiscard]] bool CountAlike(Held const& left, Held const& right) noexcept;

/// A node of a persistent B-tree, in one allocation with its elements: the entries of a leaf, the children of an inner
/// node. Nodes are shared by the versions of a directory, and changed only where one version owns them alone.
class Node final : public KivUtils::reference_counted {
public:
    static constexpr int maxElements = 32;
    static constexpr int maxHeight = 16;

    /// A node without elements; a leaf has height 0. @throws std::bad_alloc
    [[nodiscard]] static cow_ptr<Node> Make(int height, int capacity);
    /// A node with copies of the elements [@p from, @p to) and room for @p room more. @throws std::bad_alloc
    [[nodiscard]] cow_ptr<Node> CopyOf(int from, int to, int room) const;
    /// A node of exactly the given elements, which are moved there. @throws std::bad_alloc; nothing has moved then
    template <class Element>
    [[nodiscard]] static cow_ptr<Node> MakeOf(int height, std::span<Element> elements);
    /// The node of @p handle as one that only this handle owns and that has room for @p room more elements: the node
    /// itself, or a copy that takes its place. @throws std::bad_alloc
    [[nodiscard]] static Node& Writable(cow_ptr<Node>& handle, int room);

    /// The node of its only handle, for a change. @pre there is no other handle
    [[nodiscard]] static Node& Of(cow_ptr<Node>& handle) noexcept;

    /// What `delete` does: destroys the node and all that it was the last to own, nested directories too, one after the
    /// other, so that releasing a tree takes no more stack the deeper it is nested.
    static void operator delete(Node* node, std::destroying_delete_t) noexcept;
    ~Node();

    [[nodiscard]] bool IsLeaf() const noexcept { return height_ == 0; }
    [[nodiscard]] int Height() const noexcept { return height_; }
    [[nodiscard]] int Count() const noexcept { return count_; }
    [[nodiscard]] bool IsFull() const noexcept { return count_ == maxElements; }
    [[nodiscard]] Tally const& Total() const noexcept { return total_; }

    [[nodiscard]] std::span<Entry const> Entries() const noexcept { return Elements<Entry>(); }
    [[nodiscard]] std::span<Entry> Entries() noexcept { return Elements<Entry>(); }
    [[nodiscard]] std::span<Child const> Children() const noexcept { return Elements<Child>(); }
    [[nodiscard]] std::span<Child> Children() noexcept { return Elements<Child>(); }
    [[nodiscard]] Entry& EntryAt(int index) noexcept { return Entries()[static_cast<std::size_t>(index)]; }
    [[nodiscard]] Entry const& EntryAt(int index) const noexcept { return Entries()[static_cast<std::size_t>(index)]; }
    [[nodiscard]] Child& ChildAt(int index) noexcept { return Children()[static_cast<std::size_t>(index)]; }
    [[nodiscard]] Child const& ChildAt(int index) const noexcept { return Children()[static_cast<std::size_t>(index)]; }

    /// The index of the child that holds @p name, if any does.
    [[nodiscard]] int ChildFor(KivStringViewT<char16_t> name) const noexcept;
    /// The index of the first entry that does not come before @p name.
    [[nodiscard]] int EntryFor(KivStringViewT<char16_t> name) const noexcept;

    /// Inserts and erases elements; the total is the caller's. @pre there is room
    template <class Element>
    void Insert(int index, Element element) noexcept;
    template <class Element>
    void Erase(int from, int to) noexcept;
    /// Cuts off the elements from @p from on.
    void Truncate(int from) noexcept;
    /// Appends copies of all elements of @p other, a node of the same height.
    void Append(Node const& other) noexcept;

    void AddToTotal(Tally const& difference) noexcept { total_ += difference; }

    /// The packed form of a leaf's entries, made on first use and kept with the leaf and its copies, except for the identifiers
    /// of the entries whose bit is set in `StaleEntries`. @pre there are no hosts' objects
    [[nodiscard]] Buffer const& PackedRun() const;
    /// Has the processor fetch the beginning of what is kept of it.
    void PrefetchPackedRun() const noexcept;
    [[nodiscard]] std::uint32_t StaleEntries() const noexcept { return staleEntries_; }
    /// Says that the entry @p index shows another identifier than before, and nothing else.
    void MarkStale(int index) noexcept;
    void DropPackedRun() noexcept {
        packedRun_.Reset();
        staleEntries_ = 0;
    }

private:
    Node(int height, int capacity) noexcept
        : capacity_(static_cast<std::uint8_t>(capacity)), height_(static_cast<std::uint8_t>(height)) {}

    template <class Element>
    [[nodiscard]] std::span<Element> Elements() noexcept {
        return {reinterpret_cast<Element*>(this + 1), count_};
    }
    template <class Element>
    [[nodiscard]] std::span<Element const> Elements() const noexcept {
        return {reinterpret_cast<Element const*>(this + 1), count_};
    }
    template <class Element>
    void Take(std::span<Element> elements) noexcept;
    void CountTotal() noexcept;

    struct Run : KivUtils::reference_counted {
        explicit Run(Buffer packed) noexcept : bytes(std::move(packed)) {}

        Buffer bytes;
    };

    std::uint8_t count_ = 0;
    std::uint8_t capacity_;
    std::uint8_t height_;
    Tally total_;
    Published<Run> packedRun_;
    union {
        std::uint32_t staleEntries_ = 0;
        /// Links the nodes that wait for destruction; there is no other use for a node then.
        Node* nextDying_;
    };
};

inline EntryTable::EntryTable() noexcept = default;
inline EntryTable::EntryTable(cow_ptr<Node> top) noexcept : top_(std::move(top)) {}
inline EntryTable::EntryTable(EntryTable const& other) noexcept = default;
inline EntryTable::EntryTable(EntryTable&& other) noexcept = default;
inline EntryTable& EntryTable::operator=(EntryTable const& other) noexcept = default;
inline EntryTable& EntryTable::operator=(EntryTable&& other) noexcept = default;
inline EntryTable::~EntryTable() = default;

/// The entries of a tree, for the files that the tree is implemented in.
struct TreeAccess {
    [[nodiscard]] static cow_ptr<Node> const& Top(Tree const& tree) noexcept { return tree.entries_.Top(); }
    [[nodiscard]] static Held const* Find(Tree const& tree, KivStringViewT<char16_t> name) noexcept {
        return tree.entries_.Find(name);
    }

    [[nodiscard]] static EntryTable& Entries(Tree& tree) noexcept { return tree.entries_; }
    [[nodiscard]] static EntryTable const& Entries(Tree const& tree) noexcept { return tree.entries_; }

    /// Identifies a tree of nothing but the library's objects, whose packed form has the same data as @p form if it has the
    /// same size.
    static void IdentifyByForm(Tree const& tree, Buffer const& form);

    /// The storage's instance of @p object, which an entry then holds. If there is none yet, an object that only the caller
    /// holds is stored itself, any other as a copy.
    template <class T>
    [[nodiscard]] static cow_ptr<T> Stored(IRepository& repo, cow_ptr<T> object);
};

} // namespace KivVcs::detail
