#include "KivVcs/MergeOutcome.h"

#include "repository/RootTree.h"

#include <algorithm>
#include <utility>

namespace KivVcs {

namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

/// Passes a merge's questions on to the host's resolvers, and records questions and answers.
class ConflictRecorder {
public:
    explicit ConflictRecorder(Resolvers resolvers) : resolvers_(std::move(resolvers)) {}

    /// The resolvers for the merge. Valid as long as this recorder lives.
    [[nodiscard]] Resolvers MakeResolvers() {
        return {[this](Path path, MergeTrees const& trees) { return AskAboutBlob(path, trees); },
                [this](Path path, MergeTrees const& trees) { return AskAboutTree(path, trees); }};
    }

    [[nodiscard]] bool GaveUp() const noexcept { return gaveUp_; }
    [[nodiscard]] bool ChoseNoTree() const noexcept { return choseNoTree_; }

    /// All conflicts recorded, followed by those of @p all that were not recorded and are not below a directory that
    /// was settled as a whole.
    [[nodiscard]] std::vector<MergeConflict> TakeWithTheRestOf(std::vector<MergeConflict> all) {
        PathList known;
        for (auto const& conflict : conflicts_)
            known.push_back(conflict.isDirectory && !conflict.path.IsEmpty() ? conflict.path + u"/" : conflict.path);
        std::sort(known.begin(), known.end());
        for (auto& conflict : all) {
            if (!IsCovered(conflict.path, known))
                conflicts_.push_back(std::move(conflict));
        }
        return Take();
    }

    [[nodiscard]] std::vector<MergeConflict> Take() noexcept { return std::move(conflicts_); }

private:
    ConflictChoice AskAboutBlob(Path path, MergeTrees const& trees) {
        const ConflictChoice choice =
            resolvers_.blobResolver ? resolvers_.blobResolver(path, trees) : ConflictChoice::Undecided;
        Record(path, trees, false, SettlementOf(choice));
        return choice;
    }

    TreeConflictChoice AskAboutTree(Path path, MergeTrees const& trees) {
        const TreeConflictChoice choice =
            resolvers_.treeResolver ? resolvers_.treeResolver(path, trees) : TreeConflictChoice::Merge;
        if (const auto settlement = SettlementOf(choice))
            Record(path, trees, true, *settlement);
        return choice;
    }

    void Record(Path path, MergeTrees const& trees, bool isDirectory, ConflictSettlement settlement) {
        conflicts_.push_back(DescribeConflict(path, trees, isDirectory, settlement));
        gaveUp_ = gaveUp_ || settlement == ConflictSettlement::Undecided;
        auto const& chosen = settlement == ConflictSettlement::Left    ? trees.left
                             : settlement == ConflictSettlement::Right ? trees.right
                                                                       : trees.root;
        choseNoTree_ = choseNoTree_ || (path.empty() && !chosen);
    }

    /// Whether @p known has the path, or a directory above it. Directories in @p known end with "/".
    static bool IsCovered(KivStringT<char16_t> const& path, PathList const& known) {
        if (std::binary_search(known.begin(), known.end(), path) || (!known.empty() && known.front().IsEmpty()))
            return true;
        for (int end = path.Find(u"/"); end >= 0; end = path.Find(u"/", end + 1)) {
            if (std::binary_search(known.begin(), known.end(), path.Left(end + 1)))
                return true;
        }
        return false;
    }

    Resolvers resolvers_;
    std::vector<MergeConflict> conflicts_;
    bool gaveUp_ = false;
    bool choseNoTree_ = false;
};

/// Why a merge has not moved the branch.
MergeOutcome WhyNot(ConflictRecorder& recorder, MergeTrees trees) {
    if (recorder.GaveUp())
        return {MergeResult::GaveUp, recorder.TakeWithTheRestOf(FindConflicts(std::move(trees)))};
    const bool noTree = recorder.ChoseNoTree() || (!trees.left && !trees.right);
    return {noTree ? MergeResult::NothingToCommit : MergeResult::Refused, recorder.Take()};
}

} // namespace

MergeOutcome MergeWithOutcome(IRepository& repository, cow_ptr<Commit> const& commit, Resolvers resolvers) {
    if (!commit)
        return {};
    const auto head = repository.GetHead();
    ConflictRecorder recorder(std::move(resolvers));
    if (!head) {
        const bool moved = repository.Merge(commit, recorder.MakeResolvers());
        return {moved ? MergeResult::Forwarded : MergeResult::Refused, recorder.Take()};
    }
    const auto base = repository.GetCommonBase(head, commit);
    if (base && base->GetId() == commit->GetId())
        return {MergeResult::UpToDate, {}};
    if (!repository.Merge(commit, recorder.MakeResolvers()))
        return WhyNot(recorder, {RootTreeOf(head), RootTreeOf(base), RootTreeOf(commit)});
    const auto moved = repository.GetHead();
    const Id movedId = moved ? moved->GetId() : Id();
    if (movedId == head->GetId())
        return {MergeResult::UpToDate, recorder.Take()};
    return {movedId == commit->GetId() ? MergeResult::Forwarded : MergeResult::Merged, recorder.Take()};
}

} // namespace KivVcs
