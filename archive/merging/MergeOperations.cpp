#include "Changes.h"
#include "merging/AncestryGraph.h"
#include "repository/RepositoryState.h"

namespace KivArchive {

namespace {

using KivVcs::MergeResult;

cow_ptr<Tree> RootTreeOf(Commit const& commit) {
    auto const holder = commit.GetCommitTree();
    return holder ? holder->GetRoot() : nullptr;
}

} // namespace

/// Enters a commit of the host's, with its ancestors, that the storage does not have, since facts are read from there.
void ArchivedRepository::EnterLine(cow_ptr<Commit> commit) {
    for (; commit && !GetCommitFromStorage(commit->GetId()); commit = commit->GetHeldParent())
        SyncWithStorage(commit);
}

AncestryReader ArchivedRepository::FactsReader(IProgress* progress) const {
    return [this, progress](std::span<const Id> commits, std::size_t more) {
        ReportProgress(progress, {"looking where histories meet", 0, 0}, {});
        return ReadAncestry(commits, Follow::Everything, more);
    };
}

MergeSources ArchivedRepository::SourcesOfMerge(IProgress* progress) {
    MergeSources sources;
    sources.ancestry = FactsReader(progress);
    sources.tree = [this](Id const& id) -> cow_ptr<Tree> {
        if (auto known = GetTreeFromStorage(id))
            return known;
        try {
            return state_->source->FetchTree(id);
        } catch (ArchiveError const& error) {
            if (error.GetKind() != Failure::Collected && error.GetKind() != Failure::Damaged)
                throw;
            return nullptr;
        }
    };
    sources.content = [](Blob const& file) {
        auto const* const archived = dynamic_cast<ArchivedBlob const*>(&file);
        return archived != nullptr ? archived->ReadContent() : file.GetData();
    };
    return sources;
}

/// Merges if that takes no new commit; otherwise returns nothing.
std::optional<MergeResult> ArchivedRepository::MergeWithoutCommit(cow_ptr<Commit> const& commit, IProgress* progress) {
    if (!commit)
        return MergeResult::NothingToCommit;
    auto const forward = [&] {
        return MoveBranchTo(GetCurentBranch(), commit) ? MergeResult::Forwarded : MergeResult::Refused;
    };
    cow_ptr<Commit> const head = GetHead();
    if (!head)
        return forward();
    Id const headId = head->GetId();
    Id const commitId = commit->GetId();
    if (headId == commitId)
        return MergeResult::UpToDate;
    EnterLine(commit);
    AncestryGraph graph(FactsReader(progress));
    auto const meeting = graph.Meet(graph.Enter(headId), graph.Enter(commitId));
    bool const bothContain = meeting.leftContainsRight && meeting.rightContainsLeft;
    if (!bothContain && meeting.leftContainsRight)
        return MergeResult::UpToDate;
    if (!bothContain && meeting.rightContainsLeft)
        return forward();
    if (!(head->GetRootId() == commit->GetRootId()))
        return {};
    // The smaller identifier, so that both sides of an exchange take the same commit.
    bool const staysHere = headId < commitId;
    if (!bothContain)
        RecordContained(staysHere ? head : commit, Containment::FoundEqual, staysHere ? commit : head);
    return staysHere ? MergeResult::UpToDate : forward();
}

bool ArchivedRepository::FastForwardMerge(cow_ptr<Commit> commit) {
    auto const result = MergeWithoutCommit(commit, nullptr);
    return result && *result <= MergeResult::Forwarded;
}

bool ArchivedRepository::Merge(cow_ptr<Commit> commit, Resolvers resolvers) {
    return MergeWithReport(commit, {std::move(resolvers), {}, {}}).Succeeded();
}

bool ArchivedRepository::Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) {
    return Merge3WayWithReport(commit, {std::move(resolvers), {}, {}}).Succeeded();
}

MergeReport ArchivedRepository::MergeWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                                IProgress* progress) {
    if (auto const result = MergeWithoutCommit(commit, progress))
        return {*result, {}, {}};
    return Merge3WayWithReport(commit, resolvers, progress);
}

MergeReport ArchivedRepository::Merge3WayWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                                    IProgress* progress) {
    cow_ptr<Commit> const head = GetHead();
    if (!commit || !head)
        return {};
    EnterLine(commit);
    TreeMerge merge = MergeAgain(*this, SourcesOfMerge(progress), {head->GetId(), RootTreeOf(*head)},
                                 {commit->GetId(), RootTreeOf(*commit)}, resolvers, progress);
    MergeReport report{MergeResult::NothingToCommit, std::move(merge.conflicts), std::move(merge.lostBases)};
    if (merge.gaveUp)
        report.result = MergeResult::GaveUp;
    else if (merge.tree)
        report.result = CommitMerge(head, commit, std::move(merge.tree)) ? MergeResult::Merged : MergeResult::Refused;
    return report;
}

bool ArchivedRepository::CommitMerge(cow_ptr<Commit> const& head, cow_ptr<Commit> const& commit, cow_ptr<Tree> tree) {
    Commit merge(head, false);
    merge.ReplaceRoot(this, std::move(tree));
    if (state_->options.describeMerge)
        state_->options.describeMerge(merge, *commit);
    cow_ptr<Commit> const stored = DoCommit(merge);
    if (!stored)
        return false;
    try {
        RecordContained(stored, Containment::Merged, commit);
    } catch (...) {
        // Without a record of what was merged, a later merge would ask again about what this one has settled.
        MoveBranchTo(GetCurentBranch(), head);
        throw;
    }
    return true;
}

} // namespace KivArchive
