#include "tree/Node.h"

#include <array>

namespace KivVcs::detail {

namespace {

/// Fewer elements than this make a node a candidate for being joined with its neighbour, up to the size below, so that
/// the joined node does not split again at the next insertion.
constexpr int fewElements = Node::mostElements / 4;
constexpr int mostJoinedElements = Node::mostElements * 3 / 4;

/// The nodes from the top of a table down to a leaf, each with the index of the child that leads on.
class Descent {
public:
    struct Step {
        Node* node;
        int child;
    };

    void Add(Node& node, int child) noexcept { steps_[length_++] = {&node, child}; }
    [[nodiscard]] Node& Leaf() const noexcept { return *steps_[length_ - 1].node; }

    void AddToTotals(Tally const& added, Tally const& removed) const noexcept {
        for (std::size_t index = 0; index < length_; ++index)
            steps_[index].node->AddToTotal(added, removed);
    }

    /// Removes the nodes without elements, but for the topmost.
    void RemoveEmptied() noexcept {
        for (; length_ > 1 && Leaf().Count() == 0; --length_) {
            Step const& above = steps_[length_ - 2];
            above.node->Erase<Child>(above.child, above.child + 1);
        }
    }

private:
    std::array<Step, Node::greatestHeight> steps_;
    std::size_t length_ = 0;
};

/// Splits the full child @p index of @p parent, which is writable and has room, so that @p name can be inserted below:
/// in the middle, or at its end for a new last name, so that names added in ascending order fill their nodes.
void SplitChild(Node& parent, int index, KivStringViewT<char16_t> name) {
    cow_ptr<Node>& left = parent.ChildAt(index).node;
    const int count = left->Count();
    int at = count / 2;
    if (left->IsLeaf() ? name.Compare(left->EntryAt(count - 1).name) > 0 : left->ChildFor(name) == count - 1)
        at = left->IsLeaf() ? count : count - 1;

    KivStringT<char16_t> separator;
    if (at == count)
        separator = name.ToString();
    else
        separator = left->IsLeaf() ? left->EntryAt(at).name : left->ChildAt(at).separator;
    cow_ptr<Node> right = left->CopyOf(at, count, std::min(Node::mostElements - (count - at), 4));
    if (at < count && left.use_count() == 1)
        Node::Of(left).Truncate(at);
    else if (at < count)
        left = left->CopyOf(0, at, 1);
    parent.Insert(index + 1, Child{std::move(separator), std::move(right)});
}

/// Joins the child @p index of @p parent, which is writable, with a neighbour if both are small.
/// @return the index of the child that now holds what child @p index held.
int JoinSmallChild(Node& parent, int index) {
    const auto count = [&parent](int at) { return parent.ChildAt(at).node->Count(); };
    int left = -1;
    if (count(index) > fewElements)
        return index;
    if (index + 1 < parent.Count() && count(index) + count(index + 1) <= mostJoinedElements)
        left = index;
    else if (index > 0 && count(index - 1) + count(index) <= mostJoinedElements)
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

/// Makes the way from @p top to the leaf for @p name writable, for an edit by which that leaf grows by @p growth entries:
/// 1, 0 or -1. Everything that can fail happens here and leaves the entries as they are: nodes are copied, split where
/// they are full, joined where they are small, so that the edit itself finds room.
Descent OpenWay(cow_ptr<Node>& top, KivStringViewT<char16_t> name, int growth) {
    if (!top)
        top = Node::Make(0, 1);
    if (growth > 0 && top->IsFull()) {
        cow_ptr<Node> raised = Node::Make(top->Height() + 1, 2);
        Node& node = Node::Of(raised);
        node.AddToTotal(top->Total(), {});
        node.Insert(0, Child{{}, std::move(top)});
        top = std::move(raised);
    }
    Descent descent;
    cow_ptr<Node>* handle = &top;
    while (!(*handle)->IsLeaf()) {
        int index = (*handle)->ChildFor(name);
        const bool splits = growth > 0 && (*handle)->ChildAt(index).node->IsFull();
        Node& node = Node::Writable(*handle, splits ? 1 : 0);
        if (splits) {
            SplitChild(node, index, name);
            index = node.ChildFor(name);
        } else if (growth < 0) {
            index = JoinSmallChild(node, index);
        }
        descent.Add(node, index);
        handle = &node.ChildAt(index).node;
    }
    descent.Add(Node::Writable(*handle, std::max(growth, 0)), 0);
    return descent;
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

void EntryTable::Put(Place const& place, KivStringViewT<char16_t> name, KivStringT<char16_t> text, Held held) {
    int growth = 1;
    Tally added;
    Tally removed;
    if (place.entry != nullptr)
        growth = held.IsNothing() ? -1 : 0;
    if (growth != 0 || !CountAlike(held, place.entry->held)) {
        added = TallyOf(name, held);
        removed = growth > 0 ? Tally() : TallyOf(name, place.entry->held);
    }
    Descent descent = OpenWay(top_, name, growth);

    Node& leaf = descent.Leaf();
    // A leaf that was split or joined on the way has another size.
    const int index = leaf.Count() == place.leafCount ? place.index : leaf.EntryFor(name);
    if (growth > 0)
        leaf.Insert(index, Entry{std::move(text), std::move(held)});
    else if (growth < 0)
        leaf.Erase<Entry>(index, index + 1);
    else
        std::swap(leaf.EntryAt(index).held, held);
    leaf.DropPackedRun();
    if (added.names != 0 || removed.names != 0)
        descent.AddToTotals(added, removed);

    descent.RemoveEmptied();
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
