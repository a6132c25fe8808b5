#include "KivVcs/Merge.h"

#include <utility>

namespace KivVcs {

namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

/// The trees that a path leads through, from the top to the first that is missing, so that trying all levels takes one
/// walk.
std::vector<cow_ptr<Tree>> TreesAlong(cow_ptr<Tree> top, Path path) {
    std::vector<cow_ptr<Tree>> trees;
    auto component = path.begin();
    for (auto tree = std::move(top); tree;) {
        trees.push_back(tree);
        if (component == path.end())
            break;
        tree = trees.back()->GetLocalTree(*component++);
    }
    return trees;
}

class LaterSideWins {
public:
    LaterSideWins(std::vector<KivStringT<char16_t>> names, std::function<optional<Time>(cow_ptr<Blob>)> getTime)
        : names_(std::move(names)), getTime_(std::move(getTime)) {}

    ConflictChoice operator()(Path path, MergeTrees trees) const {
        const auto left = TreesAlong(std::move(trees.left), path);
        const auto right = TreesAlong(std::move(trees.right), path);
        for (std::size_t depth = path.size() + 1; depth-- > 0;) {
            // The left side first, in a statement of its own: arguments are evaluated in any order, which hosts would
            // notice.
            const auto leftTime = TimeAt(left, depth);
            const ConflictChoice choice = Compare(leftTime, TimeAt(right, depth));
            if (choice != ConflictChoice::Undecided)
                return choice;
        }
        return ConflictChoice::Undecided;
    }

private:
    static ConflictChoice Compare(optional<Time> left, optional<Time> right) noexcept {
        // No time comes before every time, and times are ordered by their unsigned ticks.
        if (left == right)
            return ConflictChoice::Undecided;
        return left > right ? ConflictChoice::Left : ConflictChoice::Right;
    }

    [[nodiscard]] optional<Time> TimeAt(std::vector<cow_ptr<Tree>> const& trees, std::size_t depth) const {
        if (depth >= trees.size())
            return {};
        for (auto const& name : names_) {
            if (auto blob = trees[depth]->GetDeepBlob(name)) {
                if (const auto time = getTime_(std::move(blob)))
                    return time;
            }
        }
        return {};
    }

    std::vector<KivStringT<char16_t>> names_;
    std::function<optional<Time>(cow_ptr<Blob>)> getTime_;
};

} // namespace

BlobConflictResolver TimeBasedConflictResolver(std::vector<KivStringT<char16_t>> names,
                                               std::function<optional<Time>(cow_ptr<Blob>)> getTime) {
    return LaterSideWins(std::move(names), std::move(getTime));
}

} // namespace KivVcs
