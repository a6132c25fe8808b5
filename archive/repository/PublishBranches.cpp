#include "repository/MissingCommits.h"
#include "repository/Publishing.h"
#include "repository/RepositoryState.h"

#include <algorithm>
#include <optional>
#include <random>
#include <set>
#include <thread>

namespace KivArchive {

namespace {

/// How many times publishing is tried if others collect meanwhile what it relies on.
constexpr int mostAttempts = 3;

/// How many facts are read to find what stands for a rewritten head, at first and at most.
constexpr std::size_t firstFactsOfRewriting = 40;
constexpr std::size_t mostFactsOfRewriting = 10'240;

constexpr std::chrono::milliseconds longestBackOff{1000};

/// The commit of a line that stands for a rewritten one.
struct StandIn {
    /// Null if there is none, or if the line contains the commit itself.
    Id commit;
    /// Whether reading more facts could not change it.
    bool isCertain = true;
};

/// Follows parents from @p head to the first commit that was rewritten from @p wanted, be it over several steps.
StandIn FindStandIn(std::vector<Ancestry> const& known, Id const& head, Id const& wanted) {
    std::unordered_map<Id, Ancestry const*> facts;
    for (Ancestry const& one : known)
        facts.emplace(one.commit, &one);
    StandIn found;
    auto const standsForWanted = [&](Id const& commit) {
        std::vector<Id> open{commit};
        for (std::set<Id> met; !open.empty();) {
            Id const id = open.back();
            open.pop_back();
            if (id == wanted)
                return true;
            auto const at = facts.find(id);
            if (at == facts.end())
                found.isCertain = false;
            else if (met.insert(id).second)
                for (ContainedCommit const& contained : at->second->contains)
                    if (contained.how == Containment::RewrittenFrom)
                        open.push_back(contained.id);
        }
        return false;
    };
    std::set<Id> met;
    for (Id id = head; !id.IsEmpty() && !(id == wanted) && met.insert(id).second; id = facts.at(id)->parent) {
        if (!facts.contains(id)) {
            found.isCertain = false;
            break;
        }
        if (standsForWanted(id)) {
            found.commit = id;
            break;
        }
    }
    return found;
}

} // namespace

/// The branches to be moved in the archive.
struct ArchivedRepository::Moves {
    std::vector<BranchMove> moves;
    /// The heads of those that are not removed.
    std::vector<cow_ptr<Commit>> heads;
};

ArchivedRepository::Moves ArchivedRepository::PendingMoves(std::span<const KivStringT<char16_t>> branches) const {
    Moves pending;
    std::vector<KivStringT<char16_t>> names(branches.begin(), branches.end());
    std::sort(names.begin(), names.end());
    names.erase(std::unique(names.begin(), names.end()), names.end());
    for (auto const& name : names) {
        auto const known = state_->branches.find(name);
        KnownBranch const branch = known == state_->branches.end() ? KnownBranch() : known->second;
        cow_ptr<Commit> own = state_->storage->GetHead(name);
        Id const ownId = own ? own->GetId() : Id();
        bool const isUnreadable = !own && branch.unreadable && state_->storage->BranchExist(name);
        if (isUnreadable || ownId == branch.published)
            continue;
        // What others have published may be replaced if the host has merged it.
        bool const hasMerged = own && !(branch.published == branch.taken) && IsContained(branch.published, own);
        Id const expected = hasMerged ? branch.published : branch.taken;
        if (ownId == expected)
            continue;
        pending.moves.push_back({name, expected, ownId});
        if (own)
            pending.heads.push_back(std::move(own));
    }
    return pending;
}

/// Whether one of the unpublished commits of @p in's line is @p commit, is on top of it, or contains it.
bool ArchivedRepository::IsContained(Id const& commit, cow_ptr<Commit> const& in) const {
    std::vector<cow_ptr<Commit>> open{in};
    std::set<Id> met;
    while (!open.empty()) {
        cow_ptr<Commit> const next = std::move(open.back());
        open.pop_back();
        Id const id = next->GetId();
        if (id == commit || next->GetParentId() == commit)
            return true;
        if (!met.insert(id).second || !state_->storage->MayBeUnpublished(id))
            continue;
        Ancestry const* const facts = state_->facts.Find(id);
        if (facts != nullptr && std::any_of(facts->contains.begin(), facts->contains.end(),
                                            [&](ContainedCommit const& contained) { return contained.id == commit; }))
            return true;
        for (auto const& merged : state_->facts.MergedBy(id))
            open.push_back(merged);
        if (cow_ptr<Commit> parent = next->GetHeldParent())
            open.push_back(std::move(parent));
    }
    return false;
}

PublishOutcome ArchivedRepository::Publish(IProgress* progress) {
    std::vector<KivStringT<char16_t>> names;
    auto const& refs = state_->storage->GetRefs();
    names.reserve(refs.size() + state_->branches.size());
    for (auto const& [name, head] : refs)
        names.push_back(name);
    for (auto const& [name, known] : state_->branches)
        names.push_back(name);
    return Publish(names, {}, progress);
}

PublishOutcome ArchivedRepository::Publish(std::span<const KivStringT<char16_t>> branches,
                                           std::vector<RecordChange> const& records, IProgress* progress) {
    bool asksForAll = false;
    for (int attempt = 1;; ++attempt) {
        try {
            PublishOutcome outcome = PublishOnce(branches, records, asksForAll, progress);
            if (!IsOwnDoing(outcome) || attempt == mostAttempts)
                return outcome;
        } catch (ArchiveError const& error) {
            if (error.GetKind() != Failure::Collected || attempt == mostAttempts)
                throw;
            asksForAll = true;
        }
        Refresh(progress);
    }
}

/// Whether a race was lost only to an earlier try of this repository, which succeeded although it ended with an
/// exception.
bool ArchivedRepository::IsOwnDoing(PublishOutcome const& outcome) const {
    return !outcome.published && outcome.changedRecords.empty() &&
           std::all_of(outcome.moved.begin(), outcome.moved.end(),
                       [this](Branch const& branch) { return state_->OwnHead(branch.name) == branch.head; });
}

PublishOutcome ArchivedRepository::PublishOnce(std::span<const KivStringT<char16_t>> branches,
                                               std::vector<RecordChange> const& records, bool asksForAll,
                                               IProgress* progress) {
    Moves pending = PendingMoves(branches);
    State& state = *state_;
    auto const isUnpublished = [&state](Id const& id) { return state.storage->MayBeUnpublished(id); };
    if (pending.moves.empty() && records.empty() && !state.facts.HasFactsOfPublished(isUnpublished))
        return {true, {}, {}};
    auto const commits = MissingCommits(*state.storage, state.facts, state.Archive(), asksForAll).Find(pending.heads);
    Publishing publishing(state.Archive(), *state.storage, state.facts, pending.moves, asksForAll, progress);
    publishing.Store(commits);
    // Whatever can fail is done before the branches move.
    std::vector<Id> published;
    published.reserve(commits.size());
    for (auto const& commit : commits)
        published.push_back(commit->GetId());
    for (BranchMove const& move : pending.moves)
        state.branches.try_emplace(move.name);
    ChangeOutcome outcome = publishing.Finish(records);
    if (!outcome.applied)
        return {false, std::move(outcome.movedBranches), std::move(outcome.changedRecords)};
    state.storage->SetPublished(published);
    for (BranchMove const& move : pending.moves) {
        if (move.head.IsEmpty())
            state.branches.erase(move.name);
        else
            state.branches.find(move.name)->second = {move.head, move.head, {}};
    }
    state.facts.ForgetPublished(isUnpublished);
    return {true, {}, {}};
}

PublishMergingOutcome ArchivedRepository::PublishMerging(Resolvers const& resolvers, IProgress* progress) {
    return PublishMerging(MergeResolvers{resolvers, {}, {}}, progress);
}

PublishMergingOutcome ArchivedRepository::PublishMerging(MergeResolvers const& resolvers, IProgress* progress) {
    PublishMergingOutcome outcome;
    std::minstd_rand random(
        static_cast<std::uint_fast32_t>(std::chrono::steady_clock::now().time_since_epoch().count()));
    std::chrono::milliseconds wait = state_->options.backOff;
    while (outcome.attempts < state_->options.attempts) {
        ++outcome.attempts;
        RefreshOutcome const refreshed = Refresh(progress);
        for (auto const& branch : refreshed.diverged) {
            outcome.merges.push_back(MergeDiverged(branch, resolvers, progress));
            if (!outcome.merges.back().Succeeded()) {
                outcome.result = PublishMergingResult::GaveUp;
                outcome.branch = branch;
                return outcome;
            }
        }
        if (Publish(progress).published) {
            outcome.result = PublishMergingResult::Published;
            return outcome;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(
            std::uniform_int_distribution<std::chrono::milliseconds::rep>(0, wait.count())(random)));
        wait = std::min(2 * wait, longestBackOff);
    }
    return outcome;
}

MergeReport ArchivedRepository::MergeDiverged(KivStringT<char16_t> const& branch, MergeResolvers const& resolvers,
                                              IProgress* progress) {
    RebaseOntoRewritten(branch);
    KnownBranch& known = state_->branches.at(branch);
    MergeReport report;
    report.result = KivVcs::MergeResult::UpToDate;
    if (!IsContained(known.published, state_->storage->GetHead(branch)))
        report = MergePublished(branch, state_->source->FetchCommit(known.published), resolvers, progress);
    if (report.Succeeded())
        known.taken = known.published;
    return report;
}

/// If the commit below the unpublished ones of the branch was rewritten, rebases these onto what stands for it.
void ArchivedRepository::RebaseOntoRewritten(KivStringT<char16_t> const& branch) {
    cow_ptr<Commit> const own = state_->storage->GetHead(branch);
    cow_ptr<Commit> fork = own;
    while (fork && state_->storage->MayBeUnpublished(fork->GetId()))
        fork = fork->GetParent();
    if (!fork || fork == own)
        return;
    Id const published = state_->branches.at(branch).published;
    // Few at first: mostly, others have published little since then.
    std::size_t more = firstFactsOfRewriting;
    for (;; more *= 4) {
        auto const known = state_->Archive().ReadAncestry({&published, 1}, Follow::Everything, more);
        auto const [standIn, isCertain] = FindStandIn(known, published, fork->GetId());
        if (!isCertain && known.size() > more && more < mostFactsOfRewriting)
            continue;
        if (!standIn.IsEmpty())
            MoveBranchTo(branch, MergelessRebase(own, fork, state_->source->FetchCommit(standIn)));
        return;
    }
}

MergeReport ArchivedRepository::MergePublished(KivStringViewT<char16_t> branch, cow_ptr<Commit> const& theirs,
                                               MergeResolvers const& resolvers, IProgress* progress) {
    KivStringT<char16_t> const before = Repository::GetCurentBranch();
    Repository::Checkout(branch);
    std::optional<MergeReport> report;
    try {
        report = MergeWithReport(theirs, resolvers, progress);
    } catch (...) {
        try {
            ReturnTo(before);
        } catch (...) { // NOLINT(bugprone-empty-catch)
            // The merged branch stays current then, since the host must get the first exception.
        }
        throw;
    }
    ReturnTo(before);
    return *std::move(report);
}

/// Makes a branch current again, even if it has been removed meanwhile.
void ArchivedRepository::ReturnTo(KivStringT<char16_t> const& branch) {
    auto* const storage = state_->storage;
    if (storage->BranchExist(branch)) {
        Repository::Checkout(branch);
        return;
    }
    storage->CreateBranch(branch, nullptr);
    try {
        Repository::Checkout(branch);
    } catch (...) {
        storage->RemoveBranch(branch);
        throw;
    }
    storage->RemoveBranch(branch);
}

} // namespace KivArchive
