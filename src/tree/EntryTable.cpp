#include "tree/Node.h"

namespace KivVcs::detail {

namespace {

/// Fewer elements than this make a node a candidate for being joined with its neighbour, up to the size below, so that
/// the joined node does not split again at the next insertion.
constexpr int fewElements = Node::maxElements / 4;
constexpr int maxJoinedElements = Node::maxElements * 3 / 4;

/// Splits the full child @p index of @p parent, which is writable and has room, so that @p name can be inserted below:
/// in the middle, or at its end for a new last name, so that names added in ascending order fill their nodes.
/// @return the index of the child for that name
int SplitChild(Node& parent, int index, KivStringViewT<char16_t> name) {
    cow_ptr<Node>& left = parent.ChildAt(index).node;
    const int count = left->Count();
    int at = count / 2;
    if (left->IsLeaf() ? name.Compare(left->EntryAt(count - 1).name) > 0 : left->ChildFor(name) == count - 1)
        at = left->IsLeaf() ? count : count - 1;

    KivStringT<char16_t> separator;
    if (at < count)
        separator = left->IsLeaf() ? left->EntryAt(at).name : left->ChildAt(at).separator;
    else
        separator = name.ToString();
    cow_ptr<Node> right = left->CopyOf(at, count, std::min(Node::maxElements - (count - at), 4));
    if (at < count && left.use_count() == 1)
        Node::Of(left).Truncate(at);
    else if (at < count)
        left = left->CopyOf(0, at, 1);
    const bool belongsRight = name.Compare(separator) >= 0;
    parent.Insert(index + 1, Child{std::move(separator), std::move(right)});
    return belongsRight ? index + 1 : index;
}

/// Joins the child @p index of @p parent, which is writable, with a neighbour if both are small.
/// @return the index of the child that now holds what child @p index held.
int JoinSmallChild(Node& parent, int index) {
    const auto count = [&parent](int at) { return parent.ChildAt(at).node->Count(); };
    int left = -1;
    if (count(index) > fewElements)
        return index;
    if (index + 1 < parent.Count() && count(index) + count(index + 1) <= maxJoinedElements)
        left = index;
    else if (index > 0 && count(index - 1) + count(index) <= maxJoinedElements)
        left = index - 1;
    if (left < 0)
        return index;
    Child& joined = parent.ChildAt(left);
    Child const& neighbour = parent.ChildAt(left + 1);
    const int from = count(left);
    cow_ptr<Node> copy = joined.node->CopyOf(0, from, count(left + 1));
    Node& node = Node::Of(copy);
    node.Append(*neighbour.node);
    // The neighbour's first child took all smaller names of the neighbour, down to what separates the two.
    if (!node.IsLeaf())
        node.ChildAt(from).separator = neighbour.separator;
    joined.node = std::move(copy);
    parent.Erase<Child>(left + 1, left + 2);
    return left;
}

} // namespace

/// Where in its leaf an entry is, or where it belongs.
struct EntryTable::Place {
    int index = 0;
    int leafCount = 0;
    Entry const* entry = nullptr;
};

EntryTable::Place EntryTable::FindPlace(KivStringViewT<char16_t> name) const noexcept {
    if (!top_)
        return {};
    Node const* node = top_.get();
    while (!node->IsLeaf())
        node = node->ChildAt(node->ChildFor(name)).node.get();
    const int count = node->Count();
    // Names are often added in their order.
    const int index = node->EntryAt(count - 1).name.Compare(name) < 0 ? count : node->EntryFor(name);
    const bool exists = index < count && node->EntryAt(index).name == name;
    return {index, count, exists ? &node->EntryAt(index) : nullptr};
}

Held const* EntryTable::Find(KivStringViewT<char16_t> name) const noexcept {
    Entry const* const entry = FindPlace(name).entry;
    return entry == nullptr ? nullptr : &entry->held;
}

/// The one edit of an entry: inserts it, replaces what is held or, if that is nothing, removes it.
struct EntryTable::Edit {
    KivStringViewT<char16_t> name;
    Place place;
    Entry entry;
    /// By how many entries the leaf grows: 1, 0 or -1.
    int growth = 0;
    /// What the totals grow by; where they shrink, the numbers wrap around.
    Tally difference{};
    /// Whether the packed form changes by an identifier at most.
    bool onlyShowsAnother = false;

    /// Makes the nodes from @p handle down to the leaf writable, changes the leaf and mends the totals on the way back. What
    /// can fail happens on the way down and leaves the entries as they are: nodes are copied, split where they are full,
    /// joined where they are small, so that the change itself finds room.
    // NOLINTNEXTLINE(misc-no-recursion): as deep as the table is high
    void Apply(cow_ptr<Node>& handle) {
        int at = handle->IsLeaf() ? 0 : handle->ChildFor(name);
        const bool grows = growth > 0 && (handle->IsLeaf() || handle->ChildAt(at).node->IsFull());
        Node& node = Node::Writable(handle, grows ? 1 : 0);
        if (node.IsLeaf()) {
            ChangeLeaf(node);
        } else {
            if (grows)
                at = SplitChild(node, at, name);
            else if (growth < 0)
                at = JoinSmallChild(node, at);
            cow_ptr<Node>& child = node.ChildAt(at).node;
            Apply(child);
            if (child->Count() == 0)
                node.Erase<Child>(at, at + 1);
        }
        node.AddToTotal(difference);
    }

    void ChangeLeaf(Node& leaf) noexcept {
        // A leaf that was split or joined on the way has another size.
        const int at = leaf.Count() == place.leafCount ? place.index : leaf.EntryFor(name);
        if (growth > 0)
            leaf.Insert(at, std::move(entry));
        else if (growth < 0)
            leaf.Erase<Entry>(at, at + 1);
        else
            std::swap(leaf.EntryAt(at).held, entry.held);
        if (onlyShowsAnother)
            leaf.MarkStale(at);
        else
            leaf.DropPackedRun();
    }
};

void EntryTable::Put(Place const& place, KivStringViewT<char16_t> name, KivStringT<char16_t> text, Held held) {
    Edit edit{name, place, {std::move(text), std::move(held)}};
    Entry const* const old = place.entry;
    edit.growth = (edit.entry.held.IsNothing() ? 0 : 1) - (old == nullptr ? 0 : 1);
    if (old != nullptr && CountAlike(old->held, edit.entry.held)) {
        edit.onlyShowsAnother = true;
    } else {
        edit.difference = TallyOf(name, edit.entry.held);
        if (old != nullptr)
            edit.difference -= TallyOf(name, old->held);
    }
    if (!top_)
        top_ = Node::Make(0, 1);
    if (edit.growth > 0 && top_->IsFull()) {
        cow_ptr<Node> raised = Node::Make(top_->Height() + 1, 2);
        Node::Of(raised).AddToTotal(top_->Total());
        Node::Of(raised).Insert(0, Child{{}, std::move(top_)});
        top_ = std::move(raised);
    }
    edit.Apply(top_);
    if (top_->Count() == 0)
        top_.reset();
    while (top_ && !top_->IsLeaf() && top_->Count() == 1)
        top_ = cow_ptr<Node>(top_->ChildAt(0).node);
}

template <class T>
void EntryTable::Set(KivStringViewT<char16_t> name, cow_ptr<T> child, KivStringT<char16_t> const* text) {
    const Place place = FindPlace(name);
    // An entry that is there keeps its name, which its other versions share.
    if (place.entry != nullptr)
        Put(place, name, {}, place.entry->held.With(std::move(child)));
    else
        Put(place, name, text != nullptr ? *text : name.ToString(), Held(std::move(child)));
}

template void EntryTable::Set(KivStringViewT<char16_t>, cow_ptr<Blob>, KivStringT<char16_t> const*);
template void EntryTable::Set(KivStringViewT<char16_t>, cow_ptr<Tree>, KivStringT<char16_t> const*);

void EntryTable::Erase(KivStringViewT<char16_t> name) {
    Put(FindPlace(name), name, {}, Held());
}

} // namespace KivVcs::detail
