#include "KivVcs/Differences.h"

#include "tree/PathPrefix.h"

#include <algorithm>
#include <tuple>
#include <utility>

namespace KivVcs {

namespace {

Id IdOf(cow_ptr<Object> const& object) {
    return object ? object->GetId() : Id();
}

/// Two directories of one path, either of which may be null, and how much of the path of the directory entered last is
/// also the beginning of theirs.
struct DirectoryPair {
    cow_ptr<Tree> before;
    cow_ptr<Tree> after;
    KivStringT<char16_t> name;
    std::size_t prefixLength;
};

/// Walks the directories that differ, with a stack of its own, since they may be nested deeper than calls can be.
class DifferenceWalk {
public:
    explicit DifferenceWalk(std::size_t atMost) : atMost_(atMost) {}

    /// False if there was more than wanted.
    bool Run(cow_ptr<Tree> const& before, cow_ptr<Tree> const& after) {
        if (!Compare(before, after))
            return false;
        for (std::size_t entered = 0; !open_.empty(); ++entered) {
            if (entered == atMost_)
                return false;
            const DirectoryPair pair = std::move(open_.back());
            open_.pop_back();
            prefix_.Enter(pair.prefixLength, pair.name);
            if (!Compare(pair.before, pair.after))
                return false;
        }
        return true;
    }

    [[nodiscard]] std::vector<Difference> Take() noexcept { return std::move(found_); }

private:
    bool Compare(cow_ptr<Tree> const& before, cow_ptr<Tree> const& after) {
        if (!before && !after)
            return true;
        Tree const& one = before ? *before : *after;
        cow_ptr<Tree> const& other = before ? after : before;
        for (auto const& name : one.GetLocalBlobDiffs(other)) {
            if (found_.size() == atMost_)
                return false;
            Add(name, before, after);
        }
        const PathList directories = one.GetLocalTreeDiffs(other);
        std::for_each(directories.rbegin(), directories.rend(), [&](KivStringT<char16_t> const& name) {
            auto mine = before ? before->GetLocalTree(name) : nullptr;
            auto theirs = after ? after->GetLocalTree(name) : nullptr;
            const bool isHiddenAndSame = mine && theirs && mine->GetId() == theirs->GetId();
            if (!name.IsEmpty() && !isHiddenAndSame)
                open_.push_back({std::move(mine), std::move(theirs), name, prefix_.GetLength()});
        });
        return true;
    }

    void Add(KivStringT<char16_t> const& name, cow_ptr<Tree> const& before, cow_ptr<Tree> const& after) {
        const bool wasFile = before && before->GetLocalBlob(name);
        const bool isFile = after && after->GetLocalBlob(name);
        Difference difference;
        difference.oldId = IdOf(before ? before->GetLocalObject(name) : nullptr);
        difference.newId = IdOf(after ? after->GetLocalObject(name) : nullptr);
        if (wasFile && isFile)
            difference.kind = ChangeKind::Changed;
        else if (wasFile)
            difference.kind = difference.newId.IsEmpty() ? ChangeKind::Removed : ChangeKind::FileBecameDirectory;
        else
            difference.kind = difference.oldId.IsEmpty() ? ChangeKind::Added : ChangeKind::DirectoryBecameFile;
        difference.path = prefix_.PathOf(name);
        found_.push_back(std::move(difference));
    }

    std::size_t atMost_;
    PathPrefix prefix_;
    std::vector<DirectoryPair> open_;
    std::vector<Difference> found_;
};

KivStringViewT<char16_t> NameOf(KivStringT<char16_t> const& path) noexcept {
    int begin = path.GetLength();
    while (begin > 0 && path[begin - 1] != u'/')
        --begin;
    return KivStringViewT<char16_t>(path).Mid(begin);
}

/// Makes every file that went and one of equal content that came one renamed file, where @p keyOf, which begins with the
/// identifier, has both the same; of several such the first ones.
template <class KeyOf>
void PairByKey(std::vector<Difference>& differences, KeyOf keyOf) {
    std::vector<Difference*> gone;
    std::vector<Difference*> come;
    for (auto& difference : differences) {
        if (difference.kind == ChangeKind::Removed)
            gone.push_back(&difference);
        else if (difference.kind == ChangeKind::Added)
            come.push_back(&difference);
    }
    const auto byKey = [&keyOf](Difference const* left, Difference const* right) {
        return keyOf(*left) < keyOf(*right);
    };
    std::stable_sort(gone.begin(), gone.end(), byKey);
    std::stable_sort(come.begin(), come.end(), byKey);
    auto from = gone.begin();
    for (Difference* const to : come) {
        from = std::find_if_not(from, gone.end(), [&](Difference const* each) { return byKey(each, to); });
        if (from == gone.end())
            break;
        if (byKey(to, *from))
            continue;
        to->kind = ChangeKind::Renamed;
        to->oldId = (*from)->oldId;
        to->oldPath = (*from)->path;
        (*from)->kind = ChangeKind::Unchanged;
        ++from;
    }
    std::erase_if(differences, [](Difference const& each) { return each.kind == ChangeKind::Unchanged; });
}

cow_ptr<Tree> RootOf(cow_ptr<CommitTree> const& tree) {
    return tree ? tree->GetRoot() : nullptr;
}

} // namespace

void PairRenames(std::vector<Difference>& differences) {
    const auto contentOf = [](Difference const& each) -> Id const& {
        return each.kind == ChangeKind::Removed ? each.oldId : each.newId;
    };
    PairByKey(differences, [&](Difference const& each) {
        return std::tuple<Id const&, KivStringViewT<char16_t>>(contentOf(each), NameOf(each.path));
    });
    PairByKey(differences, [&](Difference const& each) { return std::tuple<Id const&>(contentOf(each)); });
}

Differences::Differences(cow_ptr<Tree> const& before, cow_ptr<Tree> const& after, DifferenceOptions const& options) {
    DifferenceWalk walk(options.atMost);
    isComplete_ = walk.Run(before, after);
    differences_ = walk.Take();
    // Names are visited in order; only a directory whose name begins another one's breaks the order of paths.
    std::sort(differences_.begin(), differences_.end(),
              [](Difference const& left, Difference const& right) { return left.path < right.path; });
    if (options.findRenames)
        PairRenames(differences_);
}

Differences::Differences(cow_ptr<CommitTree> const& before, cow_ptr<CommitTree> const& after,
                         DifferenceOptions const& options)
    : Differences(RootOf(before), RootOf(after), options) {}

} // namespace KivVcs
