#include "Conflicts.h"

#include "Workspace.h"

#include <algorithm>

namespace vault {

using KivVcs::ConflictChoice;
using KivVcs::cow_ptr;
using KivVcs::MergeTrees;
using KivVcs::optional;
using KivVcs::Time;
using KivVcs::Tree;

namespace {

using PathView = KivVcs::array_view<TextView const>;

optional<Time> ReadStamp(cow_ptr<KivVcs::Blob> const& blob) {
    const Text digits = KivVcs::Helpers::StringAFromBuffer(blob->GetData());
    if (digits.IsEmpty() || digits[0] < u'0' || digits[0] > u'9')
        return std::nullopt;
    return Time::FromTimeT(KivVcs::String::Int64FromString(digits), KivVcs::TimeZone::Utc);
}

KivVcs::BlobConflictResolver ChooseNewest(CommitHandle const& left, CommitHandle const& right) {
    const bool rightIsLater = right->GetCommitTime() > left->GetCommitTime();
    return ChainResolvers(KivVcs::TimeBasedConflictResolver({stampName}, ReadStamp),
                          rightIsLater ? KivVcs::AlwaysChooseRight() : KivVcs::AlwaysChooseLeft());
}

KivVcs::BlobConflictResolver ResolverFor(ConflictPolicy policy, KivVcs::BlobConflictResolver const& newest) {
    switch (policy) {
    case ConflictPolicy::Right:
        return KivVcs::AlwaysChooseRight();
    case ConflictPolicy::Base:
        return KivVcs::AlwaysChooseRoot();
    case ConflictPolicy::Newest:
        return newest;
    case ConflictPolicy::Left:
    case ConflictPolicy::Stop:
        break;
    }
    return KivVcs::AlwaysChooseLeft();
}

optional<KivVcs::Id> IdAt(cow_ptr<Tree> const& tree, TextView path) {
    return tree ? tree->GetIdByPath(path) : std::nullopt;
}

Text Join(PathView path) {
    Text joined;
    for (auto const& component : path) {
        if (!joined.IsEmpty())
            joined += u'/';
        joined += component;
    }
    return joined;
}

} // namespace

Conflicts::Conflicts(ConflictPolicy policy, CommitHandle const& left, CommitHandle const& base,
                     CommitHandle const& right)
    : policy_(policy), trees_{RootOf(left), base ? RootOf(base) : nullptr, RootOf(right)},
      newest_(ChooseNewest(left, right)), resolver_(ResolverFor(policy, newest_)) {}

KivVcs::Resolvers Conflicts::MakeResolvers() {
    return {[this](PathView path, MergeTrees const& trees) { return Decide(path, trees); },
            KivVcs::always_return_t<KivVcs::TreeConflictChoice>{KivVcs::TreeConflictChoice::Merge}};
}

ConflictChoice Conflicts::Decide(PathView path, MergeTrees const& trees) {
    // Two stamps always differ where two directories do; that is no conflict.
    if (!path.empty() && path.back() == stampName)
        return newest_(path, trees);
    paths_.push_back(Join(path));
    return resolver_(path, trees);
}

void Conflicts::SettleKinds(KivVcs::Commit& merged, KivVcs::IRepository& repository) {
    if (!trees_.left || !trees_.right)
        return;
    for (auto const& path : trees_.left->GetDeepBlobDiffs(trees_.right)) {
        if (!IsKindConflict(path))
            continue;
        paths_.push_back(path);
        const auto choice = resolver_(KivVcs::Helpers::SplitVcsPath(path), trees_);
        auto const& side = choice == ConflictChoice::Left    ? trees_.left
                           : choice == ConflictChoice::Right ? trees_.right
                                                             : trees_.root;
        merged.RemoveObject(&repository, path);
        if (const auto id = IdAt(side, path))
            merged.AddObject(&repository, path, *id);
    }
}

bool Conflicts::IsKindConflict(TextView path) const {
    const bool isFileAndDirectory = (trees_.left->GetDeepBlob(path) && trees_.right->GetDeepTree(path)) ||
                                    (trees_.left->GetDeepTree(path) && trees_.right->GetDeepBlob(path));
    const auto before = IdAt(trees_.root, path);
    return isFileAndDirectory && IdAt(trees_.left, path) != before && IdAt(trees_.right, path) != before;
}

std::vector<std::string> Conflicts::Describe(CommitHandle const& merged) const {
    auto paths = paths_;
    std::sort(paths.begin(), paths.end());
    paths.erase(std::unique(paths.begin(), paths.end()), paths.end());
    std::vector<std::string> lines;
    for (auto const& path : paths) {
        auto& line = lines.emplace_back("conflict " + Printable(path));
        if (!merged)
            continue;
        const auto result = IdAt(RootOf(merged), path);
        line += result == IdAt(trees_.left, path)    ? ": left"
                : result == IdAt(trees_.right, path) ? ": right"
                : result == IdAt(trees_.root, path)  ? ": base"
                                                     : ": combined";
        line += result ? "" : ", which removed it";
    }
    return lines;
}

} // namespace vault
