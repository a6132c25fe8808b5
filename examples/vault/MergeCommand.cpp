#include "Commands.h"
#include "Commit.h"
#include "MergeReport.h"
#include "Names.h"
#include "Output.h"
#include "Overlay.h"
#include "Problem.h"
#include "Restore.h"
#include "Snapshot.h"

#include <KivArchive/ArchivedRepository.h>
#include <KivArchive/Merging.h>
#include <algorithm>
#include <iostream>

namespace vault {

using KivArchive::DisputedContents;
using KivVcs::ConflictChoice;
using KivVcs::ConflictSettlement;
using KivVcs::cow_ptr;
using KivVcs::MergeConflict;
using KivVcs::MergeTrees;
using KivVcs::Tree;

namespace {

using PathView = KivVcs::array_view<TextView const>;

constexpr int mostAttempts = 20;
/// What is put after the name of the other side's file.
constexpr std::string_view theirsSuffix = "~theirs";

std::string Join(PathView path) {
    std::string joined;
    for (auto const& component : path)
        joined += (joined.empty() ? "" : "/") + ToUtf8(component);
    return joined;
}

bool IsAuxiliary(std::string_view path) {
    const auto name = path.substr(path.find_last_of('/') + 1);
    return IsOwn(name) || name == stampName;
}

KivVcs::optional<KivVcs::Time> ReadStamp(cow_ptr<KivVcs::Blob> const& blob) {
    const Text digits = KivVcs::Helpers::StringAFromBuffer(blob->GetData());
    if (digits.IsEmpty() || digits[0] < u'0' || digits[0] > u'9')
        return std::nullopt;
    return KivVcs::Time::FromTimeT(KivVcs::String::Int64FromString(digits), KivVcs::TimeZone::Utc);
}

/// What is merged.
struct Sides {
    /// The current branch, whose head is the left side.
    Text branch;
    CommitRecord left;
    CommitRecord right;
    /// Where their histories met.
    std::vector<Id> bases;
};

/// One merge: who decides, and what was decided.
class Merger {
public:
    Merger(Vault& vault, MergeOptions const& options, Sides const& sides)
        : vault_(vault), options_(options), left_(sides.left), right_(sides.right), repository_(vault.SharedArchive()),
          reader_(vault.Archive()),
          newest_(KivVcs::ChainResolvers(KivVcs::TimeBasedConflictResolver({Text(u".vault-stamp")}, ReadStamp),
                                         right_.time > left_.time ? KivVcs::AlwaysChooseRight()
                                                                  : KivVcs::AlwaysChooseLeft())) {
        versions_.left = left_.tree;
        versions_.right = right_.tree;
        versions_.prefersRight = options.policy == ConflictPolicy::Right ||
                                 (options.policy == ConflictPolicy::Newest && right_.time > left_.time);
        for (auto const& base : KivArchive::ReadCommits(vault.Archive(), sides.bases)) {
            if (base.tree.IsEmpty() || vault.Archive().FindMissing(std::span(&base.tree, 1)).empty())
                versions_.bases.push_back(base.tree);
        }
    }

    /// @throws Problem if it cannot be done, or is not wanted because of conflicts
    MergedTree Run() {
        const auto merge = KivArchive::MergeAgain(repository_, Sources(), {left_.id, TreeOf(left_.tree)},
                                                  {right_.id, TreeOf(right_.tree)}, Resolvers());
        for (auto const& lost : merge.lostBases)
            Warn("what both had at " + Shortened(lost) + " is not known any more");
        for (auto const& conflict : merge.conflicts) {
            const auto path = ToUtf8(conflict.path);
            if (IsAuxiliary(path))
                continue;
            conflicts_.push_back(conflict);
            if (conflict.settlement != ConflictSettlement::Combined)
                versions_.settled.insert(path);
        }
        if (merge.gaveUp || !merge.tree)
            Stop("the merge was given up; nothing was changed");
        auto merged = MergeAttributes(vault_.Archive(), merge.tree, versions_);
        modes_ = merged.conflicts;
        if (options_.policy == ConflictPolicy::Stop && options_.into.empty() && IsDisputed())
            Stop("stopped by conflicts; nothing was changed (--on-conflict chooses who wins, --into writes them into a "
                 "directory)");
        return merged;
    }

    [[nodiscard]] bool IsDisputed() const {
        return !modes_.empty() || std::any_of(conflicts_.begin(), conflicts_.end(),
                                              [this](MergeConflict const& conflict) { return IsReal(conflict); });
    }

    /// What became of every path that both sides changed.
    [[nodiscard]] std::vector<MergedPath> Report() const {
        std::vector<MergedPath> paths;
        for (auto const& conflict : conflicts_)
            paths.push_back(DescribeConflict(conflict, IsMarked(conflict), isStopped_));
        for (auto const& conflict : modes_)
            paths.push_back(DescribeConflict(conflict, versions_.prefersRight, isStopped_));
        return paths;
    }

    /// Writes the merged version and, beside what is disputed and not in it, what the other side has.
    std::size_t WriteInto(MergedTree const& merged) {
        Overlay overlay(vault_.Archive());
        overlay.Add(merged.change);
        Progress progress("restoring");
        auto problems = Restore(overlay, {"", true, merged.tree, {}}, {options_.into, false, false, false}, progress);
        std::size_t disputed = 0;
        for (auto const& conflict : conflicts_) {
            if (!IsReal(conflict))
                continue;
            ++disputed;
            const auto path = ToUtf8(conflict.path);
            const auto theirs = reader_.Find(right_.tree, path);
            if (conflict.settlement != ConflictSettlement::Left || !theirs || theirs->id == merged.tree)
                continue;
            const auto target = options_.into + '/' + FilePath(path) + std::string(theirsSuffix);
            for (auto& problem : Restore(overlay, *theirs, {target, false, false, false}, progress))
                problems.push_back(std::move(problem));
        }
        for (auto const& problem : problems)
            Warn("not written: " + problem);
        return disputed + modes_.size();
    }

private:
    [[noreturn]] void Stop(std::string const& reason) {
        isStopped_ = true;
        if (options_.json)
            WriteMergeJson("stopped", left_.id, Report());
        else
            ListMerged(Report());
        throw Problem(reason, findingsExitStatus);
    }

    [[nodiscard]] KivArchive::MergeSources Sources() {
        return {[this](std::span<const Id> commits, std::size_t more) {
                    return vault_.Archive().ReadAncestry(commits, KivArchive::Follow::Everything, more);
                },
                [this](Id const& tree) { return TreeOf(tree); },
                [this](KivVcs::Blob const& blob) { return repository_.ReadContent(blob.GetId()); }};
    }

    cow_ptr<Tree> TreeOf(Id const& id) {
        if (id.IsEmpty())
            return nullptr;
        const auto missing = repository_.Load(std::span(&id, 1));
        return missing.empty() ? repository_.GetTreeFromStorage(id) : nullptr;
    }

    [[nodiscard]] KivArchive::MergeResolvers Resolvers() {
        KivArchive::MergeResolvers resolvers;
        resolvers.choices.blobResolver = [this](PathView path, MergeTrees const& trees) { return Decide(path, trees); };
        resolvers.choices.treeResolver =
            KivVcs::always_return_t<KivVcs::TreeConflictChoice>{KivVcs::TreeConflictChoice::Merge};
        resolvers.contents = [this](PathView path, DisputedContents const& contents) {
            return MergeContents(path, contents);
        };
        return resolvers;
    }

    ConflictChoice Decide(PathView path, MergeTrees const& trees) {
        // Attributes are brought together afterwards, entry by entry, of directories that are still there.
        if (!path.empty() && IsOwn(ToUtf8(path.back())))
            return trees.left && trees.left->GetDeepObject(path) ? ConflictChoice::Left : ConflictChoice::Right;
        if (!path.empty() && ToUtf8(path.back()) == stampName)
            return newest_(path, trees);
        switch (options_.policy) {
        case ConflictPolicy::Right:
            return ConflictChoice::Right;
        case ConflictPolicy::Base:
            return ConflictChoice::Root;
        case ConflictPolicy::Newest:
            return newest_(path, trees);
        case ConflictPolicy::Left:
        case ConflictPolicy::Stop:
            break;
        }
        // Into a directory goes what is there; who removed it is told.
        if (!options_.into.empty() && trees.left && !trees.left->GetDeepObject(path))
            return ConflictChoice::Right;
        return ConflictChoice::Left;
    }

    std::optional<Buffer> MergeContents(PathView path, DisputedContents const& contents) {
        const auto joined = Join(path);
        if (IsAuxiliary(joined) || !contents.base || IsLink(left_.tree, joined) || IsLink(right_.tree, joined))
            return std::nullopt;
        KivArchive::TextMergeOptions merging;
        merging.showConflicts = !options_.into.empty();
        merging.leftLabel = "current";
        merging.rightLabel = "other";
        auto merge = KivArchive::MergeTextLines(*contents.base, contents.left, contents.right, merging);
        if (merge.result == KivArchive::TextMergeResult::GaveUp ||
            (merge.result == KivArchive::TextMergeResult::Conflicts && !merging.showConflicts))
            return std::nullopt;
        if (merge.result == KivArchive::TextMergeResult::Conflicts)
            marked_.push_back(joined);
        return std::move(merge.text);
    }

    bool IsLink(Id const& tree, std::string const& path) {
        const auto entry = reader_.Find(tree, path);
        return entry && entry->Kind() == EntryKind::Link;
    }

    /// Whether somebody has to decide, rather than texts that were merged line by line.
    [[nodiscard]] bool IsReal(MergeConflict const& conflict) const {
        return conflict.settlement != ConflictSettlement::Combined || IsMarked(conflict);
    }

    [[nodiscard]] bool IsMarked(MergeConflict const& conflict) const {
        return conflict.settlement == ConflictSettlement::Combined &&
               std::find(marked_.begin(), marked_.end(), ToUtf8(conflict.path)) != marked_.end();
    }

    Vault& vault_;
    MergeOptions const& options_;
    CommitRecord const& left_;
    CommitRecord const& right_;
    KivArchive::ArchivedRepository repository_;
    TreeReader reader_;
    KivVcs::BlobConflictResolver newest_;
    MergedVersions versions_;
    std::vector<MergeConflict> conflicts_;
    std::vector<ModeConflict> modes_;
    /// Files that have conflicts marked in them.
    std::vector<std::string> marked_;
    bool isStopped_ = false;
};

void Finish(MergeOptions const& options, std::string_view result, std::string const& sentence, Id const& head,
            std::span<MergedPath const> paths = {}) {
    if (options.json) {
        WriteMergeJson(result, head, paths);
        return;
    }
    ListMerged(paths);
    std::cout << sentence << '\n';
}

/// Of two versions with one tree both sides take the same.
std::optional<int> Unite(Vault& vault, MergeOptions const& options, Sides const& sides) {
    const bool isLeft = sides.left.id < sides.right.id;
    auto const& taken = isLeft ? sides.left : sides.right;
    auto const& other = isLeft ? sides.right : sides.left;
    KivArchive::Change change;
    change.ancestry.push_back({taken.id, taken.parent, taken.tree, {{KivArchive::Containment::FoundEqual, other.id}}});
    change.relied = {sides.left.id, sides.right.id};
    if (!MoveHead(vault, std::move(change), sides.branch, sides.left.id, taken.id))
        return std::nullopt;
    Finish(options, "equal", "both are equal; the branch is at " + DigitsOf(taken.id), taken.id);
    return 0;
}

/// Of two versions that both have something which the other one lacks. @return as `TryMerge`
std::optional<int> MergeBoth(Vault& vault, MergeOptions const& options, Sides const& sides, Author const& author) {
    Merger merger(vault, options, sides);
    auto merged = merger.Run();
    if (!options.into.empty()) {
        const auto disputed = merger.WriteInto(merged);
        const auto directory = Printable(StoredName(options.into));
        Finish(options, "written",
               Counted(disputed, "conflict") + " to settle in " + directory + "; then say: vault save " + directory +
                   " --merge " + Printable(options.revision),
               sides.left.id, merger.Report());
        return disputed == 0 ? 0 : findingsExitStatus;
    }
    const auto commit = MakeCommit(merged.tree, sides.left.id, sides.right.id, author,
                                   RequireLine("Merge " + options.revision, "a message"));
    commit.AddTo(merged.change);
    if (!MoveHead(vault, std::move(merged.change), sides.branch, sides.left.id, commit.object.id))
        return std::nullopt;
    Finish(options, "merged", "merged as " + DigitsOf(commit.object.id), commit.object.id, merger.Report());
    return 0;
}

/// One try. @return the exit status, or nothing if somebody else has moved the branch meanwhile
std::optional<int> TryMerge(Vault& vault, MergeOptions const& options, Author const& author) {
    Sides sides;
    sides.branch = vault.CurrentBranch();
    sides.right = vault.Find(options.revision);
    const auto head = vault.HeadOf(sides.branch);
    const auto forward = [&]() -> std::optional<int> {
        if (!MoveHead(vault, {}, sides.branch, head, sides.right.id))
            return std::nullopt;
        Finish(options, "forwarded", "moved forward to " + DigitsOf(sides.right.id), sides.right.id);
        return 0;
    };
    if (head.IsEmpty())
        return forward();
    sides.left = vault.Find(DigitsOf(head));
    sides.bases = KivArchive::FindMergeBases(vault.Archive(), head, sides.right.id);
    if (std::find(sides.bases.begin(), sides.bases.end(), sides.right.id) != sides.bases.end() ||
        head == sides.right.id) {
        Finish(options, "up to date",
               "nothing to merge: the current branch holds " + Printable(options.revision) + " already", head);
        return 0;
    }
    if (sides.bases.size() == 1 && sides.bases.front() == head)
        return forward();
    return sides.left.tree == sides.right.tree ? Unite(vault, options, sides)
                                               : MergeBoth(vault, options, sides, author);
}

} // namespace

int Merge(VaultPlace const& place, MergeOptions const& options) {
    const auto author = ParseAuthor(options.author.empty() ? DefaultAuthor() : options.author);
    Vault vault(place, Vault::Access::Write);
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        if (const auto status = TryMerge(vault, options, author))
            return *status;
    }
    throw Problem("others moved this branch again and again; nothing was merged");
}

} // namespace vault
