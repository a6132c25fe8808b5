#include "KivVcs/Repository.h"

#include "commit/Ancestors.h"

#include <algorithm>

namespace KivVcs {

namespace {

/// The commits above @p base up to @p commit, oldest first; @p commit itself in any case.
std::vector<cow_ptr<Commit>> LineAbove(cow_ptr<Commit> const& base, cow_ptr<Commit> const& commit) {
    if (commit == base)
        return {commit};
    std::vector<cow_ptr<Commit>> line;
    for (Commit const& moved : Ancestors(commit.get(), base.get()))
        line.push_back(cow_ptr<Commit>::share(&moved));
    std::reverse(line.begin(), line.end());
    return line;
}

} // namespace

cow_ptr<Commit> Repository::MergelessRebase(cow_ptr<Commit> commit, cow_ptr<Commit> base, cow_ptr<Commit> onto) {
    if (!commit || !onto)
        return nullptr;
    auto line = LineAbove(base, commit);
    cow_ptr<Commit> parent = std::move(onto);
    for (auto& moved : line) {
        if (moved->GetParent() == parent)
            return commit;
        const cow_ptr<Commit> old = moved;
        moved.write()->SetParent(std::move(parent));
        parent = SyncWithStorage(std::move(moved));
        AnnounceRewrite(old, parent);
    }
    return parent;
}

cow_ptr<Commit> Repository::MergelessRebase(KivStringViewT<char16_t> branch, KivStringViewT<char16_t> ontoBranch) {
    auto head = GetHead(branch);
    auto ontoHead = GetHead(ontoBranch);
    auto base = GetCommonBase(head, ontoHead);
    return MergelessRebase(std::move(head), std::move(base), std::move(ontoHead));
}

namespace {

bool AttachToRoot(Repository& repository, KivStringViewT<char16_t> branch, cow_ptr<Commit> const& root) {
    auto head = repository.GetHead(branch);
    if (!head)
        return repository.CreateBranch(branch, root) || repository.MoveBranchTo(branch, root);
    if (repository.GetCommonBase(head, root))
        return true;
    return repository.MoveBranchTo(branch, repository.MergelessRebase(std::move(head), nullptr, root));
}

} // namespace

bool Repository::EnsureCommonRootFor(KivStringViewT<char16_t> first, KivStringViewT<char16_t> second,
                                     KivStringViewT<char16_t> rootBranch) {
    const auto firstHead = GetHead(first);
    const auto secondHead = GetHead(second);
    if (firstHead && secondHead && GetCommonBase(firstHead, secondHead))
        return true;
    auto root = GetHead(rootBranch);
    if (!root) {
        root.write()->SetDescription(u"Root commit");
        if (!CreateBranch(rootBranch, SyncWithStorage(std::move(root))))
            return false;
        root = GetHead(rootBranch);
    }
    return AttachToRoot(*this, first, root) && AttachToRoot(*this, second, root);
}

} // namespace KivVcs
