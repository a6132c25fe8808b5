#include "Commands.h"
#include "Commit.h"
#include "MergeAttributes.h"
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
using KivVcs::ChangeKind;
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

void WriteJson(std::string_view result, Id const& head, std::string const& conflicts) {
    std::cout << R"({"result":")" << result << R"(","head":")" << DigitsOf(head) << R"(","conflicts":)" << conflicts
              << "}\n";
}

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

std::string WordFor(ChangeKind kind) {
    switch (kind) {
    case ChangeKind::Added:
        return "added it";
    case ChangeKind::Removed:
        return "removed it";
    case ChangeKind::DirectoryBecameFile:
        return "made it a file";
    case ChangeKind::FileBecameDirectory:
        return "made it a directory";
    case ChangeKind::Unchanged:
        return "left it as it was";
    case ChangeKind::Changed:
    case ChangeKind::Renamed:
        break;
    }
    return "changed it";
}

std::string_view WordFor(ConflictSettlement settlement) noexcept {
    switch (settlement) {
    case ConflictSettlement::Left:
        return "left";
    case ConflictSettlement::Right:
        return "right";
    case ConflictSettlement::Root:
        return "base";
    case ConflictSettlement::Combined:
        return "combined";
    case ConflictSettlement::Undecided:
        break;
    }
    return "undecided";
}

/// One merge: who decides, and what was decided.
class Merger {
public:
    Merger(Vault& vault, MergeOptions const& options, CommitRecord const& left, CommitRecord const& right,
           std::vector<Id> const& bases)
        : vault_(vault), options_(options), left_(left), right_(right), repository_(vault.SharedArchive()),
          reader_(vault.Archive()),
          newest_(KivVcs::ChainResolvers(KivVcs::TimeBasedConflictResolver({Text(u".vault-stamp")}, ReadStamp),
                                         right.time > left.time ? KivVcs::AlwaysChooseRight()
                                                                : KivVcs::AlwaysChooseLeft())) {
        versions_.left = left.tree;
        versions_.right = right.tree;
        versions_.prefersRight = options.policy == ConflictPolicy::Right ||
                                 (options.policy == ConflictPolicy::Newest && right.time > left.time);
        for (auto const& base : KivArchive::ReadCommits(vault.Archive(), bases)) {
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

    /// Lists every conflict with what both sides did and how it was settled.
    void Describe() const {
        for (auto const& conflict : conflicts_) {
            const auto path = PrintableName(ToUtf8(conflict.path));
            if (IsReal(conflict))
                std::cout << Coloured("conflict ", Colour::Red) << path << ": left " << WordFor(conflict.leftChange)
                          << ", right " << WordFor(conflict.rightChange) << "; " << Settlement(conflict) << '\n';
            else
                std::cout << Coloured("merged ", Colour::Green) << path << ": both changed it, in different lines\n";
        }
        for (auto const& conflict : modes_)
            std::cout << Coloured("conflict ", Colour::Red) << PrintableName(conflict.path) << ": left "
                      << conflict.left << ", right " << conflict.right << "; "
                      << (isStopped_               ? "undecided"
                          : versions_.prefersRight ? "took right"
                                                   : "took left")
                      << '\n';
    }

    [[nodiscard]] std::string Json() const {
        std::string json = "[";
        for (auto const& conflict : conflicts_)
            (json += json.size() == 1 ? "\n" : ",\n") +=
                R"({"path":)" + JsonText(ToUtf8(conflict.path)) + R"(,"left":")" + WordFor(conflict.leftChange) +
                R"(","right":")" + WordFor(conflict.rightChange) + R"(","taken":")" +
                std::string(isStopped_ ? "undecided"
                            : IsReal(conflict) && conflict.settlement == ConflictSettlement::Combined
                                ? "marked"
                                : WordFor(conflict.settlement)) +
                R"("})";
        for (auto const& conflict : modes_)
            (json += json.size() == 1 ? "\n" : ",\n") += R"({"path":)" + JsonText(conflict.path) + R"(,"left":")" +
                                                         std::string(conflict.left) + R"(","right":")" +
                                                         std::string(conflict.right) + R"(","taken":")" +
                                                         (isStopped_               ? "undecided"
                                                          : versions_.prefersRight ? "right"
                                                                                   : "left") +
                                                         R"("})";
        return json + "\n]";
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
            WriteJson("stopped", left_.id, Json());
        else
            Describe();
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
        return conflict.settlement != ConflictSettlement::Combined ||
               std::find(marked_.begin(), marked_.end(), ToUtf8(conflict.path)) != marked_.end();
    }

    [[nodiscard]] std::string Settlement(MergeConflict const& conflict) const {
        if (isStopped_ || conflict.settlement == ConflictSettlement::Undecided)
            return "undecided";
        if (conflict.settlement == ConflictSettlement::Combined)
            return "marked in the file";
        const auto& taken = conflict.settlement == ConflictSettlement::Left    ? conflict.leftId
                            : conflict.settlement == ConflictSettlement::Right ? conflict.rightId
                                                                               : conflict.rootId;
        return "took " + std::string(WordFor(conflict.settlement)) + (taken.IsEmpty() ? ", which removed it" : "");
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
            Merger const* merger) {
    if (options.json) {
        WriteJson(result, head, merger == nullptr ? "[]" : merger->Json());
        return;
    }
    if (merger != nullptr)
        merger->Describe();
    std::cout << sentence << '\n';
}

/// Of two versions with one tree both sides take the same.
std::optional<int> Unite(Vault& vault, MergeOptions const& options, Text const& branch, CommitRecord const& left,
                         CommitRecord const& right) {
    const bool isLeft = left.id < right.id;
    auto const& taken = isLeft ? left : right;
    auto const& other = isLeft ? right : left;
    KivArchive::Change change;
    change.ancestry.push_back({taken.id, taken.parent, taken.tree, {{KivArchive::Containment::FoundEqual, other.id}}});
    change.relied = {left.id, right.id};
    if (!MoveHead(vault, std::move(change), branch, left.id, taken.id))
        return std::nullopt;
    Finish(options, "equal", "both are equal; the branch is at " + DigitsOf(taken.id), taken.id, nullptr);
    return 0;
}

/// One try. @return the exit status, or nothing if somebody else has moved the branch meanwhile
std::optional<int> TryMerge(Vault& vault, MergeOptions const& options, Author const& author) {
    const auto branch = vault.CurrentBranch();
    const auto right = vault.Find(options.revision);
    const auto head = vault.HeadOf(branch);
    const auto forward = [&]() -> std::optional<int> {
        if (!MoveHead(vault, {}, branch, head, right.id))
            return std::nullopt;
        Finish(options, "forwarded", "moved forward to " + DigitsOf(right.id), right.id, nullptr);
        return 0;
    };
    if (head.IsEmpty())
        return forward();
    const auto left = vault.Find(DigitsOf(head));
    const auto bases = KivArchive::FindMergeBases(vault.Archive(), left.id, right.id);
    if (std::find(bases.begin(), bases.end(), right.id) != bases.end() || left.id == right.id) {
        Finish(options, "up to date",
               "nothing to merge: the current branch holds " + Printable(options.revision) + " already", left.id,
               nullptr);
        return 0;
    }
    if (bases.size() == 1 && bases.front() == left.id)
        return forward();
    if (left.tree == right.tree)
        return Unite(vault, options, branch, left, right);

    Merger merger(vault, options, left, right, bases);
    auto merged = merger.Run();
    if (!options.into.empty()) {
        const auto disputed = merger.WriteInto(merged);
        const auto directory = Printable(StoredName(options.into));
        Finish(options, "written",
               std::to_string(disputed) + " conflicts to settle in " + directory + "; then say: vault save " +
                   directory + " --merge " + Printable(options.revision),
               left.id, &merger);
        return disputed == 0 ? 0 : findingsExitStatus;
    }
    const auto commit =
        MakeCommit(merged.tree, left.id, right.id, author, RequireLine("Merge " + options.revision, "a message"));
    commit.AddTo(merged.change);
    if (!MoveHead(vault, std::move(merged.change), branch, left.id, commit.object.id))
        return std::nullopt;
    Finish(options, "merged", "merged as " + DigitsOf(commit.object.id), commit.object.id, &merger);
    return 0;
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
