#include "objects/DataToHash.h"
#include "tree/EntryPacker.h"

namespace KivVcs {

namespace {

using detail::Entry;
using detail::Node;

/// Smaller packed forms are put together to be hashed beside others.
constexpr std::uint64_t largestPackedAside = 65536;

struct AppendTo {
    Buffer& data;

    void operator()(auto const&... piece) const { data.Append(piece...); }
};

struct WriteTo {
    std::byte*& out;

    void operator()(const void* piece, std::size_t size) const {
        out = std::copy_n(static_cast<const std::byte*>(piece), size, out);
    }
    void operator()(Buffer const& piece) const {
        for (auto const& chunk : piece.LockForRead())
            operator()(chunk.data(), chunk.size());
    }
};

/// The packed entries of a tree without hosts' objects.
Buffer PackedInOnePiece(Node const& top) {
    return Buffer::Build(top.Total().packedSize, [&top](std::byte* out) { PackEntries(top, WriteTo{out}); });
}

/// @p data without the room that is left from appending to it.
Buffer WithoutRoom(Buffer const& data) {
    if (data.GetSize() <= detail::pieceSize)
        return data;
    return Buffer::Build(data.GetSize(), [&data](std::byte* out) {
        for (auto const& chunk : data.LockForRead())
            out = std::copy(chunk.begin(), chunk.end(), out);
    });
}

} // namespace

namespace detail {

Tally TallyOf(KivStringViewT<char16_t> name, Held const& held) noexcept {
    Tally tally;
    tally.names = held.IsNothing() ? 0 : 1;
    tally.blobs = held.HasBlob() ? 1 : 0;
    tally.trees = held.HasTree() ? 1 : 0;
    if (ShowsHostObject(held))
        tally.hosts = 1;
    else if (held.Packed() != nullptr)
        tally.packedSize = WordsFor(held).size() + PackedNameSize(name) + 1 + idLength;
    return tally;
}

bool CountAlike(Held const& left, Held const& right) noexcept {
    return left.HasBlob() == right.HasBlob() && left.HasTree() == right.HasTree() &&
           (left.Packed() == nullptr) == (right.Packed() == nullptr) && ShowsHostObject(left) == ShowsHostObject(right);
}

Buffer const& Node::PackedRun() const {
    return packedRun_
        .GetOrMake([this] {
            Buffer run;
            EntryPacker packer(AppendTo{run});
            packer.Add(*this);
            packer.Flush();
            return Run(WithoutRoom(run));
        })
        .bytes;
}

void Node::PrefetchPackedRun() const noexcept {
#if defined(__GNUC__)
    constexpr std::size_t lineSize = 64;
    Run const* const run = packedRun_.Get();
    if (run == nullptr)
        return;
    const auto bytes = *run->bytes.LockForRead().begin();
    for (std::size_t at = 0; at < std::min(bytes.size(), 4 * lineSize); at += lineSize)
        __builtin_prefetch(bytes.data() + at);
#endif
}

} // namespace detail

Id Tree::ComputeId() const {
    Node const* const top = entries_.Top().get();
    // How much a host's objects show is not known before they were asked. The data is kept, so that the identifier and a
    // packed form that is asked for later are of one state.
    if (top != nullptr && top->Total().hosts != 0)
        return ComputePackedId();
    return top == nullptr ? IdDigest("tree", 0).Finish() : trail_.ComputeId(*top);
}

void detail::TreeAccess::IdentifyByForm(Tree const& tree, Buffer const& form) {
    Node const* const top = Top(tree).get();
    // A large one computes its identifier itself, and keeps how that went on.
    if (top == nullptr || top->Total().packedSize != form.GetSize() || DigestTrail::IsFor(form.GetSize()))
        return;
    IdDigest digest("tree", form.GetSize());
    digest.Feed(form);
    DataToHash{&tree}.Identify(*digest.Finish().GetDigest());
}

void Tree::ListParts(detail::OpenObjects& parts) const {
    detail::ForEachEntry(entries_.Top().get(), [&parts](Entry const& entry) { parts.Add(entry.held.Packed()); });
}

optional<std::uint64_t> Tree::GetSizeToHash() const noexcept {
    Node const* const top = entries_.Top().get();
    const detail::Tally total = top == nullptr ? detail::Tally() : top->Total();
    // Of a large one most is packed already, and it keeps the others waiting if it is not.
    return total.hosts == 0 && total.packedSize < largestPackedAside ? optional<std::uint64_t>(total.packedSize)
                                                                     : std::nullopt;
}

void Tree::GetDataToHash(detail::DataToHash& data) const {
    data.word = "tree";
    if (Node const* const top = entries_.Top().get())
        data.own = PackedInOnePiece(*top);
}

Buffer const& Tree::GetData() const {
    return data_.GetOrMake([this] {
        Node const* const top = entries_.Top().get();
        if (top == nullptr)
            return Buffer();
        // How much hosts' objects show is not known before they were asked.
        if (!SharesRuns(*top) && top->Total().hosts == 0)
            return PackedInOnePiece(*top);
        Buffer data;
        PackEntries(*top, AppendTo{data});
        return SharesRuns(*top) ? data : WithoutRoom(data);
    });
}

} // namespace KivVcs
