#pragma once

#include "KivVcs/Helpers.h"
#include "objects/PackedForm.h"
#include "tree/Cursor.h"

#include <array>
#include <cstring>
#include <string_view>

/// How the entries of a tree are packed, piece by piece.
namespace KivVcs::detail {

/// Trees with at least this many objects keep the packed form of each leaf with the leaf, so that a version that changes one
/// entry packs one leaf anew; for smaller ones that would cost more memory than the time is worth.
inline constexpr std::uint64_t minObjectsWithKeptRuns = 128;
/// From this many objects on, the packed form of a tree shares them, too; a smaller one is sooner copied.
inline constexpr std::uint64_t minObjectsWithSharedRuns = 256;

inline bool KeepsRuns(Node const& top) noexcept {
    return top.Total().Objects() >= minObjectsWithKeptRuns;
}
inline bool SharesRuns(Node const& top) noexcept {
    return top.Total().Objects() >= minObjectsWithSharedRuns;
}

/// Mode and type of our own objects, with the blanks after them. The copy of either takes as many bytes, the shorter one's
/// terminator among them, so that it is no call.
inline constexpr std::string_view blobWords = "100644 blob ";
inline constexpr std::string_view treeWords = "40000 tree ";
inline constexpr std::size_t pieceSize = 4096;

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

inline std::size_t PackedNameSize(KivStringViewT<char16_t> name) noexcept {
    std::size_t size = 0;
    return ForEachAsciiUnit(name, [&size](char) { ++size; }) ? size : DataEncoding::Utf8Length(UntilZero(name));
}

inline char* PackName(KivStringViewT<char16_t> name, char* out) noexcept {
    char* const begin = out;
    return ForEachAsciiUnit(name, [&out](char unit) { *out++ = unit; })
               ? out
               : DataEncoding::Utf8Write(UntilZero(name), begin);
}

/// Whether a packed form shows an object of a host's class, which has to be asked what it shows.
inline bool ShowsHostObject(Held const& held) noexcept {
    Object const* const object = held.Packed();
    return object != nullptr && object->IsOfHostClass() && object->GetKnownDigest() == nullptr;
}

inline std::string_view WordsFor(Held const& held) noexcept {
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
        out = WriteId(*object, out);
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

    /// Packs a leaf without hosts' objects as the run that is kept with it shows it; what entries have come to show since then
    /// is written anew.
    void AddRun(Node const& leaf) {
        Buffer const& run = leaf.PackedRun();
        std::uint32_t stale = leaf.StaleEntries();
        if (stale == 0)
            return Add(run);
        Flush();
        const auto bytes = *run.LockForRead().begin();
        const auto* const begin = reinterpret_cast<const char*>(bytes.data());
        std::size_t taken = 0;
        std::size_t at = 0;
        for (Entry const& entry : leaf.Entries()) {
            Object const* const object = entry.held.Packed();
            if (object != nullptr) {
                at = std::string_view(begin, bytes.size()).find('\0', at) + 1;
                if ((stale & 1U) != 0) {
                    take_(begin + taken, at - taken);
                    WriteId(*object, bytes_.data());
                    take_(bytes_.data(), idLength);
                    taken = at + idLength;
                }
                at += idLength;
            }
            stale >>= 1U;
        }
        take_(begin + taken, bytes.size() - taken);
    }

    void Add(Buffer const& packed) {
        Flush();
        take_(packed);
    }

    void Flush() { take_(bytes_.data(), std::exchange(used_, 0)); }

private:
    static char* WriteId(Object const& object, char* out) {
        Id::Digest const* const known = object.GetKnownDigest();
        // NOLINTNEXTLINE(clang-analyzer-core.NonNullParamChecker): an identifier that is computed is a digest
        return WriteDigits(known == nullptr ? *object.GetId().GetDigest() : *known, out);
    }

    Take take_;
    std::size_t used_ = 0;
    std::array<char, pieceSize> bytes_;
};

/// Hands the packed form of the entries below @p top, in order, to @p take: of all, or from the leaf on that @p cursor is at.
template <class Take>
void PackEntries(Node const& top, Cursor cursor, Take take) {
    const bool keepsRuns = KeepsRuns(top);
    EntryPacker packer(take);
    while (!cursor.AtEnd()) {
        Node const& leaf = cursor.Leaf();
        cursor.NextLeaf();
        // What hosts' objects show is theirs to say, each time.
        if (!keepsRuns || leaf.Total().hosts != 0) {
            packer.Add(leaf);
            continue;
        }
        // A run lies anywhere in memory, so that the next one is better on its way while this one is hashed.
        if (!cursor.AtEnd())
            cursor.Leaf().PrefetchPackedRun();
        packer.AddRun(leaf);
    }
    packer.Flush();
}

template <class Take>
void PackEntries(Node const& top, Take take) {
    PackEntries(top, Cursor(&top), take);
}

} // namespace KivVcs::detail
