#include "tree/TableNode.h"

#include "tree/PackedEntries.h"

namespace KivVcs::detail {

// NOLINTNEXTLINE(misc-redundant-expression): that both sides are the same number is what is claimed
static_assert(sizeof(Entry) == sizeof(Branch) && alignof(Entry) == alignof(Branch));
static_assert(sizeof(TableNode) % alignof(Entry) == 0);

Tally TallyOf(std::span<Entry const> entries) noexcept {
    Tally tally;
    Entry const* blobBefore = nullptr;
    for (Entry const& entry : entries) {
        if (!entry.IsTree()) {
            ++tally.blobs;
            tally.packedSize += PackedSize(entry);
            blobBefore = &entry;
            continue;
        }
        ++tally.trees;
        // A blob hides the subtree of the same name from the packed form.
        if (blobBefore != nullptr && blobBefore->Name() == entry.Name())
            ++tally.doubled;
        else
            tally.packedSize += PackedSize(entry);
    }
    return tally;
}

std::size_t TableNode::Bytes(int capacity) noexcept {
    return sizeof(TableNode) + static_cast<std::size_t>(capacity) * sizeof(Entry);
}

TableNode* TableNode::Make(int height, int capacity) {
    void* const memory = std::allocator<std::byte>().allocate(Bytes(capacity));
    auto* const node = ::new (memory) TableNode(height, capacity);
    node->add_reference();
    return node;
}

void TableNode::Free(TableNode* node) noexcept {
    const std::size_t bytes = Bytes(node->capacity_);
    node->~TableNode();
    std::allocator<std::byte>().deallocate(reinterpret_cast<std::byte*>(node), bytes);
}

TableNode* TableNode::CopyOf(int from, int to, int room) const {
    TableNode* const copy = Make(height_, to - from + room);
    for (int index = from; index < to; ++index) {
        if (IsLeaf()) {
            std::construct_at(copy->Elements<Entry>() + copy->count_++, Elements<Entry>()[index]);
        } else {
            Branch const& branch = Elements<Branch>()[index];
            branch.child->add_reference();
            std::construct_at(copy->Elements<Branch>() + copy->count_++, branch);
        }
    }
    if (to - from == count_)
        copy->total_ = total_;
    else
        copy->CountTotal();
    return copy;
}

int TableNode::BranchFor(KivStringViewT<char16_t> name) const noexcept {
    const auto branches = Branches();
    const auto after = std::upper_bound(
        branches.begin() + 1, branches.end(), name,
        [](KivStringViewT<char16_t> wanted, Branch const& branch) { return wanted.Compare(branch.first) < 0; });
    return static_cast<int>(after - branches.begin()) - 1;
}

int TableNode::EntryFor(KivStringViewT<char16_t> name, bool isTree) const noexcept {
    const auto entries = Entries();
    const auto found = std::lower_bound(
        entries.begin(), entries.end(), name,
        [isTree](Entry const& entry, KivStringViewT<char16_t> wanted) { return entry.ComesBefore(wanted, isTree); });
    return static_cast<int>(found - entries.begin());
}

int TableNode::EntryToInsert(KivStringViewT<char16_t> name, bool isTree) const noexcept {
    return count_ == 0 || Entries().back().ComesBefore(name, isTree) ? count_ : EntryFor(name, isTree);
}

bool TableNode::IsEntryAt(int index, KivStringViewT<char16_t> name, bool isTree) const noexcept {
    if (index == count_)
        return false;
    Entry const& entry = Entries()[static_cast<std::size_t>(index)];
    return entry.IsTree() == isTree && entry.Name() == name;
}

template <class Element>
void TableNode::InsertElement(int index, Element element) noexcept {
    auto* const elements = Elements<Element>();
    if (index == count_) {
        std::construct_at(elements + index, std::move(element));
    } else {
        std::construct_at(elements + count_, std::move(elements[count_ - 1]));
        std::move_backward(elements + index, elements + count_ - 1, elements + count_);
        elements[index] = std::move(element);
    }
    ++count_;
}

template <class Element>
void TableNode::EraseElements(int from, int to) noexcept {
    auto* const elements = Elements<Element>();
    Element* const end = std::move(elements + to, elements + count_, elements + from);
    std::destroy(end, elements + count_);
    count_ = static_cast<std::uint8_t>(end - elements);
}

template void TableNode::InsertElement(int, Entry) noexcept;
template void TableNode::InsertElement(int, Branch) noexcept;
template void TableNode::EraseElements<Entry>(int, int) noexcept;
template void TableNode::EraseElements<Branch>(int, int) noexcept;

void TableNode::Absorb(TableNode& other) noexcept {
    const bool sole = other.reference_count() == 1;
    if (IsLeaf()) {
        for (Entry& entry : other.Entries())
            Insert(count_, sole ? std::move(entry) : Entry(entry));
    } else {
        for (Branch const& branch : other.Branches()) {
            if (!sole)
                branch.child->add_reference();
            Insert(count_, Branch(branch));
        }
    }
    total_ += other.total_;
    if (!sole)
        return;
    if (IsLeaf())
        other.EraseEntries(0, other.count_);
    else
        other.EraseBranches(0, other.count_);
}

void TableNode::CountTotal() noexcept {
    if (IsLeaf()) {
        total_ = TallyOf(Entries());
        return;
    }
    total_ = {};
    for (Branch const& branch : Branches())
        total_ += branch.child->total_;
}

Buffer const& TableNode::PackedRun() const {
    return packedRun_.GetOrMake([this] {
        return Buffer::Build(total_.packedSize, [this](std::byte* bytes) {
            char* out = reinterpret_cast<char*>(bytes);
            ForEachPackedEntry(*this, [&out](Entry const& entry) { out = PackEntry(entry, out); });
        });
    });
}

TableNode const& LeafFor(TableNode const& root, KivStringViewT<char16_t> name) noexcept {
    TableNode const* node = &root;
    while (!node->IsLeaf())
        node = node->Branches()[static_cast<std::size_t>(node->BranchFor(name))].child;
    return *node;
}

Entry const* FindEntry(TableNode const* root, KivStringViewT<char16_t> name, bool isTree) noexcept {
    if (root == nullptr)
        return nullptr;
    TableNode const& leaf = LeafFor(*root, name);
    const int index = leaf.EntryFor(name, isTree);
    return leaf.IsEntryAt(index, name, isTree) ? &leaf.Entries()[static_cast<std::size_t>(index)] : nullptr;
}

} // namespace KivVcs::detail
