#include "ExchangedHeads.h"

#include "Bytes.h"
#include "Changes.h"

#include <algorithm>

namespace KivArchive {

namespace {

constexpr const char16_t* prefix = u"exchanged/";

/// Appends a digest; zeros for null.
void AppendId(Buffer& value, Id const& id) {
    Id::Digest const digest = id.IsEmpty() ? Id::Digest{} : DigestOf(id);
    value.Append(digest.data(), digest.size());
}

Id TakeId(ByteReader& reader) {
    Id::Digest digest{};
    ByteView const bytes = reader.Take(digest.size());
    std::copy(bytes.begin(), bytes.end(), std::as_writable_bytes(std::span(digest)).begin());
    return digest == Id::Digest{} ? Id() : Id::FromDigest(digest);
}

} // namespace

Record RecordOf(ExchangedHead const& head) {
    Buffer value;
    AppendId(value, head.commit);
    AppendId(value, head.tree);
    return {KivStringT<char16_t>(prefix) + head.branch, std::move(value)};
}

std::vector<ExchangedHead> ReadExchangedHeads(IArchive& archive) {
    std::vector<KivStringT<char16_t>> names = archive.ListRecords();
    std::erase_if(names, [](KivStringT<char16_t> const& name) { return !name.StartsWith(prefix); });
    std::vector<ExchangedHead> heads;
    for (Record const& record : archive.ReadRecords(names)) {
        Buffer const value = Joined(record.value.value_or(Buffer()));
        ByteReader reader(BytesOf(value));
        constexpr std::size_t expected = 2 * std::tuple_size_v<Id::Digest>;
        // A host may have made a record with such a name.
        if (reader.Rest().size() != expected)
            continue;
        ExchangedHead head;
        head.branch = record.name.Mid(KivStringViewT<char16_t>(prefix).GetLength());
        head.commit = TakeId(reader);
        head.tree = TakeId(reader);
        heads.push_back(std::move(head));
    }
    return heads;
}

} // namespace KivArchive
