#include "Changes.h"
#include "KivArchive/Upkeep.h"
#include "ObjectIndex.h"

#include <algorithm>
#include <unordered_set>
#include <utility>

namespace KivArchive {

namespace {

class Verification {
public:
    Verification(IArchive& archive, IProgress* progress)
        : archive_(archive), progress_(progress), all_(archive, progress) {}

    VerifyReport Run() {
        for (std::size_t begin = 0; begin < all_.Size(); begin += readAtOnce) {
            std::vector<Id> batch;
            batch.reserve(std::min(readAtOnce, all_.Size() - begin));
            for (std::size_t i = begin; i < std::min(begin + readAtOnce, all_.Size()); ++i)
                batch.push_back(all_.At(i));
            VerifyBatch(batch);
        }
        VerifyBranches();
        DropLaterObjects();
        return std::move(report_);
    }

private:
    /// Many, since an archive reads in the order that is cheapest, and what it keeps together only once for each batch.
    static constexpr std::size_t readAtOnce = std::size_t{1} << 18U;

    void VerifyBatch(std::vector<Id> const& batch) {
        std::vector<Id> large;
        std::vector<Ancestry> stated;
        ReadOutcome const outcome = archive_.Read(batch, [&](ArchivedObject const& object) {
            if (report_.objects++ % pageSize == 0)
                ReportProgress(progress_, {"verifying objects", report_.objects, all_.Size()}, {});
            if (object.data.empty() && object.size > 0)
                large.push_back(object.id);
            else
                VerifyLinks(object, stated);
            if (stated.size() == pageSize)
                VerifyAncestry(std::exchange(stated, {}));
        });
        report_.damaged.insert(report_.damaged.end(), outcome.damaged.begin(), outcome.damaged.end());
        for (Id const& id : large)
            VerifyContent(id);
        VerifyAncestry(stated);
    }

    void VerifyLinks(ArchivedObject const& object, std::vector<Ancestry>& stated) {
        std::vector<Link> links;
        if (!ReadLinks(object.type, object.data, links)) {
            report_.damaged.push_back(object.id);
            return;
        }
        if (object.type == ObjectType::Commit)
            stated.push_back({object.id, {}, {}, {}});
        for (Link const& link : links) {
            if (object.type == ObjectType::Commit)
                (link.type == ObjectType::Tree ? stated.back().tree : stated.back().parent) = link.id;
            if (!all_.Find(link.id) && missing_.insert(link.id).second)
                report_.missing.push_back({link.id, object.id});
        }
    }

    void VerifyContent(Id const& id) {
        try {
            StreamIO content = ContentStream(archive_, id);
            std::vector<std::byte> piece(largestWholeContent);
            std::uint64_t rest = content.GetSize();
            for (bool isSound = true; isSound && rest > 0;) {
                std::uint64_t const size = std::min<std::uint64_t>(rest, piece.size());
                isSound = content.Read(piece.data(), size);
                rest -= isSound ? size : 0;
                ReportProgress(progress_, {"verifying a content", content.GetPosition(), content.GetSize()}, {});
            }
            if (rest == 0)
                return;
        } catch (ArchiveError const& error) {
            if (error.GetKind() != Failure::Damaged)
                throw;
        }
        report_.damaged.push_back(id);
    }

    void VerifyAncestry(std::vector<Ancestry> const& stated) {
        std::vector<Id> commits;
        commits.reserve(stated.size());
        for (Ancestry const& facts : stated)
            commits.push_back(facts.commit);
        auto known = archive_.ReadAncestry(commits, Follow::Parents, 0);
        auto const less = [](Ancestry const& left, Ancestry const& right) {
            return DigestOf(left.commit) < DigestOf(right.commit);
        };
        std::sort(known.begin(), known.end(), less);
        for (Ancestry const& facts : stated) {
            auto const found = std::lower_bound(known.begin(), known.end(), facts, less);
            if (found == known.end() || !(found->commit == facts.commit) || !(found->parent == facts.parent) ||
                !(found->tree == facts.tree))
                report_.ancestry.push_back(facts.commit);
        }
    }

    /// Drops what was stored while the objects were listed, which only seemed to be missing.
    void DropLaterObjects() {
        std::vector<Id> const ids(missing_.begin(), missing_.end());
        auto const missing = archive_.FindMissing(ids);
        std::unordered_set<Id> const still(missing.begin(), missing.end());
        std::erase_if(report_.missing, [&](MissingObject const& one) { return still.count(one.id) == 0; });
    }

    void VerifyBranches() {
        for (Branch const& branch : archive_.ReadBranches()) {
            bool isSound = false;
            archive_.Read({&branch.head, 1},
                          [&](ArchivedObject const& object) { isSound = object.type == ObjectType::Commit; });
            if (!isSound)
                report_.branches.push_back(branch);
        }
    }

    IArchive& archive_;
    IProgress* progress_;
    ObjectIndex all_;
    std::unordered_set<Id> missing_;
    VerifyReport report_;
};

} // namespace

VerifyReport Verify(IArchive& archive, IProgress* progress) {
    return Verification(archive, progress).Run();
}

} // namespace KivArchive
