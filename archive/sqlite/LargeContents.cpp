#include "Pieces.h"
#include "sqlite/SqliteStore.h"

namespace KivArchive {

bool SqliteArchive::StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) {
    static_cast<void>(DigestOf(id));
    std::uint64_t const size = content.GetSize() - std::min(content.GetSize(), content.GetPosition());
    std::vector<Id> earlierPieces;
    {
        SqliteStore::Lease const connection(*store_);
        auto const row = earlier.IsEmpty() ? std::nullopt : FindRow(connection->database, earlier);
        FormReader reader(*connection, store_->cache);
        try {
            if (row && row->type == StoredType::LargeBlob)
                earlierPieces = SqliteStore::PiecesOf(reader, *row);
        } catch (Malformed const&) {
            earlierPieces.clear();
        }
    }
    PieceReader pieces(content, size);
    bool const isLarge = size > largestWholeContent;
    Item whole{id, isLarge ? StoredType::LargeBlob : StoredType::Blob, size, {}, isLarge ? Id() : earlier};
    Change last;
    std::vector<Item> window;
    for (std::uint64_t number = 0; !pieces.IsAtEnd(); ++number) {
        ReportProgress(progress, {"storing a content", number * largestWholeContent, size}, store_->path);
        auto piece = pieces.Next();
        if (!piece)
            return false;
        if (!isLarge) {
            whole.data = *piece;
            break;
        }
        Id digest = DigestOfBytes(BytesOf(*piece));
        AppendDigest(whole.data, digest);
        last.relied.push_back(digest);
        Id const before = number < earlierPieces.size() ? earlierPieces[static_cast<std::size_t>(number)] : Id();
        window.push_back({std::move(digest), StoredType::Piece, piece->GetSize(), *piece, before});
        if (window.size() == piecesAtOnce || pieces.IsAtEnd()) {
            static_cast<void>(store_->Store(window, {}));
            window.clear();
        }
    }
    ReportProgress(progress, {"storing a content", size, size}, store_->path);
    if (!(pieces.Finish() == id))
        return false;
    whole.data = Joined(whole.data);
    static_cast<void>(store_->Store({whole}, last));
    return true;
}

} // namespace KivArchive
