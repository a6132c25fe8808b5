#pragma once

/// @file
/// Contents in pieces, as archives on disks and servers store the large ones.

#include "Bytes.h"
#include "Changes.h"

#include <algorithm>
#include <optional>

namespace KivArchive {

/// How many pieces are stored in one transaction.
inline constexpr std::size_t piecesAtOnce = 8;

/// Reads a content piece by piece, and says in the end whether it is the one expected.
class PieceReader {
public:
    PieceReader(StreamIO& content, std::uint64_t size)
        : content_(content), rest_(size), digest_(BeginPackedForm(ObjectType::Blob, size)) {}

    /// The next piece; empty at the end, and none if it cannot be read.
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

/// Adds a piece to the stored form of the content that it belongs to.
inline void AppendDigest(Buffer& list, Id const& id) {
    list.Append(DigestOf(id).data(), DigestOf(id).size());
}

/// The pieces of a content, of its stored form. @throws Malformed
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

} // namespace KivArchive
