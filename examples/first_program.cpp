#include <KivVcs/KivVcs.h>

#include <cstdio>
#include <string_view>

using namespace KivVcs;

Blob MakeBlob(std::string_view text) {
    Buffer content;
    content.Append(text.data(), text.size());
    return Blob(content);
}

int main() {
    Repository repository(std::make_unique<MemObjectsStorage>());

    Commit first(&repository, false);
    first.AddBlob(&repository, u"docs/intro.txt", MakeBlob("One page.\n"));
    first.AddBlob(&repository, u"notes.txt", MakeBlob("Bread, milk\n"));
    first.SetAuthorName(u"Ada");
    first.SetAuthorEmail(u"ada@example.org");
    first.SetDescription(u"Start");
    const cow_ptr<Commit> before = repository.DoCommit(first);

    Commit second(&repository, false);
    second.AddBlob(&repository, u"docs/intro.txt", MakeBlob("Two pages.\n"));
    second.SetDescription(u"Write the second page");
    const cow_ptr<Commit> after = repository.DoCommit(second);

    for (auto const& path : before->GetCommitTree()->GetBlobDiffs(after->GetCommitTree()))
        std::printf("%s changed\n", DataEncoding::Utf8Encode(path).GetString());
    return after->GetParent() == before ? 0 : 1;
}
