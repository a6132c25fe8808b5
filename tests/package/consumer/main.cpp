#include <KivVcs/KivVcs.h>

#include <cstring>

/// Uses what crosses the library's boundary: a text, a virtual call and a pointer made on the library's side.
int main() {
    KivVcs::Repository repository(std::make_unique<KivVcs::MemObjectsStorage>());
    KivVcs::Buffer content;
    content.Append("hello", 5);
    KivVcs::Commit commit(&repository, false);
    const auto blob = commit.AddBlob(&repository, u"a/b.txt", KivVcs::Blob(content));
    const auto stored = repository.DoCommit(commit);
    // sha256 of "blob 5", a zero byte and "hello"
    const bool good = blob && stored && stored == repository.GetHead() &&
                      blob->GetId().GetText() == u"8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
    return good ? 0 : 1;
}
