#include "allocation_faults/World.h"

namespace KivVcs::Faults {
namespace {

void PackTreesAndCommits(World& w) {
    w.edited.ResetState();
    w.draft.ResetState();
    w.done = !w.edited.GetId().GetText().IsEmpty() && w.draft.GetId() == Id(w.draft.GetPackedData());
    w.narrow = Helpers::StringAFromBuffer(w.edited.GetData());
}

void AssignACommit(World& w) {
    w.done = w.draft.GetData().GetSize() < w.commits["v"]->GetPackedData().GetSize();
    w.draft = *w.commits["v"];
}

void ReplaceRoot(World& w) {
    w.draft.ReplaceRoot(&w.repository, immu::make<Tree>(w.edited));
    w.draft.ResetState();
}

void EditTheTreeOfACommit(World& w) {
    cow_ptr<CommitTree> holder = w.draft.GetCommitTree();
    holder.write()->AddBlob(&w.repository, u"only/here", w.blob);
    w.paths = holder->GetBlobDiffs(w.draft.GetCommitTree());
    w.holder = w.draft.GetTree(u"d");
    w.done = holder->GetIdByPath(u"d/e") && holder->GetBlob(u"f1") == w.draft.GetBlob(u"f1");
}

void FillACommitTree(World& w) {
    CommitTree holder;
    holder.AddTree(&w.repository, u"d", w.edited);
    w.holder = dll_wrapped_shared(std::make_unique<CommitTree>(holder));
    w.paths = w.holder->GetAllBlobPaths();
    w.done = w.holder->GetBlobCount() == w.paths.size();
}

void WriteAndReadAuthorLines(World& w) {
    int position = 0;
    const auto line = Commit::GetAuthorInfo(u"author", u"J\u00f8rn", u"j@x", Time(), TimeDelta(-1));
    const KivStringT<char> utf8 = DataEncoding::Utf8Encode(line) + "\n";
    w.text = String::ToStringW(*Commit::ParseCommitInfo(utf8, "author ", position));
}

void LinkCommitsInOrder(World& w) {
    std::vector<cow_ptr<Commit>> line{w.commits["j"], w.commits["b"], w.commits["v"]};
    w.done = Commit::MakeCommitLinksInOrder(line, &w.repository);
    w.commit = line.front();
}

void ReadCommits(World& w) {
    w.commit.reset();
    for (const char* name : {"r", "a", "t", "v"}) {
        Id parent;
        auto read = Commit::Deserialize(w.commits[name]->GetId(), parent, &w.mirror, w.packedForms.Loader());
        w.done = read && parent == (w.commit ? w.commit->GetId() : Id());
        read.write()->SetParent(w.commit);
        w.commit = w.mirror.SyncWithStorage(read);
    }
}

// clang-format off
const Operation operations[] = {
    {"PackTreesAndCommits", PackTreesAndCommits},
    {"AssignACommit", AssignACommit},
    {"DescribeObjects", [](World& w) { w.done = w.edited.ToString().GetLength() > w.blob.ToString().GetLength(); }},
    {"AddBlobToCommit", [](World& w) { w.draft.AddBlob(&w.repository, u"d/e/fresh", MakeBlob("fresh")); }},
    {"AddTreeToCommit", [](World& w) { w.tree = w.draft.AddTree(&w.repository, u"trees/one", w.edited); }},
    {"AddObjectToCommit", [](World& w) { w.draft.AddObject(&w.repository, u"z", RootOf(w, "v")->GetId()); }},
    {"RemoveObjectFromCommit", [](World& w) { w.done = w.draft.RemoveObject(&w.repository, u"d/e/y"); }},
    {"ReplaceRoot", ReplaceRoot},
    {"SetDescription", [](World& w) { w.draft.SetDescription(u"another description"); }},
    {"EditTheTreeOfACommit", EditTheTreeOfACommit},
    {"FillACommitTree", FillACommitTree},
    {"WriteAndReadAuthorLines", WriteAndReadAuthorLines},
    {"LinkCommitsInOrder", LinkCommitsInOrder},
    {"ReadCommits", ReadCommits},
};
// clang-format on

} // namespace

std::span<Operation const> OnCommits() {
    return operations;
}

} // namespace KivVcs::Faults
