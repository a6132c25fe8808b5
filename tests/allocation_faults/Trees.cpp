#include "allocation_faults/World.h"

namespace KivVcs::Faults {
namespace {

void GrowAWideTree(World& w) {
    Tree wide;
    for (char16_t name[] = u"aa"; name[0] < u'l'; name[1] == u'z' ? (++name[0], name[1] = u'a') : ++name[1])
        wide.AddBlob(&w.repository, name, w.blob);
    w.done = !wide.GetId().IsEmpty();
    w.tree = immu::make<Tree>(wide);
}

template <class T>
void AddManyBlobs(World& w, T& edited) {
    const auto other = immu::make<Blob>(MakeBlob("other"));
    w.done = edited.AddBlobs(
        &w.repository,
        std::vector<BlobAtPath>{
            {u"d/e/new/a", other}, {u"many/100", other}, {u"d/x", other}, {u"n/a", other}, {u"n/b", other}});
}

void IdentifyManyObjects(World& w) {
    Commit grown(w.draft);
    grown.SetDescription(u"another");
    const Commit line(immu::make<Commit>(grown), false);
    Identify(std::vector<Object const*>{&line, &w.blob, &w.edited});
    w.done = line.GetKnownDigest() && w.edited.GetKnownDigest();
}

void EmptyATree(World& w) {
    Tree shrinking(w.edited);
    for (char16_t name[] = u"many/100"; name[6] < u'4'; name[7] == u'9' ? (++name[6], name[7] = u'0') : ++name[7])
        shrinking.RemoveObject(&w.repository, name);
    w.tree = immu::make<Tree>(shrinking);
}

void EditALongTree(World& w) {
    const KivStringT<char16_t> longName = Wide(std::string(30'000, 'n'));
    Tree tree;
    for (char16_t edit = 0; edit < 7; ++edit) {
        tree.AddBlob(&w.repository, longName + static_cast<char16_t>(u'a' + edit % 5), w.blob);
        w.done = edit < 4 || !tree.GetId().IsEmpty();
    }
    w.tree = immu::make<Tree>(tree);
}

void EditADeepPath(World& w) {
    KivStringT<char16_t> path;
    for (int level = 0; level < 160; ++level)
        path += u"n/";
    w.tree = immu::make<Tree>(w.sole);
    w.done = !!w.tree.write()->AddTree(&w.repository, path, w.edited);
    w.paths = w.tree->GetDeepBlobDiffs(RootOf(w, "r"));
    w.done = w.done && w.tree.write()->RemoveObject(&w.repository, path);
}

void ListATree(World& w) {
    w.paths = w.edited.GetDeepBlobPaths();
    w.done = w.edited.GetLocalObjectPaths().size() == w.edited.GetLocalObjectCount();
}

void CompareTrees(World& w) {
    w.paths = w.edited.GetDeepBlobDiffs(RootOf(w, "v"));
    w.done = w.edited.GetLocalBlobDiffs(RootOf(w, "v")).size() + w.edited.GetLocalTreeDiffs(RootOf(w, "r")).size() == 2;
}

void LookUpPaths(World& w) {
    w.done = w.edited.GetDeepObject(u"d/e/y") && w.edited.GetDeepTree(u"d/e") && w.edited.GetDeepBlob(u"d/x") &&
             w.edited.GetIdByPath(u"d/e") && w.edited.GetDeepBlobCount() > 40;
}

void AssignATree(World& w) {
    w.done = w.sole.GetData().GetSize() < RootOf(w, "v")->GetPackedData().GetSize();
    w.sole = *RootOf(w, "v");
}

void ReadATree(World& w) {
    w.repository.SyncWithStorage(immu::make<Tree>(w.edited));
    w.tree = Tree::Deserialize(w.edited.GetId(), &w.mirror, w.packedForms.Loader());
}

void MergeTrees(World& w) {
    w.tree = ThreeWayMerge(&w.repository, {RootOf(w, "v"), RootOf(w, "a"), RootOf(w, "c")}, AskTimesThenRight());
}

// clang-format off
const Operation operations[] = {
    {"AddBlobToTree", [](World& w) { w.done = !!w.edited.AddBlob(&w.repository, u"d/e/new/deep", w.blob); }},
    {"AddBlobToManyEntries", [](World& w) { w.edited.AddBlob(&w.repository, u"many/110a", w.blob); }},
    {"ReplaceBlobOfTree", [](World& w) { w.sole.AddBlob(&w.repository, u"d/x", MakeBlob("other")); }},
    {"AddManyBlobsToTree", [](World& w) { AddManyBlobs(w, w.edited); }},
    {"AddManyBlobsToCommit", [](World& w) { AddManyBlobs(w, w.draft); }},
    {"IdentifyManyObjects", IdentifyManyObjects},
    {"AddTreeToTree", [](World& w) { w.tree = w.edited.AddTree(&w.repository, u"d/copy", w.sole); }},
    {"AddObjectToTree", [](World& w) { w.sole.AddObject(&w.repository, u"q/r", RootOf(w, "t")->GetId()); }},
    {"RemoveObjectFromTree", [](World& w) { w.done = w.edited.RemoveObject(&w.repository, u"s/t/u"); }},
    {"RemoveOneOfManyEntries", [](World& w) { w.done = w.edited.RemoveObject(&w.repository, u"many/101"); }},
    {"GrowAWideTree", GrowAWideTree},
    {"EmptyATree", EmptyATree},
    {"EditALongTree", EditALongTree},
    {"EditADeepPath", EditADeepPath},
    {"ListATree", ListATree},
    {"CompareTrees", CompareTrees},
    {"LookUpPaths", LookUpPaths},
    {"AssignATree", AssignATree},
    {"ReadATree", ReadATree},
    {"MergeTrees", MergeTrees},
    {"FindRenames", [](World& w) { w.done = Differences(RootOf(w, "v"), RootOf(w, "i"), {.findRenames = true}).GetCount() > 5; }},
    {"FindConflicts", [](World& w) { w.done = FindConflicts({RootOf(w, "v"), RootOf(w, "a"), RootOf(w, "c")}).size() == 2; }},
    {"FindCaseCollisions", [](World& w) { w.done = FindCaseCollisions(immu::make<Tree>(w.edited)).empty(); }},
    {"FindPathProblem", [](World& w) { w.text = PortablePathProblem(u"d/what no disk may hold?")->component; }},
};
// clang-format on

} // namespace

std::span<Operation const> OnTrees() {
    return operations;
}

} // namespace KivVcs::Faults
