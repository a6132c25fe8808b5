#include "support/Builders.h"
#include "support/PackedForms.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

namespace KivVcs {
namespace {

constexpr std::int64_t ticksPerMinute = 600'000'000;

class Commits : public testing::Test {
protected:
    /// What is read of a packed form with that text.
    cow_ptr<Commit> Read(std::string const& text, Id& parent) {
        return Commit::Deserialize(Id(Wide(packed.Add("commit", text))), parent, &repo, packed.Loader());
    }

    RecordingRepository repo{std::make_unique<MemObjectsStorage>()};
    Packed packed;
};

/// A commit with everything set that is no tree.
Commit Signed(cow_ptr<Commit> parent, const char16_t* name, const char16_t* email, std::int64_t seconds, int minutes,
              const char16_t* description) {
    Commit commit(std::move(parent), false);
    commit.SetAuthorName(name);
    commit.SetAuthorEmail(email);
    commit.SetCommitTime(Time::FromTimeT(seconds, TimeZone::Utc));
    commit.SetCommitTimezoneBias(TimeDelta(minutes * ticksPerMinute));
    commit.SetDescription(description);
    return commit;
}

// The identifiers are what golden_repository.py prints.
TEST_F(Commits, HaveTheIdentifiersThatAnIndependentScriptComputes) {
    Commit first = Signed(nullptr, u"Zo\u00EB", u"zoe@example.org", 1700000000, 120, u"First");
    first.AddBlob(&repo, u"README", MakeBlob("one\n"));
    EXPECT_EQ(Narrow(first.GetCommitTree()->GetRootId().GetText()),
              "712a8e08e0b4a9126b99cb77635eb6a0782b5872f900e6f22557c5a793da5bb1");
    EXPECT_EQ(IdText(first), "24488f154d474f3fda8eb38c5d1c092bf68d1744f98089effed77388d44078d7");

    Commit second = Signed(immu::make<Commit>(first), u"Bo", u"", -1, -330, u"Second\nwith two lines");
    std::string bytes;
    for (int byte = 0; byte < 256; ++byte)
        bytes.push_back(static_cast<char>(byte));
    second.AddBlob(&repo, u"src.txt", MakeBlob("one\n"));
    second.AddBlob(&repo, u"src/\xD83D\xDE00", MakeBlob(bytes));
    second.AddObject(&repo, u"src/\xFFFD", first.GetBlob(u"README")->GetId());
    second.AddBlob(&repo, u"README", Blob());
    second.AddBlob(&repo, u"src/main.cpp", MakeBlob("int main() {}\n"));
    EXPECT_EQ(Narrow(second.GetCommitTree()->GetRootId().GetText()),
              "82423a4b57728b405c146a50e1cca65fd47eb3931abb6178db7ce07b84315674");
    EXPECT_EQ(IdText(second), "375da041bd867a6db66364e208b1498019a7792abb872f0757a97f929e4758ed");

    Commit empty(nullptr, false);
    empty.ReplaceRoot(&repo, immu::make<Tree>());
    EXPECT_EQ(IdText(empty), "bbdc78b91a9e560567b7dcabf000956be23c5d85519859b7473a2f0911ac7b1a");
    EXPECT_EQ(Bytes(Commit().GetData()), "tree \nauthor  <> 0 +0000\ncommitter  <> 0 +0000\n\n\n");
}

TEST_F(Commits, HaveAnotherIdentifierAfterEveryChange) {
    Commit commit(nullptr, false);
    const std::function<void()> changes[] = {[&] { commit.SetAuthorName(u"x"); },
                                             [&] { commit.SetAuthorEmail(u"x"); },
                                             [&] { commit.SetDescription(u"x"); },
                                             [&] { commit.SetCommitTime(Time(10'000'000)); },
                                             [&] { commit.SetCommitTimezoneBias(TimeDelta(ticksPerMinute)); },
                                             [&] { commit.SetParent(immu::make<Commit>()); },
                                             [&] { commit.AddBlob(&repo, u"x", Blob()); },
                                             [&] { commit.RemoveObject(&repo, u"x"); }};
    for (auto const& change : changes) {
        const std::string before = IdText(commit);
        change();
        EXPECT_NE(IdText(commit), before) << &change - changes;
    }
}

/// The examples of docs/formats.md. Their identifiers come from sha256sum.
TEST_F(Commits, ThePackedFormsThatAreDocumentedAreExact) {
    using namespace std::string_literals;
    const std::string hello = "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
    const std::string empty = "473a0f4c3be8a93681a267e3b1e9a7dcda1185436fe141f7749120a303721813";
    const std::string directory = "b117f1534d71e974e052d4dfed4b624681f38c7f9308e72d80f5696f97ee1f72";
    const std::string files = "4792f1fea516f48f7819b493f97f80ba6411780d1ed90cc3f7073affebc91587";
    const std::string first = "78a3d5382550bb4805422f70e95b494fbdcd83289ed57853738f46471c82bb33";
    Commit one = Signed(nullptr, u"Ada", u"ada@example.org", 1'700'000'000, 60, u"Start");
    one.AddBlob(&repo, u"d/\u00e9.txt", Blob());
    one.AddBlob(&repo, u"a.txt", MakeBlob("hello"));
    Commit two = Signed(immu::make<Commit>(one), u"Ada", u"ada@example.org", 1'700'003'600, -330, u"Keep d");
    two.ReplaceRoot(&repo, one.GetCommitTree()->GetTree(u"d"));
    const auto root = one.GetCommitTree()->GetRoot();
    const Tree none;
    const std::string ada = "Ada <ada@example.org> ";
    const std::tuple<Object const&, std::string, std::string> examples[] = {
        {*one.GetBlob(u"d/\u00e9.txt"), empty, "blob 0\0"s},
        {*one.GetBlob(u"a.txt"), hello, "blob 5\0hello"s},
        {none, "6ef19b41225c5369f1c104d45d8d85efa9b057b53b14b4b9b939dd74decc5321", "tree 0\0"s},
        {*root->GetLocalTree(u"d"), directory, "tree 83\0"s + "100644 blob \303\251.txt\0"s + empty},
        {*root, files, "tree 159\0"s + "100644 blob a.txt\0"s + hello + "40000 tree d\0"s + directory},
        {one, first,
         "commit 172\0tree "s + files + "\nauthor " + ada + "1700000000 +0100\ncommitter " + ada +
             "1700000000 +0100\n\nStart\n"},
        {two, "f2212c3c905dfd34b2ce7ccdc9d6975843cc2b072b28b13a8479e34c4e8f6172",
         "commit 245\0tree "s + directory + "\nparent " + first + "\nauthor " + ada + "1700003600 -0530\ncommitter " +
             ada + "1700003600 -0530\n\nKeep d\n"}};
    for (auto const& [object, id, packedForm] : examples) {
        EXPECT_EQ(Bytes(object.GetPackedData()), packedForm);
        EXPECT_EQ(IdText(object), id);
    }
}

TEST_F(Commits, SignaturesStoreSecondsIn32BitsAndTheOffsetInHoursAndMinutes) {
    const struct {
        std::int64_t seconds, minutes;
        const char* line;
    } cases[] = {{0, 0, "r n <e> 0 +0000"},
                 {1, 345, "r n <e> 1 +0545"},
                 {-1, -330, "r n <e> -1 -0530"},
                 {2147483648, -30, "r n <e> -2147483648 +0030"},
                 {4294967297, -60, "r n <e> 1 -0100"},
                 {5, 6001, "r n <e> 5 +10001"}};
    for (auto const& [seconds, minutes, line] : cases)
        EXPECT_EQ(Narrow(Commit::GetAuthorInfo(u"r", u"n", u"e", Time::FromTimeT(seconds, TimeZone::Utc),
                                               TimeDelta(minutes * ticksPerMinute))),
                  line);
    EXPECT_EQ(Narrow(Commit::GetAuthorInfo({u"r\0x", 3}, {u"%s\0x", 4}, {u"\0x", 2}, Time(), TimeDelta(599'999'999))),
              "r %s <> 0 +0000");
}

TEST_F(Commits, KeysAreFoundWhereverTheyComeNext) {
    const KivStringT<char> text("a 1\nb 2\na 3");
    int position = 0;
    EXPECT_EQ(Commit::ParseCommitInfo(text, "a ", position), KivStringT<char>("1"));
    EXPECT_EQ(position, 3);
    EXPECT_FALSE(Commit::ParseCommitInfo(text, "c ", position));
    EXPECT_EQ(position, 3);
    EXPECT_EQ(Commit::ParseCommitInfo(text, "a ", position), KivStringT<char>());
    EXPECT_EQ(position, 11);
}

TEST_F(Commits, AreReadBackAsFarAsTheirTextGoes) {
    const std::string root = packed.Add("tree", Entry("blob", "f", packed.Add("blob", "1")));
    const struct {
        std::string lines;
        const char *name, *email;
        std::int64_t seconds, minutes;
        const char *description, *parent;
    } cases[] = {
        {"parent 12\nauthor A B <a@b> 77 -0530\ncommitter C <c> 1 +0000\n\nd\ne\n", "A B", "a@b", 77, -330, "d", "12"},
        {"author A <a> 5 +0030\n\nsee parent x\n", "", "", 0, 0, "", "x"},
        {"author A <a> 5 +0030\n\n\n", "A", "a", 5, 30, "", ""},
        {"\nd\n", "", "", 0, 0, "d", ""},
        {"author A\n\nd\n", "", "", 0, 0, "d", ""},
        {"author A <a> 5 +0030\n\nunterminated", "A", "a", 5, 30, "", ""},
        {"author <a> 99999999999999999999 +0000", "", "", 0, 0, "", ""}};
    for (auto const& [lines, name, email, seconds, minutes, description, parent] : cases) {
        Id parentId(u"former");
        const auto commit = Read("tree " + root + "\n" + lines, parentId);
        ASSERT_TRUE(commit) << lines;
        EXPECT_EQ(Narrow(parentId.GetText()), parent) << lines;
        EXPECT_EQ(Narrow(commit->GetAuthorName()), name) << lines;
        EXPECT_EQ(Narrow(commit->GetAuthorEmail()), email) << lines;
        EXPECT_EQ(Narrow(commit->GetDescription()), description) << lines;
        EXPECT_EQ(commit->GetCommitTime().ToTimeT(TimeZone::Utc), seconds) << lines;
        EXPECT_EQ(commit->GetCommitTimezoneBias().GetTicks(), minutes * ticksPerMinute) << lines;
        EXPECT_EQ(Files(commit->GetCommitTree()->GetRoot()), "f=1");
        EXPECT_EQ(repo.GetTreeCount(), 1U);
    }
    Id parentId(u"former");
    EXPECT_FALSE(Read("", parentId) || Read("author A <a> 5 +0030\n\n\n", parentId));
    EXPECT_FALSE(Commit::Deserialize(Id(u"x"), parentId, &repo, nullptr));
    EXPECT_FALSE(Commit::Deserialize(Id(), parentId, &repo, packed.Loader()));
    EXPECT_EQ(Narrow(parentId.GetText()), "former");
}

TEST_F(Commits, ThatAreReadHaveTheHeadAsParentAndItsTreeWhereNoneIsNamed) {
    Id parentId;
    Commit head(nullptr, false);
    head.AddBlob(&repo, u"h", MakeBlob("2"));
    const auto stored = repo.DoCommit(head);
    const int loads = packed.loads;
    EXPECT_TRUE(Commit::Deserialize(stored->GetId(), parentId, &repo, packed.Loader()) == stored);
    EXPECT_EQ(packed.loads, loads);
    const auto onHead = Read("tree \n", parentId);
    EXPECT_TRUE(onHead->GetParent() == stored &&
                onHead->GetCommitTree()->GetRoot() == stored->GetCommitTree()->GetRoot());
    EXPECT_FALSE(Read("tree " + std::string(64, 'f') + "\n", parentId)->GetCommitTree());
}

TEST_F(Commits, AnAmendTakesThePlaceOfItsParent) {
    const auto root = immu::make<Commit>(Signed(nullptr, u"R", u"r", 1, 1, u"root"));
    const auto parent = immu::make<Commit>(Signed(root, u"P", u"p", 2, 2, u"parent"));
    const Commit amend(parent, true);
    EXPECT_TRUE(amend.IsAmend() && amend.GetParent() == root && amend.GetCommitTree() == parent->GetCommitTree());
    EXPECT_EQ(Narrow(amend.GetAuthorName()) + Narrow(amend.GetAuthorEmail()) + Narrow(amend.GetDescription()),
              "Ppparent");
    EXPECT_TRUE(amend.GetCommitTime() == Time() && amend.GetCommitTimezoneBias() == TimeDelta());
    EXPECT_TRUE(Commit(immu::make<Commit>(), true).GetCommitTree() && !Commit().GetCommitTree());
    Commit properties = Signed(root, u"", u"", 5, 5, u"");
    properties.ResetPropertiesForAmend(*parent);
    // A description ends at its first zero.
    EXPECT_EQ(IdText(properties), IdText(Signed(root, u"P", u"p", 5, 5, u"parent")));
    properties = Signed(nullptr, u"P", u"p", 5, 5, u"parent");
    properties.SetDescription({u"parent\0x", 8});
    EXPECT_EQ(IdText(properties), IdText(Signed(nullptr, u"P", u"p", 5, 5, u"parent")));
    properties.SetDescription({u"\0x", 2});
    EXPECT_EQ(IdText(properties), IdText(Signed(nullptr, u"P", u"p", 5, 5, u"")));
    const Commit& assigned = properties = amend;
    EXPECT_TRUE(assigned == amend && assigned.IsAmend() && assigned.GetStoragePrefix().IsEmpty());
    EXPECT_FALSE(Commit(immu::make<Commit>(), false).GetCommitTree() == nullptr);
    EXPECT_FALSE(Commit(static_cast<IRepository*>(nullptr), false).GetParent());
}

TEST_F(Commits, EditsStoreTheirTreesAndLeaveOthersAlone) {
    Commit parent(nullptr, false);
    EXPECT_TRUE(parent.AddBlob(&repo, u"a/b", MakeBlob("1")) && parent.AddBlob(&repo, u"c", MakeBlob("2")));
    EXPECT_TRUE(parent.GetCommitTree()->GetRoot() == repo.GetTreeFromStorage(parent.GetCommitTree()->GetRootId()));
    Commit child(immu::make<Commit>(parent), false);
    const std::string before = IdText(child);
    EXPECT_FALSE(child.AddBlob(nullptr, u"d", MakeBlob("3")) || child.AddBlob(&repo, u"/", MakeBlob("3")));
    EXPECT_FALSE(child.AddObject(&repo, u"d", Id(u"x")) || child.RemoveObject(&repo, u"d"));
    EXPECT_FALSE(Commit().RemoveObject(&repo, u"d") || Commit().GetBlob(u"d") || child.GetTree(u"c"));
    EXPECT_EQ(ToNames(CommitTree().GetBlobDiffs(parent.GetCommitTree())), (Names{"a/b", "c"}));
    EXPECT_TRUE(CommitTree().GetBlobDiffs(nullptr).empty() && CommitTree().GetAllBlobPaths().empty());
    CommitTree holder;
    EXPECT_TRUE(holder.IsEmpty() && !parent.GetCommitTree()->IsEmpty());
    const auto unstored = MakeTree(repo, "a/b=1 c=2");
    holder.ReplaceRoot(&repo, unstored);
    EXPECT_TRUE(holder.GetRoot() == parent.GetCommitTree()->GetRoot());
    holder.ReplaceRoot(nullptr, unstored);
    EXPECT_TRUE(holder.GetRoot() == unstored);
    EXPECT_TRUE(child.GetCommitTree() == parent.GetCommitTree());
    EXPECT_EQ(IdText(child), before);
    EXPECT_TRUE(child.RemoveObject(&repo, u"c") && child.AddTree(&repo, u"e", *child.GetTree(u"a")->GetRoot()));
    EXPECT_NE(IdText(child), before);
    EXPECT_EQ(Files(child.GetCommitTree()->GetRoot()), "a/b=1 e/b=1");
    EXPECT_EQ(Files(parent.GetCommitTree()->GetRoot()), "a/b=1 c=2");
}

TEST_F(Commits, AreLinkedOldestFirst) {
    std::vector<cow_ptr<Commit>> line;
    EXPECT_FALSE(Commit::MakeCommitLinksInOrder(line, &repo));
    for (auto const* name : {u"5", u"4", u"-", u"2", u"1"})
        line.push_back(immu::make<Commit>(Signed(nullptr, name, u"", 0, 0, name)));
    line[2] = nullptr;
    const auto former = line;
    EXPECT_FALSE(Commit::MakeCommitLinksInOrder(line, nullptr));
    repo.TakeCalls();
    EXPECT_TRUE(Commit::MakeCommitLinksInOrder(line, &repo));
    EXPECT_EQ(repo.TakeCalls(), "Sync(1) Sync(2) Sync(5)");
    EXPECT_TRUE(line[3]->GetParent() == line[4] && line[1] == former[1] && line[0]->GetParent() == line[1]);
    EXPECT_FALSE(former[3]->GetParent());
    EXPECT_EQ(repo.GetCommitCount(), 3U);
}

TEST_F(Commits, AreTakenOverFromAnotherModule) {
    auto commit = std::make_unique<Commit>(Signed(nullptr, u"A", u"a", 1, 0, u"one"));
    const Commit* const address = commit.get();
    const cow_ptr<Commit> taken = dll_wrapped_shared(std::move(commit));
    EXPECT_TRUE(taken.get() == address && taken.use_count() == 1);
    const auto line = dll_wrapped_shared(std::make_unique<std::vector<cow_ptr<Commit>>>(2, taken));
    EXPECT_TRUE(line->back() == taken && taken.use_count() == 3);
    EXPECT_FALSE(dll_wrapped_shared(std::unique_ptr<Tree>()) || dll_wrapped_shared(std::unique_ptr<CommitTree>()));
    EXPECT_FALSE(dll_wrapped_shared(std::unique_ptr<Blob>()) || dll_wrapped_shared(std::unique_ptr<Object>()));
}

} // namespace
} // namespace KivVcs
