#include "repository/CommitForm.h"

#include "PackedForms.h"

namespace KivArchive {

using KivVcs::Commit;
using KivVcs::cow_ptr;

cow_ptr<Commit> ReadCommit(Id const& id, std::span<const std::byte> data, Commit::FetchCommit fetchParent,
                           Commit::FetchTree fetchRoot) {
    constexpr std::int64_t ticksPerMinute = 600'000'000;
    auto const packed = ReadPackedCommit(data);
    if (!packed)
        return nullptr;
    auto commit = KivVcs::immu::make<Commit>();
    Commit& read = *commit.write();
    read.SetAuthorName(KivVcs::FromUtf8(packed->authorName));
    read.SetAuthorEmail(KivVcs::FromUtf8(packed->authorEmail));
    read.SetDescription(KivVcs::FromUtf8(packed->description));
    read.SetCommitTime(KivVcs::Time::FromTimeT(packed->seconds, KivVcs::TimeZone::Utc));
    read.SetCommitTimezoneBias(KivVcs::TimeDelta(packed->biasMinutes * ticksPerMinute));
    read.DeferRoot(packed->tree, std::move(fetchRoot));
    read.DeferParent(packed->parent, std::move(fetchParent));
    // Only an equal identifier proves that everything was understood.
    return read.GetId() == id ? commit : nullptr;
}

} // namespace KivArchive
