#include "Changes.h"

#include <algorithm>

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

} // namespace KivArchive
