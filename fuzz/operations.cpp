#include "Fuzzing.h"

#include <map>

/// Sequences of a repository's operations, over few names so that everything meets everything.
///
/// An input is a sequence of operations, each a byte that tells which and bytes that tell its arguments.

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
        for (int steps = 0; steps < 24 && !input_.IsUsedUp(); ++steps) {
            const unsigned operation = input_.Byte() % 16;
            const bool isOnHistories = operation >= 12;
            const auto before = isOnHistories ? Contents() : std::map<Text, Text>();
            Perform(operation);
            const auto after = isOnHistories ? Contents() : before;
            Require(std::includes(after.begin(), after.end(), before.begin(), before.end()),
                    "operations on histories leave each branch its content");
        }
        RequireConsistency(*repository_->GetStorage());
    }

private:
    [[nodiscard]] std::map<Text, Text> Contents() const {
        std::map<Text, Text> contents;
        for (auto const& [name, head] : repository_->GetStorage()->GetRefs()) {
            if (head)
                contents[name] = head->GetDescription() + (RootOf(head) ? RootOf(head)->GetId() : Id()).GetText();
        }
        return contents;
    }

    Path AnyBranch() { return branches[input_.Byte() % 4]; }
    cow_ptr<Commit> AnyCommit() {
        auto commit = repository_->GetHead(AnyBranch());
        for (unsigned steps = input_.Byte() % 4; steps > 0 && commit; --steps)
            commit = commit->GetParent();
        return commit;
    }

    void Perform(unsigned operation) {
        const Path branch = AnyBranch();
        switch (operation) {
        case 2:
            return Store();
        case 3:
            draft_ = Commit(AnyCommit(), branch.GetLength() > 1);
            return;
        case 4:
            repository_->Checkout(branch);
            return;
        case 5:
            repository_->RemoveBranch(branch);
            return;
        case 6:
            repository_->CreateBranch(branch, AnyCommit());
            return;
        case 7:
            repository_->MoveBranchTo(branch, AnyCommit());
            return;
        case 8:
        case 9:
        case 10:
            return Merge();
        case 11:
            return Rebase(branch, AnyBranch());
        case 12:
            repository_->SimplifyCommitGraph(branch.GetLength() > 1);
            return;
        case 13:
            repository_->DeleteCommits(AnyCommit());
            return;
        case 14:
            return ShareRoot(branch, AnyBranch());
        case 15:
            repository_->UpdateStorage();
            // The old one stays, so that both share everything.
            former_ = std::exchange(repository_, std::make_unique<Repository>(repository_->GetStorage()->Clone()));
            return;
        default:
            return Edit();
        }
    }

    void Edit() {
        const Path path = paths[input_.Byte() % 8];
        const unsigned what = input_.Byte();
        const auto tree = draft_.GetTree(paths[what / 4 % 8]);
        if (what % 4 == 0) {
            draft_.RemoveObject(repository_.get(), path);
        } else if (what % 4 == 1 && tree) {
            Require(draft_.AddTree(repository_.get(), path, *tree->GetRoot()) != nullptr, "a tree is added");
        } else {
            Require(draft_.AddBlob(repository_.get(), path, MakeBlob("01234"[what % 5])) != nullptr, "a blob is added");
        }
    }

    void Store() {
        const unsigned what = input_.Byte();
        draft_.SetDescription(paths[what % 8].ToString());
        draft_.SetAuthorName(branches[what / 8 % 4].ToString());
        const auto stored =
            what < 128 ? repository_->DoCommit(draft_) : repository_->SyncWithStorage(immu::make<Commit>(draft_));
        Require(!stored || stored->GetId() == draft_.GetId(), "a commit is stored as it was made");
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
        const auto head = repository_->GetHead();
        Require(base == left ? head == right
                : merged     ? *RootOf(head) == *merged
                             : head == left,
                "a branch moves to what was merged, and only then");
    }

    void Rebase(Path branch, Path onto) {
        const auto head = repository_->GetHead(branch);
        const auto target = repository_->GetHead(onto);
        const auto moved = repository_->MergelessRebase(branch, onto);
        Require(!moved == (!head || !target), "a rebase needs both sides");
        Require(!moved || RootOf(moved) == RootOf(head), "a moved commit keeps its tree");
        Require(!moved || repository_->GetCommonBase(moved, target), "a moved line stands on the other one");
        repository_->MoveBranchTo(branch, moved);
    }

    void ShareRoot(Path first, Path second) {
        if (repository_->EnsureCommonRootFor(first, second, AnyBranch()))
            Require(repository_->GetCommonBase(repository_->GetHead(first), repository_->GetHead(second)) != nullptr,
                    "two branches share a root");
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
