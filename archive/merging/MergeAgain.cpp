#include "Changes.h"
#include "Questions.h"

#include <algorithm>
#include <utility>

namespace KivArchive {

namespace {

using KivVcs::IRepository;
using KivVcs::PathList;
using KivVcs::TreeConflictChoice;

/// A directory that is being merged.
struct Level {
    /// Null where a side has none.
    cow_ptr<Tree> left;
    cow_ptr<Tree> right;
    cow_ptr<Tree> result;
    /// The names that differ and are a directory on at least one side. They are merged after all others.
    PathList directories;
    std::size_t next = 0;

    /// A directory stays empty only if a side has it empty; one that the merge has emptied is removed.
    [[nodiscard]] bool IsKept() const noexcept {
        return !result->IsEmpty() || (left && left->IsEmpty()) || (right && right->IsEmpty());
    }
};

PathList DifferingNames(cow_ptr<Tree> const& left, cow_ptr<Tree> const& right) {
    auto const& one = left ? left : right;
    auto const& other = left ? right : left;
    PathList const files = one->GetLocalBlobDiffs(other);
    PathList const directories = one->GetLocalTreeDiffs(other);
    PathList names;
    std::set_union(files.begin(), files.end(), directories.begin(), directories.end(), std::back_inserter(names));
    return names;
}

/// Merges directory by directory, with a stack of its own, since directories may be nested deeper than calls.
class Merging {
public:
    Merging(IRepository& repo, MergeSources const& sources, MergeSide const& left, MergeSide const& right,
            MergeResolvers const& resolvers, IProgress* progress)
        : repo_(repo), progress_(progress), bases_(sources, left, right),
          questions_(repo, sources, resolvers, {left.tree, bases_.OnlyBase(), right.tree}) {}

    [[nodiscard]] TreeMerge Run(cow_ptr<Tree> const& left, cow_ptr<Tree> const& right) {
        TreeMerge merge;
        merge.lostBases = bases_.LostBases();
        MergeDirectory(EntryOf(left), EntryOf(right), nullptr);
        for (std::uint64_t merged = 0; !levels_.empty();) {
            ReportProgress(progress_, {"merging directories", merged, 0}, {});
            merged += Proceed() ? 1U : 0U;
        }
        merge.gaveUp = questions_.GaveUp();
        merge.conflicts = questions_.TakeConflicts();
        if (!merge.gaveUp)
            merge.tree = std::move(top_);
        return merge;
    }

private:
    /// Takes the entry of a side or of the base, or opens the directory as a new level.
    /// @param name null for the trees that are merged
    void MergeDirectory(HeldEntry const& left, HeldEntry const& right, KivStringT<char16_t> const* name) {
        if (left == right)
            return Take(left, name);
        BaseEntry const base = name != nullptr ? bases_.Of(*name) : bases_.OfAll();
        if (base && *base == left)
            return Take(right, name);
        if (base && *base == right)
            return Take(left, name);
        if (name != nullptr && base && base->file && (left.IsNothing() || right.IsNothing()))
            return Take(questions_.AskAboutEntry(*name, left, right, base), name);
        if (name != nullptr)
            Enter(*name);
        TreeConflictChoice const choice = questions_.AskAboutDirectory(left, right, base);
        if (choice == TreeConflictChoice::Merge)
            return Open(left.directory, right.directory);
        if (name != nullptr)
            Leave();
        Take(choice == TreeConflictChoice::Right ? right : choice == TreeConflictChoice::Root ? *base : left, name);
    }

    void Enter(KivStringT<char16_t> const& name) {
        questions_.Enter(name);
        bases_.Enter(name);
    }
    void Leave() noexcept {
        bases_.Leave();
        questions_.Leave();
    }

    /// Sets an entry in the result of the innermost level.
    void Take(HeldEntry const& entry, KivStringT<char16_t> const* name) {
        if (name == nullptr) {
            top_ = entry.directory;
            return;
        }
        cow_ptr<Tree>& result = levels_.back().result;
        if (EntryIn(result, *name) == entry)
            return;
        result.write()->RemoveObject(&repo_, *name);
        if (entry.file)
            result.write()->AddBlob(&repo_, *name, *entry.file);
        else if (entry.directory)
            result.write()->AddTree(&repo_, *name, *entry.directory);
    }

    void Open(cow_ptr<Tree> const& left, cow_ptr<Tree> const& right) {
        cow_ptr<Tree> result = left;
        if (!result)
            result.write();
        levels_.push_back({left, right, std::move(result), {}, 0});
        for (auto const& name : DifferingNames(left, right)) {
            HeldEntry const one = EntryIn(left, name);
            HeldEntry const other = EntryIn(right, name);
            if (one.file || other.file)
                MergeFile(name, one, other);
            else
                levels_.back().directories.push_back(name);
        }
    }

    void MergeFile(KivStringT<char16_t> const& name, HeldEntry const& left, HeldEntry const& right) {
        BaseEntry const base = bases_.Of(name);
        if (base && *base == left)
            return Take(right, &name);
        if (base && *base == right)
            return Take(left, &name);
        if (left.directory || right.directory)
            return MergeKinds(name, left, right, base);
        Take(questions_.AskAboutEntry(name, left, right, base), &name);
    }

    /// Merges a name that is a file on one side and a directory on the other.
    void MergeKinds(KivStringT<char16_t> const& name, HeldEntry const& left, HeldEntry const& right,
                    BaseEntry const& base) {
        Level const& level = levels_.back();
        auto const isFree = [&level](KivStringT<char16_t> const& one) {
            return EntryIn(level.left, one).IsNothing() && EntryIn(level.right, one).IsNothing() &&
                   EntryIn(level.result, one).IsNothing();
        };
        auto const [entry, fileName] = questions_.AskAboutKinds(name, left, right, base, isFree);
        Take(entry, &name);
        if (!fileName.IsEmpty())
            Take(left.file ? left : right, &fileName);
    }

    /// Merges the next directory of the innermost level, or ends that level if there is none left.
    /// @return whether one was left
    bool Proceed() {
        Level& level = levels_.back();
        if (level.next < level.directories.size()) {
            auto const& name = level.directories[level.next++];
            MergeDirectory(EntryIn(level.left, name), EntryIn(level.right, name), &name);
            return true;
        }
        Level const done = std::move(level);
        levels_.pop_back();
        if (levels_.empty()) {
            top_ = done.result;
            return false;
        }
        Leave();
        Level& above = levels_.back();
        Take(done.IsKept() ? EntryOf(done.result) : HeldEntry(), &above.directories[above.next - 1]);
        return false;
    }

    IRepository& repo_;
    IProgress* progress_;
    EntryBases bases_;
    Questions questions_;
    std::vector<Level> levels_;
    cow_ptr<Tree> top_;
};

} // namespace

TreeMerge MergeAgain(IRepository& repo, MergeSources const& sources, MergeSide const& left, MergeSide const& right,
                     MergeResolvers const& resolvers, IProgress* progress) {
    return Merging(repo, sources, left, right, resolvers, progress).Run(left.tree, right.tree);
}

} // namespace KivArchive
