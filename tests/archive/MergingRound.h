#pragma once

#include "MergingParties.h"

/// A round of parties that edit, merge, cross, rewrite, collect and exchange at random.

namespace KivArchive {

enum class Sharing { Nothing, Archive, Branch };

/// A round of some parties. The same seed and steps make the same history.
class Round {
public:
    Round(std::uint32_t seed, std::size_t parties, Account& account)
        : account_(account), sharing_(static_cast<Sharing>(seed % 3)), pace_(seed / 3 % 4) {
        auto const shared = std::make_shared<SharedArchive>();
        parties_.resize(parties);
        for (std::size_t i = 0; i < parties; ++i) {
            parties_[i].at = sharing_ == Sharing::Nothing ? std::make_shared<SharedArchive>() : shared;
            Open(i);
            if (i == 0 || sharing_ == Sharing::Nothing)
                Begin(i);
            else
                Repo(i).CreateBranch(Wide(BranchOf(i)), Repo(i).GetHead(Wide(BranchOf(0))));
            Repo(i).Checkout(Wide(BranchOf(i)));
            Publish(i);
        }
    }

    /// Each step is a seed of its own, so that it stays the same if others are left out.
    void Run(std::vector<std::uint32_t> const& steps) {
        try {
            for (std::uint32_t const step : steps) {
                random_.seed(step);
                if (account_.faults.empty())
                    Step();
            }
            random_.seed(0);
            Converge();
        } catch (std::exception const& error) {
            Fault(std::string("thrown, ") + error.what());
        }
    }

private:
    [[nodiscard]] std::size_t Below(std::size_t limit) { return static_cast<std::size_t>(random_()) % limit; }
    [[nodiscard]] TimedRepository& Repo(std::size_t party) { return *parties_[party].repo; }
    [[nodiscard]] MemArchive& ArchiveOf(std::size_t party) { return *parties_[party].at->archive; }
    [[nodiscard]] Id Head(std::size_t party) { return Repo(party).GetHead()->GetId(); }
    [[nodiscard]] std::string BranchOf(std::size_t party) const {
        return sharing_ == Sharing::Archive ? "p" + std::to_string(party) : "master";
    }
    [[nodiscard]] Knowledge KnowledgeOf(std::size_t i) const {
        Knowledge all = parties_[i].at->known;
        all.Learn(parties_[i].own);
        return all;
    }
    void Fault(std::string const& what) {
        Say("wrong: " + what);
        account_.faults.push_back(what);
    }
    void Say(std::string const& what) { account_.steps.push_back(what); }
    [[nodiscard]] std::string NameOf(std::size_t i) { return std::to_string(i) + "@" + ShortId(Head(i)); }

    void Open(std::size_t i) {
        RepositoryOptions options;
        options.describeMerge = [i](Commit& merge, Commit const&) {
            merge.SetAuthorName(Wide("party " + std::to_string(i)));
        };
        parties_[i].repo = std::make_unique<TimedRepository>(parties_[i].at->archive, options, seconds_);
        Repo(i).Checkout(Wide(BranchOf(i)));
    }

    /// Makes the first commit, the same for all parties.
    void Begin(std::size_t i) {
        Commit first;
        first.AddBlob(&Repo(i), u"keep", MakeBlob("0"));
        auto const stored = Repo(i).SyncWithStorage(immu::make<Commit>(first));
        if (!Repo(i).MoveBranchTo(Wide(BranchOf(i)), stored))
            Repo(i).CreateBranch(Wide(BranchOf(i)), stored);
        versions_[stored->GetId()].files = {{"keep", "0"}};
    }

    void Publish(std::size_t i) {
        if (!Repo(i).Publish().published)
            return Fault("not published");
        parties_[i].at->known.Learn(parties_[i].own);
    }

    void Step() {
        std::size_t const i = Below(parties_.size());
        std::size_t const j = (i + 1 + Below(parties_.size() - 1)) % parties_.size();
        std::size_t const what = Below(100);
        // Several steps may happen within one second.
        seconds_ += static_cast<std::int64_t>(Below(1 + pace_));
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
        ModelVersion version{versions_.at(before).files, {}, {}, {}};
        Commit commit(&Repo(i), false);
        commit.SetAuthorName(Wide("party " + std::to_string(i)));
        // Directories and files replace each other only now and then.
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
        Say(NameOf(i) + (removes ? " removes " : " edits ") + path);
        Add(Head(i), std::move(version));
        parties_[i].own.Learn(Head(i), before);
    }

    /// A version may be made again: an edit that is taken back within one second gives the same commit as before.
    void Add(Id const& id, ModelVersion version) {
        ModelVersion& known = versions_[id];
        known.files = std::move(version.files);
        known.written.merge(version.written);
        known.decided.merge(version.decided);
        known.merged.merge(version.merged);
    }

    /// The other party's head, if the first party can read it.
    cow_ptr<Commit> HeadOfOther(std::size_t i, std::size_t j) {
        Publish(j);
        if (sharing_ == Sharing::Nothing) {
            SynchronizeOptions options;
            options.branches = {{u"master", u"theirs"}};
            Synchronize(ArchiveOf(j), ArchiveOf(i), options, nullptr);
            parties_[i].at->known.Learn(parties_[j].at->known);
            Repo(i).Refresh();
            return Repo(i).GetHead(u"theirs");
        }
        Repo(i).Refresh();
        return Repo(i).GetHead(Wide(BranchOf(j)));
    }

    void Exchange(std::size_t i, std::size_t j) {
        Say(NameOf(i) + " takes from " + NameOf(j));
        if (sharing_ == Sharing::Branch)
            return MergeShared(i);
        Merge(i, HeadOfOther(i, j));
        Keep(i, j);
    }

    void Cross(std::size_t i, std::size_t j) {
        Say(NameOf(i) + " crosses with " + NameOf(j));
        auto const one = HeadOfOther(i, j);
        auto const other = HeadOfOther(j, i);
        Keep(i, j);
        Merge(i, one);
        Merge(j, other);
    }

    /// Both parties keep the heads that they exchanged.
    void Keep(std::size_t i, std::size_t j) {
        for (auto const& [one, other] : {std::pair{i, j}, std::pair{j, i}})
            parties_[one].exchanged[other] = {Repo(i).GetHead()->GetRootId(), Repo(j).GetHead()->GetRootId()};
    }

    void Rewrite(std::size_t i) {
        if (sharing_ == Sharing::Branch)
            MergeShared(i);
        Id const before = Head(i);
        bool const simplifies = Below(2) == 0;
        if (simplifies)
            Repo(i).SimplifyCommitGraph(Below(2) == 0);
        else
            Repo(i).DeleteCommits(Repo(i).GetHead());
        ++account_.counts["rewritten"];
        Say(NameOf(i) + (simplifies ? " simplified " : " deleted the history of ") + ShortId(before));
        Derive(i, before, {before});
    }

    void Rebase(std::size_t i, std::size_t j) {
        auto const theirs = HeadOfOther(i, j);
        Id const before = Head(i);
        Id const onto = theirs->GetId();
        ModelMerge const model(versions_, KnowledgeOf(i), before, onto);
        if (model.LeftContainsRight() || model.RightContainsLeft())
            return;
        auto const tip =
            Repo(i).MergelessRebase(Repo(i).GetHead(), Repo(i).GetCommonBase(Repo(i).GetHead(), theirs), theirs);
        Repo(i).MoveBranchTo(Wide(BranchOf(i)), tip);
        ++account_.counts["rebased"];
        Say(NameOf(i) + " rebased " + ShortId(before) + " onto " + ShortId(onto));
        // Every difference of a rebased commit to what it was rebased onto is its decision, also what it takes back.
        for (auto commit = Repo(i).GetHead(); !(commit->GetId() == onto); commit = commit->GetParent()) {
            FilesByPath files = FilesOf(*commit);
            Paths decided = DifferingPaths(files, FilesOf(*commit->GetParent()));
            Add(commit->GetId(), {std::move(files), {}, std::move(decided), {}});
            LearnOfRewritten(i, commit->GetId());
        }
        Derive(i, before, {before, onto});
    }

    /// Adds the head as a version with the files of another one.
    void Derive(std::size_t i, Id const& from, std::vector<Id> const& contains) {
        Add(Head(i), {versions_.at(from).files, {}, {}, {}});
        for (Id const& other : contains)
            parties_[i].own.Learn(Head(i), other);
        LearnOfRewritten(i, Head(i));
        Publish(i);
    }

    /// Ancestors of a commit may have been rewritten, too, and alike by another party.
    void LearnOfRewritten(std::size_t i, Id const& commit) {
        std::set<Id> met;
        for (std::vector<Id> open{commit}; !open.empty();) {
            Id const id = open.back();
            open.pop_back();
            for (Ancestry const& facts : Repo(i).FactsOf(id)) {
                std::vector<Id> contained{facts.parent};
                for (ContainedCommit const& one : facts.contains)
                    contained.push_back(one.id);
                for (Id const& one : contained) {
                    parties_[i].own.Learn(id, one);
                    if (!one.IsEmpty() && versions_.count(one) == 0 && met.insert(one).second)
                        open.push_back(one);
                }
            }
        }
    }

    void CollectAt(std::size_t i) {
        CollectOptions options;
        options.grace = std::chrono::seconds(0);
        for (std::size_t j = 0; j < parties_.size(); ++j) {
            if (parties_[j].at != parties_[i].at)
                continue;
            // A party with unpublished commits has only the facts that it has read.
            if (sharing_ == Sharing::Branch)
                MergeShared(j);
            else
                Publish(j);
            for (auto const& [other, trees] : parties_[j].exchanged)
                options.kept.insert(options.kept.end(), trees.begin(), trees.end());
        }
        for (Id const& gone : ArchiveOf(i).FindMissing(options.kept))
            std::erase(options.kept, gone);
        Collect(ArchiveOf(i), options, nullptr);
        Collect(ArchiveOf(i), options, nullptr);
        for (std::size_t j = 0; j < parties_.size(); ++j)
            if (parties_[j].at == parties_[i].at)
                Open(j);
        ++account_.counts["collected"];
        Say(NameOf(i) + " collected");
    }

    void MergeShared(std::size_t i) {
        Id const before = Head(i);
        Id const theirs = ArchiveOf(i).ReadBranches().front().head;
        Knowledge const known = KnowledgeOf(i);
        RandomAnswers answers(random_, contents_);
        PublishMergingOutcome const outcome = Repo(i).PublishMerging(answers.resolvers);
        if (outcome.result != PublishMergingResult::Published)
            return Fault("not published");
        MergeReport const none{MergeResult::UpToDate, {}, {}};
        LearnOfRewritten(i, Head(i));
        Check(i, known, before, theirs, outcome.merges.empty() ? none : outcome.merges.back(), answers);
        parties_[i].at->known.Learn(parties_[i].own);
    }

    void Merge(std::size_t i, cow_ptr<Commit> const& theirs) {
        Id const before = Head(i);
        RandomAnswers answers(random_, contents_);
        MergeReport const report = Repo(i).MergeWithReport(theirs, answers.resolvers);
        if (!report.Succeeded())
            return Fault("not merged");
        Check(i, KnowledgeOf(i), before, theirs->GetId(), report, answers);
    }

    /// Compares the result of merging two heads with what the model allows.
    void Check(std::size_t i, Knowledge const& known, Id const& left, Id const& right, MergeReport const& report,
               RandomAnswers& answers) {
        Id const result = Head(i);
        Say("  " + ShortId(left) + " + " + ShortId(right) + " = " + ShortId(result));
        for (auto const& conflict : report.conflicts)
            if (!conflict.isDirectory)
                answers.asked.insert(Narrow(conflict.path));
        bool const isOne = result == left || result == right;
        ModelMerge const model(versions_, known, left, right);
        bool const haveOneTree = model.LeftFiles() == model.RightFiles();
        parties_[i].own.Learn(result, left);
        parties_[i].own.Learn(result, right);
        bool const eachContainsOther = model.LeftContainsRight() && model.RightContainsLeft();
        if (sharing_ == Sharing::Branch && eachContainsOther && result == right)
            return; // Nothing was unpublished.
        if (model.LeftContainsRight() != model.RightContainsLeft() &&
            !(model.LeftContainsRight() && WasPutOnRewritten(Repo(i), left)))
            return result == (model.LeftContainsRight() ? left : right) ? void()
                                                                        : Fault("a version that nobody needed");
        if (haveOneTree && isOne)
            return result == std::min(left, right) || (result == right && GaveWayRewritten(Repo(i), left))
                       ? void()
                       : Fault("not the smaller of two equal ones");
        if (isOne)
            return Fault("a side taken for the result");
        ++account_.counts["merges"];
        account_.counts["questions"] += answers.asked.size();
        account_.counts["merges without a base"] += report.lostBases.empty() ? 0U : 1U;
        if (report.lostBases.empty())
            CheckQuestions(model, answers.asked);
        ModelVersion version{FilesOf(*Repo(i).GetHead()), {}, answers.asked, {}};
        version.decided.insert(answers.beside.begin(), answers.beside.end());
        for (auto const& [path, content] : version.files)
            if (AnyRelated(version.decided, path))
                version.written.insert(content);
        version.merged = DifferingPaths(model.LeftFiles(), model.RightFiles());
        for (auto const& path : model.AllPaths()) {
            if (AnyRelated(version.decided, path))
                continue;
            std::string const fault = model.FaultOfTaking(path, ContentOf(version.files, path));
            if (!fault.empty())
                Fault(fault + ", " + path);
        }
        Add(result, std::move(version));
    }

    void CheckQuestions(ModelMerge const& model, Paths const& asked) {
        for (auto const& path : asked) {
            if (model.IsInDoubt(path))
                ++account_.counts["questions where nobody can say what is older"];
            else if (!model.BothChanged(path, true))
                Fault("a needless question, " + path);
            else if (!model.BothChanged(path, false))
                ++account_.counts["questions where one side only merged"];
        }
    }

    /// All parties merge each other's heads until no branch moves; and then once more.
    void Converge() {
        for (int times = 0; times < 20 && account_.faults.empty(); ++times) {
            std::vector<Id> const before = Heads();
            bool const areEqual = std::equal(before.begin() + 1, before.end(), before.begin());
            for (std::size_t i = 0; i < parties_.size(); ++i)
                for (std::size_t j = 0; j < parties_.size() && account_.faults.empty(); ++j)
                    if (i != j)
                        Exchange(i, j);
            if (areEqual && before == Heads()) {
                for (std::size_t i = 0; i < parties_.size(); ++i)
                    if (!Verify(ArchiveOf(i), nullptr).IsSound())
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

    std::mt19937 random_;
    Account& account_;
    Sharing sharing_;
    std::size_t pace_;
    std::int64_t seconds_ = 1'000'000'000;
    std::vector<Party> parties_;
    ModelVersions versions_;
    int contents_ = 0;
};

} // namespace KivArchive
