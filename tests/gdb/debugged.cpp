#include "KivVcs/KivVcs.h"

using namespace KivVcs;

/// Where the test stops.
extern "C" void Look() {}

/// Values of every kind that gdb shows.
int main() {
    Repository repository(std::make_unique<MemObjectsStorage>());
    const KivStringT<char16_t> word = u"Gr\u00fc\u00dfe";
    const KivStringViewT<char> view("view of it", 4);
    const KivStringT<char> empty;
    const Id noId;
    Buffer content;
    content.Append("hello", 5);
    const Blob unidentified(content);
    Blob added = unidentified;
    Buffer chain = content;
    chain.Append(Buffer(100'000));

    Commit commit(&repository, false);
    commit.SetAuthorName(u"Ada");
    commit.SetAuthorEmail(u"ada@example.org");
    commit.SetDescription(u"Start");
    const cow_ptr<Blob> blob = commit.AddBlob(&repository, u"a/b.txt", added);
    const Id id = blob->GetId();
    const cow_ptr<Commit> first = repository.DoCommit(commit);
    Commit next(&repository, false);
    next.SetCommitTime(Time::FromTimeT(1'000'000'000, TimeZone::Utc));
    next.RemoveObject(&repository, u"a/b.txt");
    next.AddBlob(&repository, u"c.txt", Blob(content));
    const cow_ptr<Tree> tree = first->GetCommitTree()->GetRoot();
    const cow_ptr<Tree> nothing;
    Tree wide;
    for (char16_t tens = u'0'; tens <= u'9'; ++tens) {
        for (char16_t ones = u'0'; ones <= u'9'; ++ones) {
            const std::array<char16_t, 2> name{tens, ones};
            wide.AddBlob(&repository, {name.data(), 2}, *blob);
        }
    }
    wide.AddTree(&repository, u"00", *tree);
    const cow_ptr<Object> object = blob;
    Look();
    return word.IsEmpty() || view.IsEmpty() || !empty.IsEmpty() || !noId.IsEmpty() || id.IsEmpty() || nothing ||
           !object || !tree;
}
