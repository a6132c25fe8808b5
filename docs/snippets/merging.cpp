// What docs/merging.md shows.

#include <KivVcs/KivVcs.h>

using namespace KivVcs;

namespace {

void Write(Repository& repository, KivStringViewT<char16_t> path, char content) {
    Buffer data;
    data.Append(&content, 1);
    Commit commit(&repository, false);
    commit.AddBlob(&repository, path, Blob(data));
    repository.DoCommit(commit);
}

char Read(Repository& repository, KivStringViewT<char16_t> path) {
    char content = 0;
    return repository.GetHead()->GetBlob(path)->GetData().Read(0, &content, 1) ? content : '\0';
}

} // namespace

int main() {
    Repository repository(std::make_unique<MemObjectsStorage>());
    Write(repository, u"docs/notes.txt", '1');
    repository.CreateBranch(u"topic", nullptr);
    Write(repository, u"docs/notes.txt", '2');
    Write(repository, u"intro.txt", '2');
    repository.Checkout(u"topic");
    Write(repository, u"docs/notes.txt", '3');
    Write(repository, u"intro.txt", '3');
    repository.Checkout(u"master");

    const Resolvers resolvers{[](auto path, MergeTrees const&) {
                                  return path.back() == u"notes.txt" ? ConflictChoice::Right : ConflictChoice::Left;
                              },
                              [](auto, MergeTrees const&) { return TreeConflictChoice::Merge; }};
    const bool merged = repository.Merge(repository.GetHead(u"topic"), resolvers);

    return merged && Read(repository, u"docs/notes.txt") == '3' && Read(repository, u"intro.txt") == '2' ? 0 : 1;
}
