#include "tree/Node.h"

#include <bit>

namespace KivVcs::detail {

// NOLINTNEXTLINE(misc-redundant-expression): that both sides are the same number is what is claimed
static_assert(sizeof(Entry) == sizeof(Child) && alignof(Entry) == alignof(Child));
static_assert(sizeof(Node) % alignof(Entry) == 0);

namespace {

std::size_t BytesFor(int capacity) noexcept {
    return sizeof(Node) + static_cast<std::size_t>(capacity) * sizeof(Entry);
}

} // namespace

Tally& Tally::operator+=(Tally const& other) noexcept {
    names += other.names;
    blobs += other.blobs;
    trees += other.trees;
    hosts += other.hosts;
    packedSize += other.packedSize;
    return *this;
}

Tally& Tally::operator-=(Tally const& other) noexcept {
    names -= other.names;
    blobs -= other.blobs;
    trees -= other.trees;
    hosts -= other.hosts;
    packedSize -= other.packedSize;
    return *this;
}

cow_ptr<Node> Node::Make(int height, int capacity) {
    void* const memory = std::allocator<std::byte>().allocate(BytesFor(capacity));
    return cow_ptr<Node>::share(::new (memory) Node(height, capacity));
}

Node::~Node() {
    IsLeaf() ? Erase<Entry>(0, count_) : Erase<Child>(0, count_);
}

namespace {

/// Gives up what is held. The result is what was below a subtree that nobody else held; that tree was whole until its
/// destructor had run.
cow_ptr<Node> EntriesOfLast(Held& held) noexcept {
    const std::unique_ptr<Tree> last = held.GiveUp().release_if_last();
    return last == nullptr ? nullptr : TreeAccess::Top(*last);
}

} // namespace

void Node::operator delete(Node* node, std::destroying_delete_t) noexcept {
    // The nodes whose last owner is gone.
    Node* dying = node;
    node->nextDying_ = nullptr;
    const auto giveUp = [&dying](cow_ptr<Node> share) {
        if (Node* const last = share.release_if_last().release())
            last->nextDying_ = std::exchange(dying, last);
    };
    while ((node = dying) != nullptr) {
        dying = node->nextDying_;
        if (node->IsLeaf()) {
            for (Entry& entry : node->Entries()) {
                if (entry.held.HasTree())
                    giveUp(EntriesOfLast(entry.held));
            }
        } else {
            for (Child& child : node->Children())
                giveUp(std::move(child.node));
        }
        const std::size_t bytes = BytesFor(node->capacity_);
        node->~Node();
        std::allocator<std::byte>().deallocate(reinterpret_cast<std::byte*>(node), bytes);
    }
}

template <class Element>
void Node::Take(std::span<Element> elements) noexcept {
    using Taken = std::remove_const_t<Element>;
    auto* const end = Elements<Taken>().data() + count_;
    if constexpr (std::is_const_v<Element>)
        std::uninitialized_copy(elements.begin(), elements.end(), end);
    else
        std::uninitialized_move(elements.begin(), elements.end(), end);
    count_ = static_cast<std::uint8_t>(count_ + elements.size());
}

template <class Element>
cow_ptr<Node> Node::MakeOf(int height, std::span<Element> elements) {
    cow_ptr<Node> made = Make(height, static_cast<int>(elements.size()));
    Of(made).Take(elements);
    Of(made).CountTotal();
    return made;
}

template cow_ptr<Node> Node::MakeOf(int, std::span<Entry>);
template cow_ptr<Node> Node::MakeOf(int, std::span<Child>);

Node& Node::Of(cow_ptr<Node>& handle) noexcept {
    // Only handles give access to nodes, so that the only one may change its node.
    return const_cast<Node&>(*handle);
}

cow_ptr<Node> Node::CopyOf(int from, int to, int room) const {
    cow_ptr<Node> copy = Make(height_, to - from + room);
    Node& node = Of(copy);
    const auto first = static_cast<std::size_t>(from);
    const auto count = static_cast<std::size_t>(to - from);
    IsLeaf() ? node.Take(Entries().subspan(first, count)) : node.Take(Children().subspan(first, count));
    if (to - from == count_) {
        node.total_ = total_;
        node.packedRun_ = packedRun_;
        node.staleEntries_ = staleEntries_;
    } else {
        node.CountTotal();
    }
    return copy;
}

Node& Node::Writable(cow_ptr<Node>& handle, int room) {
    Node& node = Of(handle);
    const int count = node.count_;
    if (handle.use_count() > 1) {
        // A version that is shared is likely to be shared again at once, so it gets no spare room; one that is being
        // built does.
        handle = node.CopyOf(0, count, room);
    } else if (node.capacity_ - count < room) {
        const int spare = std::clamp(count, std::min(4, maxElements - count), maxElements - count);
        cow_ptr<Node> larger = Make(node.height_, count + spare);
        node.IsLeaf() ? Of(larger).Take(node.Entries()) : Of(larger).Take(node.Children());
        Of(larger).total_ = node.total_;
        handle = std::move(larger);
    }
    return Of(handle);
}

int Node::ChildFor(KivStringViewT<char16_t> name) const noexcept {
    const auto children = Children();
    const auto after = std::upper_bound(
        children.begin() + 1, children.end(), name,
        [](KivStringViewT<char16_t> wanted, Child const& child) { return wanted.Compare(child.separator) < 0; });
    return static_cast<int>(after - children.begin()) - 1;
}

int Node::EntryFor(KivStringViewT<char16_t> name) const noexcept {
    const auto entries = Entries();
    const auto found =
        std::lower_bound(entries.begin(), entries.end(), name, [](Entry const& entry, KivStringViewT<char16_t> wanted) {
            return entry.name.Compare(wanted) < 0;
        });
    return static_cast<int>(found - entries.begin());
}

template <class Element>
void Node::Insert(int index, Element element) noexcept {
    auto* const elements = Elements<Element>().data();
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
void Node::Erase(int from, int to) noexcept {
    auto* const elements = Elements<Element>().data();
    Element* const end = std::move(elements + to, elements + count_, elements + from);
    std::destroy(end, elements + count_);
    count_ = static_cast<std::uint8_t>(end - elements);
}

template void Node::Insert(int, Entry) noexcept;
template void Node::Insert(int, Child) noexcept;
template void Node::Erase<Entry>(int, int) noexcept;
template void Node::Erase<Child>(int, int) noexcept;

void Node::Truncate(int from) noexcept {
    if (IsLeaf())
        Erase<Entry>(from, count_);
    else
        Erase<Child>(from, count_);
    DropPackedRun();
    CountTotal();
}

void Node::MarkStale(int index) noexcept {
    // With too many of them, another run is worth its memory.
    constexpr int maximumStale = 8;
    staleEntries_ |= 1U << static_cast<unsigned>(index);
    if (std::popcount(staleEntries_) > maximumStale)
        DropPackedRun();
}

void Node::Append(Node const& other) noexcept {
    DropPackedRun();
    IsLeaf() ? Take(other.Entries()) : Take(other.Children());
    total_ += other.total_;
}

void Node::CountTotal() noexcept {
    total_ = {};
    if (IsLeaf()) {
        for (Entry const& entry : Entries())
            total_ += TallyOf(entry.name, entry.held);
    } else {
        for (Child const& child : Children())
            total_ += child.node->total_;
    }
}

} // namespace KivVcs::detail
