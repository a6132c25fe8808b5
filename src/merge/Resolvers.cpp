#include "KivVcs/Merge.h"

#include <utility>

namespace KivVcs {

namespace {

template <class Choice>
using Resolver = std::function<Choice(array_view<KivStringViewT<char16_t> const>, MergeTrees)>;

template <class Choice>
Resolver<Choice> Chain(Resolver<Choice> first, Resolver<Choice> second) {
    return [first = std::move(first), second = std::move(second)](array_view<KivStringViewT<char16_t> const> path,
                                                                  MergeTrees trees) {
        const Choice choice = first(path, trees);
        return choice == Choice::Undecided ? second(path, std::move(trees)) : choice;
    };
}

} // namespace

BlobConflictResolver AlwaysChooseRoot() {
    return always_return_t<ConflictChoice>{ConflictChoice::Root};
}

BlobConflictResolver AlwaysChooseLeft() {
    return always_return_t<ConflictChoice>{ConflictChoice::Left};
}

BlobConflictResolver AlwaysChooseRight() {
    return always_return_t<ConflictChoice>{ConflictChoice::Right};
}

BlobConflictResolver ChainResolvers(BlobConflictResolver first, BlobConflictResolver second) {
    return Chain(std::move(first), std::move(second));
}

TreeConflictResolver ChainResolvers(TreeConflictResolver first, TreeConflictResolver second) {
    return Chain(std::move(first), std::move(second));
}

} // namespace KivVcs
