#include "KivVcs/Differences.h"

#include "tree/DirectoryPairs.h"

#include <algorithm>
#include <utility>

namespace KivVcs {

using detail::Held;

namespace {

Id IdOf(Object const* object) {
    return object != nullptr ? object->GetId() : Id();
}

bool IsSame(Tree const* before, Tree const* after) {
    return before != nullptr && after != nullptr && before->HasSameId(*after);
}

Difference DifferenceOf(KivStringT<char16_t> path, Held const& was, Held const& is) {
    Difference difference;
    difference.oldId = IdOf(was.Visible());
    difference.newId = IdOf(is.Visible());
    if (was.GetBlob() != nullptr && is.GetBlob() != nullptr)
        difference.kind = ChangeKind::Changed;
    else if (was.GetBlob() != nullptr)
        difference.kind = difference.newId.IsEmpty() ? ChangeKind::Removed : ChangeKind::FileBecameDirectory;
    else
        difference.kind = difference.oldId.IsEmpty() ? ChangeKind::Added : ChangeKind::DirectoryBecameFile;
    difference.path = std::move(path);
    return difference;
}

/// Appends the differences between two trees, either of which may be null, directory by directory. False if there are more
/// of them, or more directories to look into, than @p atMost.
bool FindDifferences(Tree const* before, Tree const* after, std::size_t atMost, std::vector<Difference>& found) {
    detail::DirectoryPairs pairs(before, after);
    std::size_t entered = 0;
    bool isComplete = true;
    do {
        if (entered++ > atMost)
            return false;
        pairs.ForEachDifference([&](KivStringT<char16_t> const& name, Held const& was, Held const& is) {
            if (detail::BlobDiffers(was, is)) {
                isComplete = isComplete && found.size() < atMost;
                if (isComplete)
                    found.push_back(DifferenceOf(pairs.PathOf(name), was, is));
            }
            // One that a blob of the same name hides may be the same on both sides.
            return isComplete && !name.IsEmpty() && detail::TreeDiffers(was, is) &&
                   !IsSame(was.GetTree(), is.GetTree());
        });
    } while (isComplete && pairs.Next());
    return isComplete;
}

KivStringViewT<char16_t> NameOf(KivStringT<char16_t> const& path) noexcept {
    int begin = path.GetLength();
    while (begin > 0 && path[begin - 1] != u'/')
        --begin;
    return KivStringViewT<char16_t>(path).Mid(begin);
}

using Order = bool (*)(Difference const&, Difference const&);

bool IsBeforeByPath(Difference const& left, Difference const& right) {
    return left.path < right.path;
}

Id const& ContentOf(Difference const& each) noexcept {
    return each.kind == ChangeKind::Removed ? each.oldId : each.newId;
}

bool IsBeforeByContent(Difference const& left, Difference const& right) {
    return ContentOf(left) < ContentOf(right);
}

bool IsBeforeByContentAndName(Difference const& left, Difference const& right) {
    const auto order = ContentOf(left) <=> ContentOf(right);
    return order < 0 || (order == 0 && NameOf(left.path) < NameOf(right.path));
}

/// Sorts what points into one list; equal ones stay as they are in the list. All orders share this one function, since the
/// code of a sort is large where programs are counted in kilobytes.
void Sort(std::vector<Difference*>& differences, Order isBefore) {
    std::sort(differences.begin(), differences.end(), [isBefore](Difference const* left, Difference const* right) {
        return isBefore(*left, *right) || (left < right && !isBefore(*right, *left));
    });
}

void SortByPath(std::vector<Difference>& differences) {
    std::vector<Difference*> order;
    order.reserve(differences.size());
    for (auto& difference : differences)
        order.push_back(&difference);
    Sort(order, IsBeforeByPath);
    std::vector<Difference> sorted;
    sorted.reserve(differences.size());
    for (Difference* const difference : order)
        sorted.push_back(std::move(*difference));
    differences = std::move(sorted);
}

/// Makes every file that went and one that came one renamed file, where neither is before the other; of several such the
/// first ones. @p isBefore looks at the contents first.
void PairEqual(std::vector<Difference>& differences, Order isBefore) {
    std::vector<Difference*> gone;
    std::vector<Difference*> come;
    for (auto& difference : differences) {
        if (difference.kind == ChangeKind::Removed)
            gone.push_back(&difference);
        else if (difference.kind == ChangeKind::Added)
            come.push_back(&difference);
    }
    Sort(gone, isBefore);
    Sort(come, isBefore);
    auto from = gone.begin();
    for (Difference* const to : come) {
        from = std::find_if_not(from, gone.end(), [&](Difference const* each) { return isBefore(*each, *to); });
        if (from == gone.end())
            break;
        if (isBefore(*to, **from))
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
    PairEqual(differences, IsBeforeByContentAndName);
    PairEqual(differences, IsBeforeByContent);
}

Differences::Differences(cow_ptr<Tree> const& before, cow_ptr<Tree> const& after, DifferenceOptions const& options) {
    isComplete_ = FindDifferences(before.get(), after.get(), options.atMost, differences_);
    // Names are visited in order; what breaks the order of paths are files beside directories.
    if (!std::is_sorted(differences_.begin(), differences_.end(), IsBeforeByPath))
        SortByPath(differences_);
    if (options.findRenames)
        PairRenames(differences_);
}

Differences::Differences(cow_ptr<CommitTree> const& before, cow_ptr<CommitTree> const& after,
                         DifferenceOptions const& options)
    : Differences(RootOf(before), RootOf(after), options) {}

} // namespace KivVcs
