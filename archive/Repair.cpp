#include "Changes.h"
#include "KivArchive/Upkeep.h"

#include <algorithm>
#include <unordered_map>
#include <unordered_set>

namespace KivArchive {

namespace {

class Repairing {
public:
    Repairing(IArchive& archive, IArchive& source, IProgress* progress)
        : archive_(archive), source_(source), progress_(progress) {}

    RepairReport Run() {
        VerifyReport const wrong = Verify(archive_, progress_);
        std::vector<Id> wanted = wrong.damaged;
        for (MissingObject const& missing : wrong.missing)
            wanted.push_back(missing.id);
        std::vector<Id> heads;
        for (Branch const& branch : wrong.branches)
            heads.push_back(branch.head);
        auto const missingHeads = archive_.FindMissing(heads);
        wanted.insert(wanted.end(), missingHeads.begin(), missingHeads.end());
        damaged_.insert(wrong.damaged.begin(), wrong.damaged.end());
        while (!wanted.empty())
            wanted = Take(wanted);
        RemoveDamaged();
        // What was found first names what was found later.
        for (auto found = found_.rbegin(); found != found_.rend(); ++found)
            Store(*found);
        return std::move(report_);
    }

private:
    /// Reads what the source has of @p wanted. @return what these objects name and the archive lacks
    std::vector<Id> Take(std::vector<Id> const& wanted) {
        ReportProgress(progress_, {"reading what is to be repaired", found_.size(), 0}, {});
        std::unordered_set<Id> given;
        std::vector<Id> named;
        source_.Read(wanted, [&](ArchivedObject const& object) {
            bool const isLarge = object.data.empty() && object.size > 0;
            std::vector<Link> links;
            if (!isLarge &&
                (!(Identify(object.type, object.data) == object.id) || !ReadLinks(object.type, object.data, links)))
                return;
            if (!given.insert(object.id).second)
                return;
            NewObject copy{object.id, object.type, {}, {}};
            copy.data.Append(object.data.data(), object.data.size());
            found_.push_back({std::move(copy), isLarge});
            for (Link const& link : links)
                named.push_back(link.id);
        });
        met_.insert(wanted.begin(), wanted.end());
        for (Id const& id : wanted)
            if (given.count(id) == 0)
                report_.lost.push_back(id);
        std::vector<Id> further = archive_.FindMissing(named);
        std::erase_if(further, [this](Id const& id) { return !met_.insert(id).second; });
        return further;
    }

    /// Removes the damaged objects that the source has, since an archive skips identifiers that it has already.
    void RemoveDamaged() {
        std::vector<Id> ids;
        for (Found const& found : found_)
            if (damaged_.count(found.object.id) != 0)
                ids.push_back(found.object.id);
        constexpr std::chrono::seconds atOnce{0};
        archive_.Mark(ids);
        if (!archive_.Remove(ids, atOnce).empty())
            throw ArchiveError(Failure::Locked, {}, "Somebody uses what is to be repaired; repair it again.");
        while (archive_.Compact(largestWholeContent * 4) > 0)
            ReportProgress(progress_, {"giving space back", 0, 0}, {});
    }

    struct Found {
        NewObject object;
        bool isLarge = false;
    };

    void Store(Found const& found) {
        ReportProgress(progress_, {"repairing", report_.repaired.size(), found_.size()}, {});
        bool isStored = true;
        if (found.isLarge) {
            StreamIO content = ContentStream(source_, found.object.id);
            isStored = content && archive_.StoreContent(found.object.id, content, {}, progress_);
        } else {
            Change change;
            change.objects.push_back(found.object);
            archive_.Apply(change);
        }
        (isStored ? report_.repaired : report_.lost).push_back(found.object.id);
    }

    IArchive& archive_;
    IArchive& source_;
    IProgress* progress_;
    std::unordered_set<Id> damaged_;
    std::unordered_set<Id> met_;
    std::vector<Found> found_;
    RepairReport report_;
};

} // namespace

RepairReport Repair(IArchive& archive, IArchive& source, IProgress* progress) {
    return Repairing(archive, source, progress).Run();
}

} // namespace KivArchive
