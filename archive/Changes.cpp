#include "Changes.h"

#include <algorithm>
#include <string_view>

namespace KivArchive {

namespace {

std::string TextOf(Id const& id) {
    std::string text;
    for (char16_t const unit : KivStringViewT<char16_t>(id.GetText()))
        text += static_cast<char>(unit);
    return text;
}

void CheckOptional(Id const& id) {
    if (!id.IsEmpty())
        static_cast<void>(DigestOf(id));
}

void CheckRecord(std::optional<Buffer> const& value, std::string const& file) {
    if (value && value->GetSize() > largestRecord)
        throw ArchiveError(Failure::Unrepresentable, file, "A record of more than 16 MiB cannot be stored.");
}

} // namespace

Id::Digest const& DigestOf(Id const& id) {
    Id::Digest const* const digest = id.GetDigest();
    if (digest == nullptr)
        throw std::invalid_argument("an identifier of an archive is a digest");
    return *digest;
}

void CheckChange(Change const& change, std::string const& file) {
    for (NewObject const& object : change.objects) {
        static_cast<void>(DigestOf(object.id));
        if (object.type == ObjectType::Blob && object.data.GetSize() > largestWholeContent)
            throw ArchiveError(Failure::Unrepresentable, file,
                               "The content " + TextOf(object.id) + " is too large to be stored in one piece.");
    }
    for (Id const& id : change.relied)
        static_cast<void>(DigestOf(id));
    for (Ancestry const& facts : change.ancestry) {
        static_cast<void>(DigestOf(facts.commit));
        CheckOptional(facts.parent);
        CheckOptional(facts.tree);
        for (ContainedCommit const& contained : facts.contains)
            static_cast<void>(DigestOf(contained.id));
    }
    for (BranchMove const& move : change.branches) {
        CheckOptional(move.expected);
        CheckOptional(move.head);
    }
    for (RecordChange const& record : change.records)
        CheckRecord(record.record.value, file);
}

void ThrowCollected(Id const& id, std::string const& file) {
    throw ArchiveError(Failure::Collected, file, "The object " + TextOf(id) + " is not in the archive any more.");
}

void ReportProgress(IProgress* progress, Progress const& state, std::string const& file) {
    if (progress != nullptr && !progress->Report(state))
        throw ArchiveError(Failure::Cancelled, file, "Stopped on request.");
}

Buffer Joined(Buffer const& data) {
    if (data.LockForRead().size() <= 1)
        return data;
    return Buffer::Build(data.GetSize(), [&data](std::byte* bytes) {
        for (auto const& chunk : data.LockForRead())
            bytes = std::copy(chunk.begin(), chunk.end(), bytes);
    });
}

std::span<const std::byte> BytesOf(Buffer const& joined) noexcept {
    auto const chunks = joined.LockForRead();
    return chunks.size() == 0 ? std::span<const std::byte>() : *chunks.begin();
}

void AddContained(std::vector<ContainedCommit>& known, std::vector<ContainedCommit> const& further) {
    for (ContainedCommit const& contained : further)
        if (std::find(known.begin(), known.end(), contained) == known.end())
            known.push_back(contained);
}

KivVcs::SHADigest256 BeginPackedForm(ObjectType type, std::uint64_t size) {
    static constexpr std::string_view words[] = {"blob ", "tree ", "commit "};
    std::string header(words[static_cast<std::size_t>(type)]);
    header += std::to_string(size);
    KivVcs::SHADigest256 digest;
    digest.InitData(header.c_str(), header.size() + 1);
    return digest;
}

bool SameValue(std::optional<Buffer> const& left, std::optional<Buffer> const& right) {
    if (!left || !right)
        return left.has_value() == right.has_value();
    Buffer const one = Joined(*left);
    Buffer const other = Joined(*right);
    ByteView const bytes = BytesOf(one);
    ByteView const otherBytes = BytesOf(other);
    return std::equal(bytes.begin(), bytes.end(), otherBytes.begin(), otherBytes.end());
}

Bytes BytesOfName(KivStringT<char16_t> const& name) {
    // As a view, since a name may hold zeros.
    KivStringT<char> const text = KivVcs::DataEncoding::Utf8Encode(KivStringViewT<char16_t>(name));
    Bytes bytes(static_cast<std::size_t>(text.GetLength()));
    std::transform(text.GetString(), text.GetString() + text.GetLength(), bytes.begin(),
                   [](char byte) { return static_cast<std::byte>(byte); });
    return bytes;
}

KivStringT<char16_t> NameOfBytes(ByteView bytes) {
    return KivVcs::String::ToStringW(
        KivStringViewT<char>(reinterpret_cast<const char*>(bytes.data()), static_cast<int>(bytes.size())));
}

} // namespace KivArchive
