#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Upkeep.h"
#include "support/Builders.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <iostream>

/// Parties that edit, merge, cross, rewrite, collect and exchange at random, beside somebody who forgets nothing. How many
/// rounds is said by KIVVCS_MERGE_ROUNDS, how many parties by KIVVCS_MERGE_PARTIES, and the first seed by
/// KIVVCS_MERGE_SEED.

namespace KivArchive {
namespace {

using namespace KivVcs;

using FilesByPath = std::map<std::string, std::string>;
using Paths = std::set<std::string>;

/// What is known of a version.
struct Version {
    FilesByPath files;
    /// Contents that came up with it.
    Paths written;
    /// What was edited or asked about, and what else differed between the sides that it merged.
    Paths decided;
    Paths merged;
    std::vector<Id> contains;
};

/// What a round has found, by name: how often questions were asked and so on, and faults in words.
struct Account {
    std::map<std::string, std::uint64_t> counts;
    std::vector<std::string> faults;
};

/// Whether one of the paths is the other one or lies below it.
bool AreRelated(std::string const& one, std::string const& other) {
    std::string const shorter = std::min(one.size(), other.size()) == one.size() ? one + "/" : other + "/";
    return ((one.size() < other.size() ? other : one) + "/").compare(0, shorter.size(), shorter) == 0;
}

bool AnyRelated(Paths const& paths, std::string const& path) {
    return std::any_of(paths.begin(), paths.end(), [&](auto const& one) { return AreRelated(one, path); });
}

enum class Sharing { Nothing, Archive, Branch };

class Round {
public:
    Round(std::uint32_t seed, std::size_t parties, Account& account)
        : random_(seed), account_(account), sharing_(static_cast<Sharing>(seed % 3)) {
        auto const shared = std::make_shared<MemArchive>();
        for (std::size_t i = 0; i < parties; ++i)
            parties_.push_back({sharing_ == Sharing::Nothing ? std::make_shared<MemArchive>() : shared, {}, {}, {}});
        for (std::size_t i = 0; i < parties; ++i) {
            Open(i);
            if (i == 0 || sharing_ == Sharing::Nothing)
                Begin(i);
            else
                Repo(i).CreateBranch(Wide(BranchOf(i)), Repo(i).GetHead(Wide(BranchOf(0))));
            Repo(i).Checkout(Wide(BranchOf(i)));
            Repo(i).Publish();
        }
    }

    void Run(int steps) {
        while (steps-- > 0 && account_.faults.empty())
            Step();
        Converge();
    }

private:
    struct Party {
        std::shared_ptr<MemArchive> archive;
        std::unique_ptr<ArchivedRepository> repo;
        /// The trees of the heads last exchanged, by the other party.
        std::map<std::size_t, std::vector<Id>> exchanged;
        std::string author;
    };

    [[nodiscard]] std::size_t Below(std::size_t limit) { return static_cast<std::size_t>(random_()) % limit; }
    [[nodiscard]] ArchivedRepository& Repo(std::size_t party) { return *parties_[party].repo; }
    [[nodiscard]] Id Head(std::size_t party) { return Repo(party).GetHead()->GetId(); }
    [[nodiscard]] std::string BranchOf(std::size_t party) const {
        return sharing_ == Sharing::Archive ? "p" + std::to_string(party) : "master";
    }

    void Open(std::size_t i) {
        Party& party = parties_[i];
        party.author = "party " + std::to_string(i);
        RepositoryOptions options;
        options.describeMerge = [author = party.author](Commit& merge, Commit const&) {
            merge.SetAuthorName(Wide(author));
        };
        party.repo = std::make_unique<ArchivedRepository>(party.archive, options);
        party.repo->Checkout(Wide(BranchOf(i)));
    }

    /// The same first commit everywhere.
    void Begin(std::size_t i) {
        Commit first;
        first.AddBlob(&Repo(i), u"keep", MakeBlob("0"));
        auto const stored = Repo(i).SyncWithStorage(immu::make<Commit>(first));
        if (!Repo(i).MoveBranchTo(Wide(BranchOf(i)), stored))
            Repo(i).CreateBranch(Wide(BranchOf(i)), stored);
        versions_[stored->GetId()].files = {{"keep", "0"}};
    }

    void Step() {
        std::size_t const i = Below(parties_.size());
        std::size_t const j = (i + 1 + Below(parties_.size() - 1)) % parties_.size();
        std::size_t const what = Below(100);
        if (what < 45)
            Edit(i);
        else if (what < 66)
            Exchange(i, j);
        else if (what < 85 && sharing_ != Sharing::Branch)
            Cross(i, j);
        else if (what < 91 && sharing_ != Sharing::Archive)
            Rewrite(i);
        else if (what < 94 && sharing_ != Sharing::Branch)
            Rebase(i, j);
        else if (what >= 94)
            CollectAt(i);
    }

    void Edit(std::size_t i) {
        static const std::vector<std::string> paths{"a", "b", "d/a", "d/e/b", "d/e/c", "d", "a/x"};
        Id const before = Head(i);
        Version version{versions_.at(before).files, {}, {}, {}, {before}};
        Commit commit(&Repo(i), false);
        commit.SetAuthorName(Wide(parties_[i].author));
        // Directories and files take each other's place now and then only.
        std::string const path = paths[Below(Below(4) == 0 ? paths.size() : 5)];
        std::erase_if(version.files, [&](auto const& file) {
            bool const gives = AreRelated(file.first, path);
            if (gives)
                version.decided.insert(file.first);
            return gives;
        });
        bool const removes = !version.decided.empty() && Below(10) < 3;
        for (auto const& one : version.decided)
            commit.RemoveObject(&Repo(i), Wide(one));
        if (!removes) {
            std::string const content = "content " + std::to_string(contents_++);
            commit.AddBlob(&Repo(i), Wide(path), MakeBlob(content));
            version.files[path] = content;
            version.written.insert(content);
            version.decided.insert(path);
        }
        Repo(i).DoCommit(commit);
        versions_[Head(i)] = std::move(version);
    }

    /// The other party's head, as far as the first one can have it.
    cow_ptr<Commit> HeadOfOther(std::size_t i, std::size_t j) {
        Repo(j).Publish();
        if (sharing_ == Sharing::Nothing) {
            SynchronizeOptions options;
            options.branches = {{u"master", u"theirs"}};
            Synchronize(*parties_[j].archive, *parties_[i].archive, options, nullptr);
            Repo(i).Refresh();
            return Repo(i).GetHead(u"theirs");
        }
        Repo(i).Refresh();
        return Repo(i).GetHead(Wide(BranchOf(j)));
    }

    void Exchange(std::size_t i, std::size_t j) {
        if (sharing_ == Sharing::Branch)
            return MergeShared(i);
        Merge(i, HeadOfOther(i, j));
        Keep(i, j);
    }

    void Cross(std::size_t i, std::size_t j) {
        auto const one = HeadOfOther(i, j);
        auto const other = HeadOfOther(j, i);
        Keep(i, j);
        Merge(i, one);
        Merge(j, other);
    }

    /// Both remember what they had.
    void Keep(std::size_t i, std::size_t j) {
        for (auto const& [one, other] : {std::pair{i, j}, std::pair{j, i}})
            parties_[one].exchanged[other] = {Repo(i).GetHead()->GetRootId(), Repo(j).GetHead()->GetRootId()};
    }

    void Rewrite(std::size_t i) {
        if (sharing_ == Sharing::Branch)
            MergeShared(i);
        Id const before = Head(i);
        if (Below(2) == 0)
            Repo(i).SimplifyCommitGraph(Below(2) == 0);
        else
            Repo(i).DeleteCommits(Repo(i).GetHead());
        ++account_.counts["rewritten"];
        Derive(i, before, {before}, {});
    }

    void Rebase(std::size_t i, std::size_t j) {
        auto const theirs = HeadOfOther(i, j);
        Id const before = Head(i);
        Id const onto = theirs->GetId();
        if (Contains(before, onto) || Contains(onto, before))
            return;
        auto const tip =
            Repo(i).MergelessRebase(Repo(i).GetHead(), Repo(i).GetCommonBase(Repo(i).GetHead(), theirs), theirs);
        Repo(i).MoveBranchTo(Wide(BranchOf(i)), tip);
        ++account_.counts["rebased"];
        // Whatever they have otherwise is taken back.
        Paths decided;
        for (auto const& path : AllPaths(before, onto))
            if (ContentOf(before, path) != ContentOf(onto, path))
                decided.insert(path);
        Derive(i, before, {before, onto}, decided);
    }

    /// The head is a version with the files of another one.
    void Derive(std::size_t i, Id const& from, std::vector<Id> const& contains, Paths const& decided) {
        Id const id = Head(i);
        FilesByPath const files = versions_.at(from).files;
        Version& version = versions_[id];
        version.files = files;
        version.decided.insert(decided.begin(), decided.end());
        for (Id const& other : contains)
            if (!(other == id))
                version.contains.push_back(other);
        // Below it lie commits that were rewritten, too, and that others may have rewritten alike.
        if (Id const parent = Repo(i).GetHead()->GetParentId(); !parent.IsEmpty())
            version.contains.push_back(parent);
        Repo(i).Publish();
    }

    void CollectAt(std::size_t i) {
        CollectOptions options;
        options.grace = std::chrono::seconds(0);
        for (std::size_t j = 0; j < parties_.size(); ++j) {
            if (parties_[j].archive != parties_[i].archive)
                continue;
            // A party with something unpublished relies on what it knows.
            if (sharing_ == Sharing::Branch)
                MergeShared(j);
            else
                Repo(j).Publish();
            for (auto const& [other, trees] : parties_[j].exchanged)
                options.kept.insert(options.kept.end(), trees.begin(), trees.end());
        }
        auto const missing = parties_[i].archive->FindMissing(options.kept);
        for (Id const& gone : missing)
            std::erase(options.kept, gone);
        Collect(*parties_[i].archive, options, nullptr);
        Collect(*parties_[i].archive, options, nullptr);
        for (std::size_t j = 0; j < parties_.size(); ++j)
            if (parties_[j].archive == parties_[i].archive)
                Open(j);
        ++account_.counts["collected"];
    }

    void MergeShared(std::size_t i) {
        Id const before = Head(i);
        auto const branches = parties_[i].archive->ReadBranches();
        Asking asking(*this);
        PublishMergingOutcome const outcome = Repo(i).PublishMerging(asking.resolvers);
        if (outcome.result != PublishMergingResult::Published)
            return Fault("not published");
        MergeReport const none{MergeResult::UpToDate, {}, {}};
        Check(before, branches.front().head, Head(i), outcome.merges.empty() ? none : outcome.merges.back(), asking);
    }

    /// Answers at random, and notes what was asked.
    struct Asking {
        explicit Asking(Round& round) {
            auto const note = [this](auto const& path) {
                std::string joined;
                for (auto const& component : path)
                    joined += (joined.empty() ? "" : "/") + Narrow(component);
                asked.insert(joined);
                return joined;
            };
            resolvers.choices.treeResolver = [](auto, MergeTrees const&) { return TreeConflictChoice::Merge; };
            resolvers.choices.blobResolver = [&round, note](auto path, MergeTrees const&) {
                note(path);
                return round.Below(2) == 0 ? ConflictChoice::Left : ConflictChoice::Right;
            };
            resolvers.contents = [this, &round](auto, DisputedContents const&) -> std::optional<Buffer> {
                if (round.Below(4) != 0)
                    return {};
                Buffer content;
                std::string const text = "content " + std::to_string(round.contents_++);
                content.Append(text.data(), text.size());
                return content;
            };
            resolvers.kinds = [this, &round, note](auto path, MergeTrees const&) {
                std::string const joined = note(path);
                std::string const name = Narrow(path.back()) + "~" + std::to_string(round.contents_++);
                beside.insert(joined.substr(0, joined.rfind('/') + 1) + name);
                using Keep = KindDecision::Keep;
                static constexpr Keep keeps[] = {Keep::Undecided, Keep::File, Keep::Directory, Keep::Both, Keep::None};
                return KindDecision{keeps[round.Below(5)], Wide(name)};
            };
        }
        Asking(Asking const&) = delete;
        Asking& operator=(Asking const&) = delete;

        MergeResolvers resolvers;
        Paths asked;
        /// Where files may have gone beside directories.
        Paths beside;
    };

    void Merge(std::size_t i, cow_ptr<Commit> const& theirs) {
        Id const before = Head(i);
        Asking asking(*this);
        MergeReport const report = Repo(i).MergeWithReport(theirs, asking.resolvers);
        if (!report.Succeeded())
            Fault("not merged");
        Check(before, theirs->GetId(), Head(i), report, asking);
    }

    /// Compares what became of two heads with what should.
    void Check(Id const& left, Id const& right, Id const& result, MergeReport const& report, Asking& asking) {
        for (auto const& conflict : report.conflicts)
            if (!conflict.isDirectory)
                asking.asked.insert(Narrow(conflict.path));
        bool const isOne = result == left || result == right;
        bool const haveOneTree = versions_.at(left).files == versions_.at(right).files;
        if (Contains(left, right) || Contains(right, left)) {
            bool const isLatest = isOne && Contains(result, left) && Contains(result, right);
            return isLatest ? void() : Fault("a version that nobody needed");
        }
        if (haveOneTree && isOne) {
            versions_[result].contains.push_back(result == left ? right : left);
            return result == std::min(left, right) ? void() : Fault("not the smaller of two equal ones");
        }
        if (isOne)
            return Fault("a side taken for the result");
        ++account_.counts["merges"];
        account_.counts["questions"] += asking.asked.size();
        account_.counts["merges without a base"] += report.lostBases.empty() ? 0U : 1U;
        if (report.lostBases.empty())
            CheckQuestions(left, right, asking.asked);
        Version version{FilesOf(result), {}, asking.asked, {}, {left, right}};
        version.decided.insert(asking.beside.begin(), asking.beside.end());
        for (auto const& [path, content] : version.files)
            if (AnyRelated(version.decided, path))
                version.written.insert(content);
        versions_[result] = std::move(version);
        for (auto const& path : AllPaths(left, right))
            CheckEntry(left, right, result, path);
    }

    void CheckQuestions(Id const& left, Id const& right, Paths const& asked) {
        for (auto const& path : asked) {
            if (!HasChanged(left, right, path, true) || !HasChanged(right, left, path, true))
                Fault("a needless question about " + path);
            else if (!HasChanged(left, right, path, false) || !HasChanged(right, left, path, false))
                ++account_.counts["questions where one side only merged"];
        }
    }

    void CheckEntry(Id const& left, Id const& right, Id const& result, std::string const& path) {
        std::string const one = ContentOf(left, path);
        std::string const other = ContentOf(right, path);
        std::string const taken = ContentOf(result, path);
        Version& version = versions_.at(result);
        if (one != other)
            version.merged.insert(path);
        if (AnyRelated(version.decided, path))
            return;
        if (taken != one && taken != other)
            return Fault(path + " has what no side had");
        if (one == other)
            return;
        Id const& winner = taken == one ? left : right;
        Id const& loser = taken == one ? right : left;
        std::string const lost = taken == one ? other : one;
        if (!lost.empty() && !HasSeen(winner, lost))
            Fault("an edit of " + path + " is lost");
        if (!HasChanged(winner, loser, path, true))
            Fault(path + " is brought back");
    }

    /// Everybody merges everybody until nothing moves; then once more.
    void Converge() {
        for (int times = 0; times < 20 && account_.faults.empty(); ++times) {
            std::vector<Id> const before = Heads();
            bool const areEqual = std::equal(before.begin() + 1, before.end(), before.begin());
            for (std::size_t i = 0; i < parties_.size(); ++i)
                for (std::size_t j = 0; j < parties_.size(); ++j)
                    if (i != j)
                        Exchange(i, j);
            if (areEqual && before == Heads()) {
                for (auto const& party : parties_)
                    if (!Verify(*party.archive, nullptr).IsSound())
                        Fault("an archive that is not sound");
                return;
            }
        }
        if (account_.faults.empty())
            Fault("different heads, or versions without end");
    }

    [[nodiscard]] std::vector<Id> Heads() {
        std::vector<Id> heads;
        for (std::size_t i = 0; i < parties_.size(); ++i)
            heads.push_back(Head(i));
        return heads;
    }

    [[nodiscard]] FilesByPath FilesOf(Id const& commit) {
        FilesByPath files;
        for (auto const& party : parties_)
            if (auto const stored = party.repo->GetCommitFromStorage(commit)) {
                auto const root = stored->GetCommitTree()->GetRoot();
                for (auto const& path : root->GetDeepBlobPaths())
                    files[Narrow(path)] = root->GetDeepBlob(path)->CopyToString();
                break;
            }
        return files;
    }

    [[nodiscard]] std::set<Id> AllIn(Id const& version) const {
        std::set<Id> all{version};
        for (std::vector<Id> open{version}; !open.empty();) {
            Id const id = open.back();
            open.pop_back();
            auto const known = versions_.find(id);
            for (Id const& other : known != versions_.end() ? known->second.contains : RewrittenInto(id))
                if (all.insert(other).second)
                    open.push_back(other);
        }
        std::erase_if(all, [this](Id const& id) { return !versions_.contains(id); });
        return all;
    }
    /// What a commit contains that came up when others were rewritten.
    [[nodiscard]] std::vector<Id> RewrittenInto(Id const& commit) const {
        std::vector<Id> contained;
        for (auto const& party : parties_)
            for (Ancestry const& facts : party.archive->ReadAncestry({&commit, 1}, Follow::Parents, 0)) {
                if (!facts.parent.IsEmpty())
                    contained.push_back(facts.parent);
                for (ContainedCommit const& other : facts.contains)
                    contained.push_back(other.id);
            }
        return contained;
    }
    [[nodiscard]] bool Contains(Id const& one, Id const& other) const { return AllIn(one).contains(other); }
    [[nodiscard]] bool HasSeen(Id const& version, std::string const& content) const {
        auto const all = AllIn(version);
        return std::any_of(all.begin(), all.end(),
                           [&](Id const& id) { return versions_.at(id).written.contains(content); });
    }
    /// Whether a side has decided about a path since the other one knew of it, or merged versions that differ there.
    [[nodiscard]] bool HasChanged(Id const& side, Id const& since, std::string const& path, bool orMerged) const {
        auto const known = AllIn(since);
        auto const all = AllIn(side);
        return std::any_of(all.begin(), all.end(), [&](Id const& id) {
            Version const& version = versions_.at(id);
            return !known.contains(id) &&
                   (AnyRelated(version.decided, path) || (orMerged && AnyRelated(version.merged, path)));
        });
    }
    [[nodiscard]] std::string ContentOf(Id const& version, std::string const& path) const {
        auto const& files = versions_.at(version).files;
        auto const found = files.find(path);
        return found == files.end() ? "" : found->second;
    }
    [[nodiscard]] Paths AllPaths(Id const& left, Id const& right) const {
        Paths paths;
        for (Id const& version : {left, right})
            for (auto const& [path, content] : versions_.at(version).files)
                paths.insert(path);
        return paths;
    }
    void Fault(std::string const& what) { account_.faults.push_back(what); }

    std::mt19937 random_;
    Account& account_;
    Sharing sharing_;
    std::vector<Party> parties_;
    std::map<Id, Version> versions_;
    int contents_ = 0;
};

std::uint32_t NumberFrom(const char* variable, std::uint32_t otherwise) {
    const char* const value = std::getenv(variable);
    return value != nullptr ? static_cast<std::uint32_t>(std::atoi(value)) : otherwise;
}

TEST(MergingRounds, LoseNoEditAndBringNoneBack) {
    std::uint32_t const rounds = NumberFrom("KIVVCS_MERGE_ROUNDS", 60);
    std::uint32_t const parties = NumberFrom("KIVVCS_MERGE_PARTIES", 3);
    std::uint32_t const first = NumberFrom("KIVVCS_MERGE_SEED", 1);
    Account all;
    std::uint32_t faulty = 0;
    for (std::uint32_t seed = first; seed < first + rounds; ++seed) {
        Account account;
        Round(seed, parties, account).Run(static_cast<int>(10 * parties));
        faulty += account.faults.empty() ? 0U : 1U;
        for (auto const& fault : account.faults)
            ADD_FAILURE() << "round " << seed << ": " << fault;
        for (auto const& [name, count] : account.counts)
            all.counts[name] += count;
    }
    std::cout << rounds << " rounds of " << parties << " parties, " << faulty << " faulty:";
    for (auto const& [name, count] : all.counts)
        std::cout << " " << count << " " << name << ";";
    std::cout << "\n";
    EXPECT_GT(all.counts["questions"], 0U);
    EXPECT_GT(all.counts["collected"], 0U);
}

} // namespace
} // namespace KivArchive
