#include "Fuzzing.h"

/// Sequences of a repository's operations, over few names so that everything meets everything.
///
/// An input is a sequence of operations, each a byte for its kind and bytes for its arguments.

namespace KivVcs::Fuzzing {
namespace {

constexpr Path paths[] = {u"a", u"b", u"a/b", u"a/b/c", u"b/a", u"c/a", u"c/b/a", u"\u00e9/\xd800"};
constexpr Path branches[] = {u"master", u"x", u"y", u"z"};

cow_ptr<Tree> RootOf(cow_ptr<Commit> const& commit) {
    return commit && commit->GetCommitTree() ? commit->GetCommitTree()->GetRoot() : nullptr;
}

/// Answers by the path alone, so that a mirrored merge can be given mirrored ones.
Resolvers Answer(unsigned seed, bool mirrored) {
    const auto choose = [=](auto const& path, unsigned count, unsigned left) {
        unsigned sum = seed;
        for (auto const& component : path)
            sum = sum * 31 + component[0];
        const unsigned choice = sum % 16 < count ? sum % 16 : 0;
        return static_cast<int>(mirrored && (choice == left || choice == left + 1) ? 2 * left + 1 - choice : choice);
    };
    return {[=](auto const& path, MergeTrees const&) { return static_cast<ConflictChoice>(choose(path, 4, 0)); },
            [=](auto const& path, MergeTrees const&) { return static_cast<TreeConflictChoice>(choose(path, 5, 1)); }};
}

class Host {
public:
    explicit Host(Input input) : input_(input) {}

    void Run() {
        for (int steps = 0; steps < 24 && !input_.IsUsedUp(); ++steps)
            Perform();
        RequireConsistency(*repository_->GetStorage());
    }

private:
    Path AnyBranch() { return branches[input_.Byte() % 4]; }
    cow_ptr<Commit> AnyCommit() {
        auto commit = repository_->GetHead(AnyBranch());
        for (unsigned steps = input_.Byte() % 4; steps > 0 && commit; --steps)
            commit = commit->GetParent();
        return commit;
    }

    void Perform() {
        using Operation = void (*)(Host&, Repository&, Path);
        static constexpr Operation operations[] = {
            [](Host& host, Repository&, Path) { host.Edit(); },
            [](Host& host, Repository&, Path) { host.Edit(); },
            [](Host& host, Repository&, Path) { host.Store(); },
            [](Host& host, Repository&, Path name) { host.draft_ = Commit(host.AnyCommit(), name.GetLength() > 1); },
            [](Host&, Repository& repository, Path name) { repository.Checkout(name); },
            [](Host&, Repository& repository, Path name) { repository.RemoveBranch(name); },
            [](Host& host, Repository& repository, Path name) { repository.CreateBranch(name, host.AnyCommit()); },
            [](Host& host, Repository& repository, Path name) { repository.MoveBranchTo(name, host.AnyCommit()); },
            [](Host& host, Repository&, Path) { host.Merge(); },
            [](Host& host, Repository&, Path) { host.Merge(); },
            [](Host& host, Repository&, Path) { host.Merge(); },
            [](Host& host, Repository& repository, Path name) {
                repository.MoveBranchTo(name, repository.MergelessRebase(name, host.AnyBranch()));
            },
            [](Host&, Repository& repository, Path name) { repository.SimplifyCommitGraph(name.GetLength() > 1); },
            [](Host& host, Repository& repository, Path) { repository.DeleteCommits(host.AnyCommit()); },
            [](Host& host, Repository& repository, Path name) {
                repository.EnsureCommonRootFor(name, host.AnyBranch(), u"root");
            },
            [](Host& host, Repository&, Path) { host.PurgeAndClone(); },
        };
        operations[input_.Byte() % std::size(operations)](*this, *repository_, AnyBranch());
    }

    void PurgeAndClone() {
        repository_->UpdateStorage();
        // The old one stays, so that both share everything.
        former_ = std::exchange(repository_, std::make_unique<Repository>(repository_->GetStorage()->Clone()));
    }

    void Edit() {
        const Path path = paths[input_.Byte() % 8];
        const unsigned what = input_.Byte();
        const auto tree = draft_.GetTree(paths[what / 4 % 8]);
        if (what % 4 == 0)
            draft_.RemoveObject(repository_.get(), path);
        else if (what % 4 == 1 && tree)
            draft_.AddTree(repository_.get(), path, *tree->GetRoot());
        else
            draft_.AddBlob(repository_.get(), path, MakeBlob("01234"[what % 5]));
    }

    void Store() {
        const unsigned what = input_.Byte();
        draft_.SetDescription(paths[what % 8].ToString());
        draft_.SetAuthorName(branches[what / 8 % 4].ToString());
        const auto stored =
            what < 128 ? repository_->DoCommit(draft_) : repository_->SyncWithStorage(immu::make<Commit>(draft_));
        repository_->MoveBranchTo(repository_->GetCurentBranch(), stored);
        draft_ = Commit(repository_.get(), false);
    }

    void Merge() {
        const auto left = repository_->GetHead();
        const auto right = AnyCommit();
        const unsigned seed = input_.Byte();
        if (!left || !right)
            return;
        const auto base = repository_->GetCommonBase(left, right);
        const MergeTrees trees{RootOf(left), RootOf(base), RootOf(right)};
        const auto merged = ThreeWayMerge(repository_.get(), trees, Answer(seed, false));
        const auto mirrored =
            ThreeWayMerge(repository_.get(), {trees.right, trees.root, trees.left}, Answer(seed, true));
        Require(!merged == !mirrored && (!merged || *merged == *mirrored), "a mirrored merge gives the same");
        Require(repository_->Merge(right, Answer(seed, false)) == (base == left || merged),
                "a merge gives up or is done");
        Require(base == left || !merged || *RootOf(repository_->GetHead()) == *merged, "a branch gets what was merged");
    }

    Input input_;
    std::unique_ptr<Repository> repository_ = MakeRepository();
    std::unique_ptr<Repository> former_;
    Commit draft_{repository_.get(), false};
};

} // namespace
} // namespace KivVcs::Fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    KivVcs::Fuzzing::Host({data, size}).Run();
    return 0;
}
