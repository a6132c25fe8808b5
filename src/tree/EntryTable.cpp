#include "tree/TableNode.h"

#include <array>

namespace KivVcs::detail {

/// Drops nodes and, when they were the last owners, everything below: nested trees too, one after the other, so that
/// releasing a tree takes no more stack the deeper it is nested.
class TableRelease {
public:
    static void Drop(TableNode* root) noexcept {
        TableRelease release;
        release.DropNode(root);
        while (TableNode* const node = release.dying_) {
            release.dying_ = node->nextDying_;
            release.TakeApart(*node);
            TableNode::Free(node);
        }
    }

private:
    void DropNode(TableNode* node) noexcept {
        if (node == nullptr || !node->drop_reference())
            return;
        node->nextDying_ = dying_;
        dying_ = node;
    }

    void TakeApart(TableNode& node) noexcept {
        if (!node.IsLeaf()) {
            for (Branch const& branch : node.Branches())
                DropNode(branch.child);
            node.EraseBranches(0, node.Count());
            return;
        }
        for (Entry& entry : node.Entries()) {
            if (!entry.IsTree())
                continue;
            if (const std::unique_ptr<Object> last = entry.ReleaseChild().release_if_last())
                DropNode(std::exchange(static_cast<Tree&>(*last).entries_.root_, nullptr));
        }
        node.EraseEntries(0, node.Count());
    }

    TableNode* dying_ = nullptr;
};

namespace {

/// Fewer elements than this make a node a candidate for being joined with its neighbour, up to the size below, so that
/// the joined node does not split again at the next insertion.
constexpr int fewElements = TableNode::mostElements / 4;
constexpr int mostJoinedElements = TableNode::mostElements * 3 / 4;

/// Makes the node in @p slot changeable, with room for @p room more elements: as it is if it has one owner and room,
/// otherwise as a copy. Content stays as it is, also when this throws.
void MakeWritable(TableNode*& slot, int room) {
    const bool sole = slot->reference_count() == 1;
    if (sole && slot->Room() >= room)
        return;
    // A version that is shared is likely to be shared again at once, so it gets no spare room; one that is being built
    // does.
    const int spare = sole ? std::clamp(slot->Count(), std::min(4, TableNode::mostElements - slot->Count()),
                                        TableNode::mostElements - slot->Count())
                           : room;
    TableNode* copy = nullptr;
    if (sole) {
        copy = TableNode::Make(slot->Height(), slot->Count() + spare);
        copy->Absorb(*slot);
    } else {
        copy = slot->CopyOf(0, slot->Count(), spare);
    }
    TableRelease::Drop(std::exchange(slot, copy));
}

/// The way from the root to a leaf.
struct Path {
    struct Step {
        TableNode* node;
        int branch;
    };

    std::array<Step, TableNode::greatestHeight> steps{};
    int length = 0;

    void Add(TableNode* node, int branch) noexcept { steps[static_cast<std::size_t>(length++)] = {node, branch}; }
    [[nodiscard]] Step const& At(int index) const noexcept { return steps[static_cast<std::size_t>(index)]; }

    void AddToTotals(Tally const& added, Tally const& removed) const noexcept {
        for (int index = 0; index < length; ++index) {
            Tally total = At(index).node->Total();
            total += added;
            total -= removed;
            At(index).node->SetTotal(total);
        }
    }
};

/// Where a full leaf is split for a new entry: in the middle, or at its end for a new last entry, so that names added
/// in ascending order fill their leaves. Both entries of a doubled name stay together.
int LeafSplitPoint(TableNode const& leaf, KivStringViewT<char16_t> name) noexcept {
    const auto entries = leaf.Entries();
    const int order = name.Compare(entries.back().Name());
    if (order > 0)
        return leaf.Count();
    if (order == 0)
        return leaf.Count() - 1;
    const std::size_t middle = entries.size() / 2;
    return static_cast<int>(entries[middle - 1].Name() == entries[middle].Name() ? middle + 1 : middle);
}

/// Splits the full child @p index of @p parent, which is writable and has room, so that @p name can be inserted.
void SplitChild(TableNode& parent, int index, KivStringViewT<char16_t> name) {
    TableNode*& slot = parent.Branches()[static_cast<std::size_t>(index)].child;
    TableNode const& child = *slot;
    int at = TableNode::mostElements / 2;
    if (child.IsLeaf())
        at = LeafSplitPoint(child, name);
    else if (child.BranchFor(name) == child.Count() - 1)
        at = child.Count() - 1;

    const int room = std::min(TableNode::mostElements - (child.Count() - at), 4);
    KivStringT<char16_t> first;
    if (at == child.Count())
        first = name.ToString();
    else
        first = child.IsLeaf() ? child.Entries()[static_cast<std::size_t>(at)].Name()
                               : child.Branches()[static_cast<std::size_t>(at)].first;
    TableNode* const right = child.CopyOf(at, child.Count(), room);
    if (at == child.Count()) {
        parent.Insert(index + 1, Branch{std::move(first), right});
        return;
    }
    if (slot->reference_count() == 1) {
        if (child.IsLeaf()) {
            slot->EraseEntries(at, child.Count());
        } else {
            for (Branch const& branch : slot->Branches().subspan(static_cast<std::size_t>(at)))
                TableRelease::Drop(branch.child);
            slot->EraseBranches(at, child.Count());
        }
        slot->DropPackedRun();
        slot->CountTotal();
    } else {
        TableNode* left = nullptr;
        try {
            left = child.CopyOf(0, at, 1);
        } catch (...) {
            TableRelease::Drop(right);
            throw;
        }
        TableRelease::Drop(std::exchange(slot, left));
    }
    parent.Insert(index + 1, Branch{std::move(first), right});
}

/// Joins the child @p index of @p parent, which is writable, with a neighbour if both are small.
/// @return the index of the child that now holds what child @p index held.
int JoinSmallChild(TableNode& parent, int index) {
    const auto branches = parent.Branches();
    const auto count = [&branches](int at) { return branches[static_cast<std::size_t>(at)].child->Count(); };
    if (count(index) > fewElements)
        return index;
    int left = -1;
    if (index + 1 < parent.Count() && count(index) + count(index + 1) <= mostJoinedElements)
        left = index;
    else if (index > 0 && count(index - 1) + count(index) <= mostJoinedElements)
        left = index - 1;
    if (left < 0)
        return index;
    TableNode*& slot = branches[static_cast<std::size_t>(left)].child;
    TableNode*& neighbour = branches[static_cast<std::size_t>(left) + 1].child;
    TableNode* const joined = slot->CopyOf(0, slot->Count(), neighbour->Count());
    joined->Absorb(*neighbour);
    if (!joined->IsLeaf()) {
        // The neighbour's first child took all smaller names of the neighbour, down to the parent's division.
        const auto from = static_cast<std::size_t>(slot->Count());
        joined->Branches()[from].first = branches[static_cast<std::size_t>(left) + 1].first;
    }
    TableRelease::Drop(std::exchange(slot, joined));
    TableRelease::Drop(neighbour);
    parent.EraseBranches(left + 1, left + 2);
    return left;
}

/// An inner root with one child is replaced by that child.
void LowerRoot(TableNode*& root) noexcept {
    while (root != nullptr && !root->IsLeaf() && root->Count() == 1) {
        TableNode* const child = root->Branches()[0].child;
        child->add_reference();
        TableRelease::Drop(std::exchange(root, child));
    }
}

void RaiseRoot(TableNode*& root) {
    TableNode* const raised = TableNode::Make(root->Height() + 1, 2);
    raised->Insert(0, Branch{{}, root});
    raised->CountTotal();
    root = raised;
}

/// Some of the entries of a leaf that have one name.
struct NameRange {
    int from;
    int to;

    [[nodiscard]] Tally TallyIn(TableNode const& leaf) const noexcept {
        return TallyOf(leaf.Entries().subspan(static_cast<std::size_t>(from), static_cast<std::size_t>(to - from)));
    }
};

/// All entries of @p leaf that have @p name: none, one, or a blob and a subtree.
NameRange RangeOfName(TableNode const& leaf, KivStringViewT<char16_t> name) noexcept {
    const auto entries = leaf.Entries();
    NameRange range{leaf.EntryFor(name, false), 0};
    for (range.to = range.from; range.to < leaf.Count() && entries[static_cast<std::size_t>(range.to)].Name() == name;)
        ++range.to;
    return range;
}

/// Where in its leaf an entry is, or where it belongs.
struct Place {
    int index = 0;
    int leafCount = 0;
    bool exists = false;
};

Place FindPlace(TableNode const* root, KivStringViewT<char16_t> name, bool isTree) noexcept {
    if (root == nullptr)
        return {};
    TableNode const& leaf = LeafFor(*root, name);
    const int index = leaf.EntryToInsert(name, isTree);
    return {index, leaf.Count(), leaf.IsEntryAt(index, name, isTree)};
}

/// The entries on one leaf that decide, with the one at @p index, what the entry (@p name, @p isTree) adds to a tally: at
/// most one, of the other kind.
NameRange OthersOfName(TableNode const& leaf, int index, KivStringViewT<char16_t> name, bool isTree) noexcept {
    const int other = isTree ? index - 1 : index;
    const bool there =
        other >= 0 && other < leaf.Count() && leaf.Entries()[static_cast<std::size_t>(other)].Name() == name;
    return there ? NameRange{other, other + 1} : NameRange{index, index};
}

/// Inserts an entry that is not there at @p index of @p path's leaf, which is writable and has room.
void InsertEntry(Path const& path, int index, Entry&& entry) noexcept {
    TableNode& leaf = *path.At(path.length - 1).node;
    NameRange range = OthersOfName(leaf, index, entry.Name(), entry.IsTree());
    const Tally before = range.TallyIn(leaf);
    leaf.Insert(index, std::move(entry));
    ++range.to;
    path.AddToTotals(range.TallyIn(leaf), before);
}

/// Exchanges the child of the entry at @p index of @p path's leaf, which is writable.
void ReplaceChild(Path const& path, int index, Entry&& replacement) noexcept {
    TableNode& leaf = *path.At(path.length - 1).node;
    Entry& entry = leaf.Entries()[static_cast<std::size_t>(index)];
    if (entry.Child() != nullptr && replacement.Child() != nullptr) {
        // The same name, kind and size as before: no total changes.
        entry.TakeChildOf(replacement);
        return;
    }
    const NameRange range = RangeOfName(leaf, entry.Name());
    const Tally before = range.TallyIn(leaf);
    entry.TakeChildOf(replacement);
    path.AddToTotals(range.TallyIn(leaf), before);
}

KivStringT<char16_t> NewName(KivStringViewT<char16_t> name) {
    return name.ToString();
}

KivStringT<char16_t> NewName(KivStringT<char16_t> const& name) noexcept {
    return name;
}

template <class Name, class Child>
void SetEntry(TableNode*& root, Name const& name, bool isTree, cow_ptr<Child> child) {
    const Place place = FindPlace(root, name, isTree);
    // An entry that is replaced keeps its name, which its other versions share.
    Entry entry(place.exists ? KivStringT<char16_t>() : NewName(name), std::move(child));
    if (root == nullptr)
        root = TableNode::Make(0, 1);
    if (!place.exists && root->IsFull())
        RaiseRoot(root);

    // Everything that can fail happens on the way down and leaves the content as it is: nodes are copied, and split
    // where they are full, so that the insertion itself finds room.
    Path path;
    TableNode** slot = &root;
    while (!(*slot)->IsLeaf()) {
        const auto childOf = [&slot](int branch) -> TableNode*& {
            return (*slot)->Branches()[static_cast<std::size_t>(branch)].child;
        };
        int branch = (*slot)->BranchFor(name);
        const bool split = !place.exists && childOf(branch)->IsFull();
        MakeWritable(*slot, split ? 1 : 0);
        if (split) {
            SplitChild(**slot, branch, name);
            branch = (*slot)->BranchFor(name);
        }
        path.Add(*slot, branch);
        slot = &childOf(branch);
    }
    MakeWritable(*slot, place.exists ? 0 : 1);
    path.Add(*slot, 0);

    TableNode& leaf = **slot;
    leaf.DropPackedRun();
    if (place.exists)
        ReplaceChild(path, place.index, std::move(entry));
    else
        // A leaf that was split on the way has become shorter.
        InsertEntry(path, leaf.Count() == place.leafCount ? place.index : leaf.EntryToInsert(name, isTree),
                    std::move(entry));
}

} // namespace

EntryTable::EntryTable(EntryTable const& other) noexcept : root_(other.root_) {
    if (root_ != nullptr)
        root_->add_reference();
}

EntryTable::~EntryTable() {
    TableRelease::Drop(root_);
}

void EntryTable::Set(KivStringViewT<char16_t> name, cow_ptr<Blob> child) {
    SetEntry(root_, name, false, std::move(child));
}

void EntryTable::Set(KivStringViewT<char16_t> name, cow_ptr<Tree> child) {
    SetEntry(root_, name, true, std::move(child));
}

void EntryTable::Set(KivStringT<char16_t> const& name, cow_ptr<Blob> child) {
    SetEntry(root_, name, false, std::move(child));
}

void EntryTable::Set(KivStringT<char16_t> const& name, cow_ptr<Tree> child) {
    SetEntry(root_, name, true, std::move(child));
}

void EntryTable::Erase(KivStringViewT<char16_t> name) {
    Path path;
    TableNode** slot = &root_;
    while (!(*slot)->IsLeaf()) {
        MakeWritable(*slot, 0);
        const int branch = JoinSmallChild(**slot, (*slot)->BranchFor(name));
        path.Add(*slot, branch);
        slot = &(*slot)->Branches()[static_cast<std::size_t>(branch)].child;
    }
    MakeWritable(*slot, 0);
    path.Add(*slot, 0);

    TableNode& leaf = **slot;
    const NameRange range = RangeOfName(leaf, name);
    path.AddToTotals({}, range.TallyIn(leaf));
    leaf.EraseEntries(range.from, range.to);
    leaf.DropPackedRun();
    for (int index = path.length - 1; index > 0 && path.At(index).node->Count() == 0; --index) {
        TableRelease::Drop(path.At(index).node);
        const int branch = path.At(index - 1).branch;
        path.At(index - 1).node->EraseBranches(branch, branch + 1);
    }
    if (root_->Count() == 0)
        TableRelease::Drop(std::exchange(root_, nullptr));
    LowerRoot(root_);
}

} // namespace KivVcs::detail
