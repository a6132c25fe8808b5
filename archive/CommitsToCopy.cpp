#include "CommitsToCopy.h"

#include "Changes.h"
#include "NamedFirst.h"

#include <algorithm>
#include <iterator>

namespace KivArchive {

namespace {

/// How many commits are read at once, at most.
constexpr std::size_t mostAhead = 1000;

/// What the commits have merged and the archive has collected since, as it may.
std::unordered_set<Id> GoneOfMerged(IArchive& archive, std::vector<Ancestry> const& commits) {
    std::vector<Id> merged;
    for (Ancestry const& facts : commits)
        AddMerged(facts, merged);
    std::vector<Id> const gone = archive.FindMissing(merged);
    return {gone.begin(), gone.end()};
}

} // namespace

void AddMerged(Ancestry const& facts, std::vector<Id>& ids) {
    for (ContainedCommit const& contained : facts.contains)
        if (contained.how == Containment::Merged)
            ids.push_back(contained.id);
}

CommitsToCopy::CommitsToCopy(IArchive& from, IArchive& to, std::vector<Id> const& heads, IProgress* progress)
    : from_(from), to_(to) {
    // Most of the time little is missing.
    std::size_t ahead = 16;
    for (std::vector<Id> open = heads; !open.empty(); ahead = std::min(4 * ahead, mostAhead)) {
        ReportProgress(progress, {"looking for missing versions", commits_.size(), 0}, {});
        open = Discover(open, ahead);
    }
    VisitNamedFirst<Id>(
        heads,
        [this](Id const& id, std::vector<Id>& named) {
            auto const found = commits_.find(id);
            if (found == commits_.end())
                return false;
            named = found->second.before;
            return true;
        },
        [this](Id const& id) { inOrder_.push_back(id); });
}

/// Takes in those of @p open that are missing, and up to @p ahead of what they lead to. @return what to look at next
std::vector<Id> CommitsToCopy::Discover(std::vector<Id> const& open, std::size_t ahead) {
    std::vector<Id> const missing = to_.FindMissing(open);
    std::vector<Ancestry> known = from_.ReadAncestry(missing, Follow::Reachable, ahead);
    std::unordered_set<Id> const gone = GoneOfMerged(from_, known);
    std::vector<Id> read;
    read.reserve(known.size());
    for (Ancestry const& facts : known)
        read.push_back(facts.commit);
    met_.insert(read.begin(), read.end());
    for (Id const& id : missing)
        if (met_.count(id) == 0)
            throw ArchiveError(Failure::Damaged, {},
                               "The archive to copy from does not know the ancestry of one of its versions.");
    std::vector<Id> const lacking = to_.FindMissing(read);
    std::unordered_set<Id> const wanted(lacking.begin(), lacking.end());
    std::vector<Id> next;
    for (Ancestry& facts : known) {
        if (wanted.count(facts.commit) == 0)
            continue;
        std::vector<Id> before;
        AddMerged(facts, before);
        std::erase_if(before, [&gone](Id const& id) { return gone.count(id) != 0; });
        if (!facts.parent.IsEmpty())
            before.push_back(facts.parent);
        std::copy_if(before.begin(), before.end(), std::back_inserter(next),
                     [this](Id const& id) { return met_.count(id) == 0; });
        Id const commit = facts.commit;
        commits_.insert_or_assign(commit, Commit{std::move(facts), std::move(before)});
    }
    return next;
}

} // namespace KivArchive
