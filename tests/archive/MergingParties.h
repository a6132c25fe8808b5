#pragma once

#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Upkeep.h"
#include "MergingModel.h"
#include "support/Builders.h"

#include <functional>
#include <memory>

/// Parties that merge again and again.

namespace KivArchive {

using namespace KivVcs;

/// The account of a round: counts of questions and other events, faults, and the steps taken.
struct Account {
    std::map<std::string, std::uint64_t> counts;
    std::vector<std::string> faults;
    std::vector<std::string> steps;
};

inline std::string ShortId(Id const& id) {
    return Narrow(id.GetText()).substr(0, 6);
}

[[nodiscard]] inline FilesByPath FilesOf(Commit const& commit) {
    FilesByPath files;
    auto const root = commit.GetCommitTree()->GetRoot();
    for (auto const& path : root->GetDeepBlobPaths())
        files[Narrow(path)] = root->GetDeepBlob(path)->CopyToString();
    return files;
}

/// Commits at given times, so that the same steps give the same identifiers.
class TimedRepository : public ArchivedRepository {
public:
    TimedRepository(std::shared_ptr<IArchive> archive, RepositoryOptions const& options, std::int64_t const& seconds)
        : ArchivedRepository(std::move(archive), options), seconds_(seconds) {}

    cow_ptr<Commit> DoCommit(Commit& commit) override {
        commit.SetCommitTime(KivUtils::Time::FromTimeT(seconds_, KivUtils::TimeZone::Utc));
        commit.SetCommitTimezoneBias({});
        cow_ptr<Commit> stored = SyncWithStorage(CopyOf(commit));
        MoveBranchTo(GetCurentBranch(), stored);
        return stored;
    }

    /// The facts of a commit that others lead to.
    [[nodiscard]] std::vector<Ancestry> FactsOf(Id const& commit) const {
        return ReadAncestry({&commit, 1}, Follow::Everything, 0);
    }

private:
    std::int64_t const& seconds_;
};

/// Whether the head stands for a version whose parent others have rewritten.
[[nodiscard]] inline bool WasPutOnRewritten(TimedRepository const& repo, Id const& version) {
    Ancestry const facts = repo.FactsOf(repo.GetHead()->GetId()).front();
    return std::count(facts.contains.begin(), facts.contains.end(),
                      ContainedCommit{Containment::RewrittenFrom, version}) != 0;
}

/// Whether a version was rebased onto a rewritten one, and then replaced by another commit with the same tree.
[[nodiscard]] inline bool GaveWayRewritten(TimedRepository const& repo, Id const& version) {
    Ancestry const facts = repo.FactsOf(repo.GetHead()->GetId()).front();
    return std::any_of(facts.contains.begin(), facts.contains.end(), [&](ContainedCommit const& each) {
        auto const below = repo.FactsOf(each.id);
        return !below.empty() && std::count(below.front().contains.begin(), below.front().contains.end(),
                                            ContainedCommit{Containment::RewrittenFrom, version}) != 0;
    });
}

/// An archive, and what the parties that share it know.
struct SharedArchive {
    std::shared_ptr<MemArchive> archive = std::make_shared<MemArchive>();
    Knowledge known;
};

struct Party {
    std::shared_ptr<SharedArchive> at;
    std::unique_ptr<TimedRepository> repo;
    /// What has not been published.
    Knowledge own;
    /// The trees of the heads last exchanged, by the other party.
    std::map<std::size_t, std::vector<Id>> exchanged;
};

/// Answers at random, and records what was asked.
class RandomAnswers {
public:
    /// @param contents counts the contents that have been invented
    RandomAnswers(std::mt19937& random, int& contents) : random_(random), contents_(contents) {
        resolvers.choices.treeResolver = [](auto, MergeTrees const&) { return TreeConflictChoice::Merge; };
        resolvers.choices.blobResolver = [this](auto path, MergeTrees const&) {
            Note(path);
            return Below(2) == 0 ? ConflictChoice::Left : ConflictChoice::Right;
        };
        resolvers.contents = [this](auto, DisputedContents const&) -> std::optional<Buffer> {
            if (Below(4) != 0)
                return {};
            return BufferOf("content " + std::to_string(contents_++));
        };
        resolvers.kinds = [this](auto path, MergeTrees const&) {
            std::string const joined = Note(path);
            std::string const name = Narrow(path.back()) + "~" + std::to_string(contents_++);
            beside.insert(joined.substr(0, joined.rfind('/') + 1) + name);
            using Keep = KindDecision::Keep;
            static constexpr Keep keeps[] = {Keep::Undecided, Keep::File, Keep::Directory, Keep::Both, Keep::None};
            return KindDecision{keeps[Below(5)], Wide(name)};
        };
    }
    RandomAnswers(RandomAnswers const&) = delete;
    RandomAnswers& operator=(RandomAnswers const&) = delete;

    MergeResolvers resolvers;
    Paths asked;
    /// The paths at which files may have been kept beside directories.
    Paths beside;

private:
    [[nodiscard]] std::size_t Below(std::size_t limit) { return static_cast<std::size_t>(random_()) % limit; }
    template <class Path>
    std::string Note(Path const& path) {
        std::string joined;
        for (auto const& component : path)
            joined += (joined.empty() ? "" : "/") + Narrow(component);
        asked.insert(joined);
        return joined;
    }

    std::mt19937& random_;
    int& contents_;
};

} // namespace KivArchive
