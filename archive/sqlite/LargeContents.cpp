#include "Pieces.h"
#include "sqlite/SqliteStore.h"

namespace KivArchive {

bool SqliteArchive::StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) {
    static_cast<void>(DigestOf(id));
    std::vector<Id> earlierPieces;
    {
        SqliteStore::Lease const connection(*store_);
        Transaction const transaction(connection->database, Transaction::Kind::Read);
        auto const row = earlier.IsEmpty() ? std::nullopt : FindRow(connection->database, earlier);
        FormReader reader(*connection, store_->cache);
        try {
            if (row && row->type == StoredType::LargeBlob)
                earlierPieces = SqliteStore::PiecesOf(reader, *row);
        } catch (Malformed const&) {
            earlierPieces.clear();
        }
    }
    return StoreInPieces(id, content, earlier, earlierPieces, store_->options.workers, store_->path, progress,
                         [this](std::vector<Item> const& items, Change const& change) {
                             static_cast<void>(store_->Store(items, change));
                         });
}

} // namespace KivArchive
