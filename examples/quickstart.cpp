#include <KivVcs/KivVcs.h>

#include <cstdio>

using namespace KivVcs;

int main() {
    Repository repository(std::make_unique<MemObjectsStorage>());

    Commit first(&repository, false);
    first.AddBlob(&repository, u"docs/intro.txt", Blob::CopyText("One page.\n"));
    first.AddBlob(&repository, u"notes.txt", Blob::CopyText("Bread, milk\n"));
    first.SetAuthorName(u"Ada");
    first.SetDescription(u"Start");
    const cow_ptr<Commit> before = repository.DoCommit(first);

    Commit second(&repository, false);
    second.AddBlob(&repository, u"docs/intro.txt", Blob::CopyText("Two pages.\n"));
    second.SetDescription(FromUtf8("Write the second page"));
    const cow_ptr<Commit> after = repository.DoCommit(second);

    for (auto const& difference : Differences(before->GetCommitTree(), after->GetCommitTree()))
        std::printf("%s changed\n", ToUtf8(difference.path).c_str());
    for (auto const& commit : History(repository.GetHead()).Changing(u"docs"))
        std::printf("%s: %s", ToUtf8(commit->GetDescription()).c_str(),
                    commit->GetBlob(u"docs/intro.txt")->CopyToString().c_str());
    return after->GetParent() == before ? 0 : 1;
}
