#pragma once

/// @file
/// Large contents, which databases store in pieces.

#include "Bytes.h"
#include "Changes.h"
#include "Items.h"
#include "Parallel.h"

#include <algorithm>
#include <optional>

namespace KivArchive {

/// How many pieces are stored in one transaction.
inline constexpr std::size_t piecesAtOnce = 8;

/// Reads a content piece by piece, and identifies it on the way.
class PieceReader {
public:
    PieceReader(StreamIO& content, std::uint64_t size)
        : content_(content), rest_(size), digest_(BeginPackedForm(ObjectType::Blob, size)) {}

    /// The next piece; empty at the end, and nothing if it cannot be read.
    [[nodiscard]] std::optional<Buffer> Next() {
        std::uint64_t const size = std::min(rest_, largestWholeContent);
        bool isRead = true;
        Buffer piece = Buffer::Build(size, [&](std::byte* bytes) { isRead = content_.Read(bytes, size); });
        if (!isRead)
            return std::nullopt;
        rest_ -= size;
        ByteView const bytes = BytesOf(piece);
        digest_.InitData(bytes.data(), bytes.size());
        return piece;
    }

    [[nodiscard]] bool IsAtEnd() const noexcept { return rest_ == 0; }

    [[nodiscard]] Id Finish() {
        Id::Digest bytes{};
        digest_.FinalDigest(bytes.data());
        return Id::FromDigest(bytes);
    }

private:
    StreamIO& content_;
    std::uint64_t rest_;
    KivVcs::SHADigest256 digest_;
};

/// How many bytes of a content are still to be read.
[[nodiscard]] inline std::uint64_t RestOf(StreamIO& content) {
    return content.GetSize() - std::min(content.GetSize(), content.GetPosition());
}

/// Adds a piece to the list of pieces, which is the stored form of a large content.
inline void AppendDigest(Buffer& list, Id const& id) {
    list.Append(DigestOf(id).data(), DigestOf(id).size());
}

/// The pieces that a list names. @throws Malformed
inline std::vector<Id> ReadDigests(ByteView list) {
    std::vector<Id> pieces;
    for (ByteReader digests(list); !digests.Rest().empty();) {
        Id::Digest digest{};
        ByteView const bytes = digests.Take(digest.size());
        std::copy(bytes.begin(), bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
        pieces.push_back(Id::FromDigest(digest));
    }
    return pieces;
}

/// Stores a content: a large one as pieces, some at a time, and then as the list of them.
/// @param earlierPieces those of the content that this one replaces
/// @param workers how many threads hash pieces; 0 stands for as many as there are processors
/// @param file named by failures
/// @param store stores items, along with a change that names what they rely on
/// @return false if the content cannot be read to its end, or is not what @p id says
template <class Store>
[[nodiscard]] bool StoreInPieces(Id const& id, StreamIO& content, Id const& earlier,
                                 std::vector<Id> const& earlierPieces, unsigned workers, std::string const& file,
                                 IProgress* progress, Store store) {
    std::uint64_t const size = RestOf(content);
    bool const isLarge = size > largestWholeContent;
    PieceReader pieces(content, size);
    Item whole{id, isLarge ? StoredType::LargeBlob : StoredType::Blob, size, {}, isLarge ? Id() : earlier};
    Change last;
    std::vector<Item> window;
    Compressor unused;
    auto const storeWindow = [&] {
        ForEachInParallel(window.size(), workers, unused, [&window](std::size_t index, Compressor&) {
            window[index].id = DigestOfBytes(BytesOf(window[index].data));
        });
        for (Item const& piece : window) {
            AppendDigest(whole.data, piece.id);
            last.relied.push_back(piece.id);
        }
        store(window, Change());
        window.clear();
    };
    for (std::uint64_t number = 0; !pieces.IsAtEnd(); ++number) {
        ReportProgress(progress, {"storing a content", number * largestWholeContent, size}, file);
        auto piece = pieces.Next();
        if (!piece)
            return false;
        if (!isLarge) {
            whole.data = *piece;
            break;
        }
        Id const before = number < earlierPieces.size() ? earlierPieces[static_cast<std::size_t>(number)] : Id();
        window.push_back({Id(), StoredType::Piece, piece->GetSize(), *piece, before});
        if (window.size() == piecesAtOnce || pieces.IsAtEnd())
            storeWindow();
    }
    ReportProgress(progress, {"storing a content", size, size}, file);
    if (!(pieces.Finish() == id))
        return false;
    whole.data = Joined(whole.data);
    store({whole}, last);
    return true;
}

} // namespace KivArchive
