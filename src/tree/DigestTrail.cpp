#include "KivVcs/detail/DigestTrail.h"

#include "tree/EntryPacker.h"

namespace KivVcs::detail {

namespace {

constexpr std::uint64_t maximumSteps = 22;

/// How far apart the states are of a form of @p size bytes.
std::uint64_t StepOf(std::uint64_t size, std::uint64_t smallest) noexcept {
    return std::max(smallest, (size / maximumSteps + IdDigest::blockSize) / IdDigest::blockSize * IdDigest::blockSize);
}

/// Where the leaf that holds @p name, or would, begins in what @p top packs.
std::uint64_t OffsetOfLeaf(Node const& top, KivStringViewT<char16_t> name) noexcept {
    std::uint64_t offset = 0;
    for (Node const* node = &top; !node->IsLeaf();) {
        const int way = node->ChildFor(name);
        for (int index = 0; index < way; ++index)
            offset += node->ChildAt(index).node->Total().packedSize;
        node = node->ChildAt(way).node.get();
    }
    return offset;
}

/// Feeds a digest what comes after the first @p known bytes, and notes its state at every step.
class NotingDigest {
public:
    /// One that notes nothing.
    explicit NotingDigest(IdDigest& digest) noexcept : digest_(digest) {}
    NotingDigest(IdDigest& digest, std::vector<IdDigest::State>& states, std::uint64_t step,
                 std::uint64_t known) noexcept
        : digest_(digest), states_(&states), step_(step), known_(known) {}

    void FeedEntries(Node const& top, Cursor from) {
        PackEntries(top, from, [this](auto const&... piece) { Feed(piece...); });
    }

private:
    void Feed(const void* piece, std::size_t size) {
        if (states_ == nullptr)
            return digest_.Feed(piece, size);
        const auto skipped = static_cast<std::size_t>(std::min<std::uint64_t>(known_, size));
        known_ -= skipped;
        size -= skipped;
        const auto* data = static_cast<const std::byte*>(piece) + skipped;
        for (std::uint64_t left = step_ - digest_.GetFed() % step_; left <= size; left = step_) {
            digest_.Feed(data, static_cast<std::size_t>(left));
            data += left;
            size -= static_cast<std::size_t>(left);
            states_->push_back(digest_.GetState());
        }
        digest_.Feed(data, size);
    }
    void Feed(Buffer const& piece) {
        for (auto const& chunk : piece.LockForRead())
            Feed(chunk.data(), chunk.size());
    }

    IdDigest& digest_;
    std::vector<IdDigest::State>* states_ = nullptr;
    std::uint64_t step_ = 0;
    std::uint64_t known_ = 0;
};

} // namespace

DigestTrail::Trail const& DigestTrail::Begin() const {
    return trail_.GetOrMake([] { return Trail(); });
}

void DigestTrail::TryBegin() const noexcept {
    try {
        Begin();
    } catch (std::bad_alloc const&) { // NOLINT(bugprone-empty-catch)
        // The next identifier is computed from the beginning then, as this one.
    }
}

void DigestTrail::NoteChange(Node const& top, KivStringViewT<char16_t> name) noexcept {
    if (IsEmpty()) {
        // Where one entry was replaced, mostly another one will be.
        if (top.Total().packedSize >= largeForEdits)
            TryBegin();
        return;
    }
    // Only the tree that is being changed has this trail.
    auto& trail = const_cast<Trail&>(*trail_.Get());
    if (Checkpoints const* const own = trail.computed.Get()) {
        trail.handed = cow_ptr<Checkpoints>::share(own);
        trail.computed.Reset();
        trail.firstChanged = Trail().firstChanged;
    }
    trail.firstChanged = std::min(trail.firstChanged, OffsetOfLeaf(top, name));
}

Id DigestTrail::ComputeId(Node const& top) const {
    const std::uint64_t size = top.Total().packedSize;
    IdDigest digest("tree", size);
    Trail const* const trail = trail_.Get();
    if (!IsFor(size) && (trail == nullptr || size < largeForEdits)) {
        NotingDigest(digest).FeedEntries(top, Cursor(&top));
        return digest.Finish();
    }
    const std::uint64_t step = StepOf(size, smallestStep);
    const std::uint64_t headerSize = digest.GetFed();
    Checkpoints passed;
    passed.packedSize = size;
    passed.states.reserve(static_cast<std::size_t>((headerSize + size) / step));

    std::uint64_t offset = 0;
    if (trail != nullptr && trail->handed && trail->handed->packedSize == size) {
        const std::uint64_t same = std::min(trail->firstChanged, size - 1);
        auto const& states = trail->handed->states;
        const auto valid = std::min<std::uint64_t>((headerSize + same) / step, states.size());
        if (valid > 0) {
            passed.states.assign(states.begin(), states.begin() + static_cast<std::ptrdiff_t>(valid));
            digest = IdDigest(passed.states.back(), valid * step);
            offset = valid * step - headerSize;
        }
    }

    const Cursor from = Cursor::AtLeafOf(top, offset);
    NotingDigest(digest, passed.states, step, offset).FeedEntries(top, from);
    const auto take = [&passed] { return std::move(passed); };
    static_cast<void>(Begin().computed.GetOrMake(take));
    return digest.Finish();
}

} // namespace KivVcs::detail
