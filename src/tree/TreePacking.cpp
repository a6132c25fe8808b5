#include "KivVcs/Helpers.h"
#include "objects/DataToHash.h"
#include "objects/PackedForm.h"
#include "tree/Cursor.h"

#include <array>
#include <cstring>
#include <string_view>

namespace KivVcs {

namespace {

using detail::Cursor;
using detail::Entry;
using detail::Held;
using detail::Node;

/// Trees with at least this many objects keep the packed form of each leaf with the leaf, so that a version that changes one
/// entry packs one leaf anew; for smaller ones that would cost more memory than the entries themselves.
constexpr std::uint64_t minObjectsWithKeptRuns = 256;

bool KeepsRuns(Node const& top) noexcept {
    return top.Total().Objects() >= minObjectsWithKeptRuns;
}

/// Mode and type of our own objects, with the blanks behind them. The copy of either takes as many bytes, the shorter one's
/// terminator among them, so that it is no call.
constexpr std::string_view blobWords = "100644 blob ";
constexpr std::string_view treeWords = "40000 tree ";
constexpr std::size_t pieceSize = 4096;
/// Smaller packed forms are put together to be hashed beside others.
constexpr std::uint64_t largestPackedAside = 65536;
constexpr std::size_t idLength = 2 * std::tuple_size_v<Id::Digest>;

/// Hands the code units of a name to @p take as a packed form shows them, up to the first U+0000.
/// @return false, at the first code unit that is not ASCII
template <class Take>
bool ForEachAsciiUnit(KivStringViewT<char16_t> name, Take take) noexcept {
    for (const char16_t unit : name) {
        if (static_cast<char16_t>(unit - 1) >= 0x7F)
            return unit == 0;
        take(static_cast<char>(unit));
    }
    return true;
}

KivStringViewT<char16_t> UntilZero(KivStringViewT<char16_t> text) noexcept {
    const char16_t* const end = std::find(text.begin(), text.end(), u'\0');
    return text.Left(static_cast<int>(end - text.begin()));
}

std::size_t PackedNameSize(KivStringViewT<char16_t> name) noexcept {
    std::size_t size = 0;
    return ForEachAsciiUnit(name, [&size](char) { ++size; }) ? size : DataEncoding::Utf8Length(UntilZero(name));
}

char* PackName(KivStringViewT<char16_t> name, char* out) noexcept {
    char* const begin = out;
    return ForEachAsciiUnit(name, [&out](char unit) { *out++ = unit; })
               ? out
               : DataEncoding::Utf8Write(UntilZero(name), begin);
}

/// Whether a packed form shows an object of a host's class.
bool ShowsHostObject(Held const& held) noexcept {
    Object const* const object = held.Packed();
    return object != nullptr && object->IsOfHostClass();
}

std::string_view WordsFor(Held const& held) noexcept {
    return held.HasBlob() ? blobWords : treeWords;
}

/// Packs entries and hands their bytes on in pieces, to a `take` that is given an address and a size, or a buffer.
template <class Take>
class EntryPacker {
public:
    explicit EntryPacker(Take take) noexcept : take_(take) {}

    /// Packs an entry of one of our own objects, which always shows the same words and the digits of its digest.
    void Add(Entry const& entry) {
        Object const* const object = entry.held.Packed();
        if (object == nullptr)
            return;
        const std::size_t size = blobWords.size() + 3 * static_cast<std::size_t>(entry.name.GetLength()) + 1 + idLength;
        if (size > bytes_.size())
            return AddAsking(entry.name, *object);
        if (size > bytes_.size() - used_)
            Flush();
        const std::string_view words = WordsFor(entry.held);
        char* out = bytes_.data() + used_;
        std::memcpy(out, words.data(), blobWords.size());
        out = PackName(entry.name, out + words.size());
        *out++ = '\0';
        Id::Digest const* const known = object->GetKnownDigest();
        // NOLINTNEXTLINE(clang-analyzer-core.NonNullParamChecker): an identifier that is computed is a digest
        out = WriteDigits(known == nullptr ? *object->GetId().GetDigest() : *known, out);
        used_ = static_cast<std::size_t>(out - bytes_.data());
    }

    /// Packs any entry, asking its object what to show.
    void AddAsking(KivStringViewT<char16_t> name, Object const& object) {
        Buffer packed;
        Helpers::AppendToBuffer(packed, object.GetStoragePrefix());
        packed.Append(" ", 1);
        Helpers::AppendToBuffer(packed, object.GetHeader());
        packed.Append(" ", 1);
        Helpers::AppendToBuffer(packed, name);
        packed.Append("", 1);
        Helpers::AppendToBuffer(packed, KivStringViewT<char16_t>(object.GetId().GetText()));
        Add(packed);
    }

    void Add(Node const& leaf) {
        for (Entry const& entry : leaf.Entries()) {
            if (leaf.Total().hosts != 0 && ShowsHostObject(entry.held))
                AddAsking(entry.name, *entry.held.Packed());
            else
                Add(entry);
        }
    }

    void Add(Buffer const& packed) {
        Flush();
        take_(packed);
    }

    void Flush() { take_(bytes_.data(), std::exchange(used_, 0)); }

private:
    Take take_;
    std::size_t used_ = 0;
    std::array<char, pieceSize> bytes_;
};

/// Hands the packed form of all entries below @p top, in order, to @p take.
template <class Take>
void PackEntries(Node const& top, Take take) {
    const bool keepsRuns = KeepsRuns(top);
    EntryPacker packer(take);
    for (Cursor cursor(&top); !cursor.AtEnd(); cursor.NextLeaf()) {
        Node const& leaf = cursor.Leaf();
        // What hosts' objects show is theirs to say, each time.
        if (keepsRuns && leaf.Total().hosts == 0)
            packer.Add(leaf.PackedRun());
        else
            packer.Add(leaf);
    }
    packer.Flush();
}

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

/// @p data without the room that is left from appending to it.
Buffer WithoutRoom(Buffer const& data) {
    if (data.GetSize() <= pieceSize)
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
    return packedRun_.GetOrMake([this] {
        Buffer run;
        EntryPacker packer(AppendTo{run});
        packer.Add(*this);
        packer.Flush();
        return WithoutRoom(run);
    });
}

} // namespace detail

Id Tree::ComputeId() const {
    Node const* const top = entries_.Top().get();
    // How much a host's objects show is not known before they were asked. The data is kept, so that the identifier and a
    // packed form that is asked for later are of one state.
    if (top != nullptr && top->Total().hosts != 0)
        return ComputePackedId();
    IdDigest digest("tree", top == nullptr ? 0 : top->Total().packedSize);
    if (top != nullptr)
        PackEntries(*top, [&digest](auto const&... piece) { digest.Feed(piece...); });
    return digest.Finish();
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
        data.own = Buffer::Build(top->Total().packedSize, [top](std::byte* out) { PackEntries(*top, WriteTo{out}); });
}

Buffer const& Tree::GetData() const {
    return data_.GetOrMake([this] {
        Buffer data;
        if (!IsEmpty())
            PackEntries(*entries_.Top(), AppendTo{data});
        // Runs that are kept are shared.
        return IsEmpty() || KeepsRuns(*entries_.Top()) ? data : WithoutRoom(data);
    });
}

} // namespace KivVcs
