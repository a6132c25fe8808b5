#include "Pieces.h"
#include "postgres/Forms.h"
#include "postgres/Store.h"

namespace KivArchive {

using namespace Postgres;

namespace {

constexpr std::uint64_t anySize = UINT64_MAX / 2;

/// The pieces of a large content; none if @p id is no such one, or damaged.
std::vector<Id> FindPieces(Connection& connection, Id const& id) {
    if (id.IsEmpty())
        return {};
    Forms forms;
    forms.Read(connection, {&id, 1}, anySize);
    Row const* const row = forms.Find(id);
    if (row == nullptr || row->type != StoredType::LargeBlob)
        return {};
    try {
        return ReadDigests(forms.FormOf(id, connection.compressor).bytes);
    } catch (Malformed const&) {
        return {};
    }
}

/// The part of @p data, which begins at @p begin in the content, that lies between @p from and @p to.
void AppendPart(Buffer& content, ByteView data, std::uint64_t begin, std::uint64_t from, std::uint64_t to) {
    from = std::max(from, begin);
    to = std::min(to, begin + data.size());
    if (from < to)
        content.Append(data.data() + (from - begin), to - from);
}

Buffer ReadPieces(Connection& connection, ByteView list, std::uint64_t from, std::uint64_t to) {
    std::vector<Id> const all = ReadDigests(list);
    std::uint64_t const first = std::min<std::uint64_t>(from / largestWholeContent, all.size());
    std::uint64_t const last = std::min<std::uint64_t>((to - 1) / largestWholeContent + 1, all.size());
    Buffer content;
    for (std::uint64_t begin = first; begin < last; begin += piecesAtOnce) {
        std::span<const Id> const window(all.data() + begin,
                                         static_cast<std::size_t>(std::min<std::uint64_t>(piecesAtOnce, last - begin)));
        Forms forms;
        forms.Read(connection, window, anySize);
        for (std::size_t i = 0; i < window.size(); ++i) {
            Form const form = forms.FormOf(window[i], connection.compressor);
            if (!(DigestOfBytes(form.bytes) == window[i]))
                throw Malformed();
            AppendPart(content, form.bytes, (begin + i) * largestWholeContent, from, to);
        }
    }
    return content;
}

} // namespace

bool PostgresArchive::StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) {
    static_cast<void>(DigestOf(id));
    std::vector<Id> const earlierPieces =
        RestOf(content) > largestWholeContent
            ? store_->Run([&](Connection& connection) { return FindPieces(connection, earlier); })
            : std::vector<Id>();
    return StoreInPieces(id, content, earlier, earlierPieces, store_->Options().workers, store_->Shown(), progress,
                         [this](std::vector<Item> const& items, Change const& change) {
                             static_cast<void>(store_->Apply(items, change));
                         });
}

std::optional<Buffer> PostgresArchive::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    static_cast<void>(DigestOf(id));
    std::uint64_t const end = offset > UINT64_MAX - size ? UINT64_MAX : offset + size;
    return store_->Run([&](Connection& connection) -> std::optional<Buffer> {
        Forms forms;
        forms.Read(connection, {&id, 1}, anySize);
        Row const* const row = forms.Find(id);
        bool const isContent =
            row != nullptr && IsObject(*row) && (row->type == StoredType::Blob || row->type == StoredType::LargeBlob);
        if (!isContent)
            return std::nullopt;
        Form const form = forms.FormOf(id, connection.compressor);
        if (row->type == StoredType::LargeBlob)
            return end > offset ? ReadPieces(connection, form.bytes, offset, end) : Buffer();
        if (!(Identify(ObjectType::Blob, form.bytes) == id))
            throw Malformed();
        Buffer content;
        AppendPart(content, form.bytes, 0, offset, end);
        return content;
    });
}

} // namespace KivArchive
