#include <KivVcs/KivVcs.h>

#include <iostream>

using namespace KivVcs;

namespace {

void Save(Repository& repository, KivStringViewT<char16_t> path, std::string_view text,
          KivStringT<char16_t> const& why) {
    Commit commit(&repository, false);
    commit.AddBlob(&repository, path, Blob::CopyText(text));
    commit.SetAuthorName(u"Ada");
    commit.SetAuthorEmail(u"ada@example.org");
    commit.SetDescription(why);
    repository.DoCommit(commit);
}

} // namespace

int main() {
    Repository repository(std::make_unique<MemObjectsStorage>());
    Save(repository, u"poem.txt", "Roses are red\n", u"Begin a poem");
    Save(repository, u"list.txt", "Bread, milk\n", u"Write a list");
    Save(repository, u"poem.txt", "Roses are white\n", u"Choose a colour");

    const cow_ptr<Blob> poem = repository.GetHead()->GetBlob(u"poem.txt");
    std::cout << poem->CopyToString();

    for (auto const& commit : History(repository.GetHead()))
        std::cout << commit->GetDescription() << '\n';

    for (auto const& commit : History(repository.GetHead()).Changing(u"poem.txt"))
        std::cout << "the poem: " << commit->GetDescription() << '\n';

    const cow_ptr<Commit> now = repository.GetHead();
    const cow_ptr<Commit> start = now->GetParent()->GetParent();
    for (auto const& difference : Differences(start->GetCommitTree(), now->GetCommitTree()))
        std::cout << (difference.kind == ChangeKind::Added ? "new: " : "changed: ") << difference.path << '\n';

    repository.CreateBranch(u"holidays", nullptr);
    repository.Checkout(u"holidays");
    Save(repository, u"list.txt", "Bread, milk, tent\n", u"Go camping");
    Save(repository, u"songs/evening.txt", "La la la\n", u"Take a song along");

    repository.Checkout(u"master");
    Save(repository, u"list.txt", "Bread\n", u"Save money");

    const cow_ptr<Commit> holidays = repository.GetHead(u"holidays");
    const MergeOutcome attempt = MergeWithOutcome(repository, holidays, Resolvers());
    std::cout << (attempt.Succeeded() ? "merged" : "not merged") << '\n';
    for (auto const& conflict : attempt.conflicts)
        std::cout << "both changed " << conflict.path << '\n';

    Resolvers preferTheirs;
    preferTheirs.blobResolver = AlwaysChooseRight();
    const MergeOutcome outcome = MergeWithOutcome(repository, holidays, preferTheirs);
    std::cout << (outcome.result == MergeResult::Merged ? "merged" : "not merged") << '\n';
    for (auto const& path : repository.GetHead()->GetCommitTree()->GetAllBlobPaths())
        std::cout << path << ": " << repository.GetHead()->GetBlob(path)->CopyToString();

    Commit described(&repository, true);
    described.SetDescription(u"Bring the holidays in");
    std::cout << repository.DoCommit(described)->GetDescription() << '\n';

    repository.MoveBranchTo(u"master", repository.GetHead()->GetParent());
    std::cout << "back at: " << repository.GetHead()->GetDescription() << '\n';
}
