#include "support/HostObjects.h"
#include "support/PackedForms.h"

#include <gtest/gtest.h>

#include <stdexcept>

/// Objects of classes that hosts derive: everything about them is what their own operations say.

namespace KivVcs {
namespace {

// printf 'note 3\0abc' | sha256sum, and so on
std::string const noteId = "a955929d5608db592271b0f98e521e8473c6c18c9a497b422a677e392c5f8112";
std::string const abcId = "c1cf6e465077930e88dc5136641d402f72a229ddd996f627d60e9639eaba35a6";
std::string const abcdId = "a36d9b740b388025c765ebc3dba705988d288c292e5d879bf7dab1eef3909d2f";

/// A blob of another type word, with content that may change behind the library's back.
class Note : public Blob {
public:
    explicit Note(std::string const& content) : text(BufferOf(content)) {}
    Note(Blob const& blob, std::string const& content) : Blob(blob), text(BufferOf(content)) {}

    KivStringT<char> GetHeader() const override { return "note"; }
    Buffer const& GetData() const override {
        ++asked;
        return text;
    }

    Buffer text;
    mutable int asked = 0;
};

TEST(HostObjects, AreIdentifiedByWhatTheirOperationsGive) {
    const Note note("abc");
    EXPECT_EQ(IdText(note), noteId);
    EXPECT_EQ(Bytes(note.GetPackedData()), std::string("note 3\0abc", 10));
    EXPECT_TRUE(note.IsOfHostClass() && note.GetKnownDigest() == nullptr);

    // What the library's blobs know of themselves says nothing about a host's that is made of one, and vice versa.
    const Blob blob = MakeBlob("abcd");
    EXPECT_EQ(IdText(blob) + Bytes(blob.GetPackedData()), abcdId + std::string("blob 4\0abcd", 11));
    Note made(blob, "abc");
    EXPECT_EQ(made.GetKnownDigest(), nullptr);
    EXPECT_EQ(IdText(made) + Bytes(made.GetPackedData()), noteId + std::string("note 3\0abc", 10));
    const Blob sliced(made);
    EXPECT_EQ(IdText(sliced) + Bytes(sliced.GetPackedData()), abcdId + std::string("blob 4\0abcd", 11));
    static_cast<Blob&>(made) = MakeBlob("x");
    EXPECT_EQ(IdText(made), noteId);
    Blob assigned;
    assigned = note;
    EXPECT_EQ(IdText(assigned), IdText(Blob()));
    assigned = MakeBlob("abc");
    EXPECT_EQ(IdText(assigned), abcId);
    EXPECT_TRUE(assigned.GetKnownDigest() != nullptr && !assigned.HasSameId(note));
}

TEST(HostObjects, KeepIdentifierAndFormOfOneState) {
    Note note("abc");
    EXPECT_EQ(IdText(note), noteId);
    const int asked = note.asked;
    note.text = BufferOf("abcd");
    const Note copy(note);
    Note source(note);
    const Note moved(std::move(source));
    for (Note const* kept : {static_cast<Note const*>(&note), &copy, &moved}) {
        EXPECT_EQ(IdText(*kept) + Bytes(kept->GetPackedData()), noteId + std::string("note 3\0abc", 10));
        EXPECT_EQ(kept->asked, asked);
    }
    note.ResetState();
    EXPECT_NE(IdText(note), noteId);
    EXPECT_EQ(Bytes(note.GetPackedData()), std::string("note 4\0abcd", 11));

    // A commit's old text is kept by whatever changes its root without resetting it.
    Repository repo(std::make_unique<MemObjectsStorage>());
    for (auto const& [rebuilds, identified] : {std::pair(false, false), {false, true}, {true, false}, {true, true}}) {
        Commit commit(immu::make<Commit>(), false);
        commit.ReplaceRoot(nullptr, MakeTree(repo, "a=1"));
        commit.ResetState();
        const Commit untouched(commit);
        if (identified)
            static_cast<void>(commit.GetId());
        else
            static_cast<void>(commit.GetData());
        if (rebuilds) {
            class Answering : public Repository {
            public:
                using Repository::Repository;
                cow_ptr<Tree> GetTreeFromStorage(Id const&) const override { return immu::make<Tree>(); }
            };
            Answering other(nullptr);
            commit.RebuildTree(&other);
        } else {
            commit.ReplaceRoot(&repo, MakeTree(repo, "b=2"));
            EXPECT_TRUE(commit.GetCommitTree()->GetRoot() == repo.GetTreeFromStorage(commit.GetRootId()));
        }
        EXPECT_EQ(IdText(commit) + Bytes(commit.GetPackedData()), IdText(untouched) + Bytes(untouched.GetPackedData()));
        commit.ResetState();
        EXPECT_NE(IdText(commit), IdText(untouched));
    }
}

TEST(HostObjects, AreComparedByTheIdentifierThatTheyGive) {
    int fetched = 0;
    const LazyBlob lazy("abc", fetched);
    const Blob same = MakeBlob("abc");
    EXPECT_TRUE(lazy.HasSameId(same) && same.HasSameId(lazy) && lazy == same);
    EXPECT_EQ(lazy.GetIdPrefix(), same.GetIdPrefix());
    EXPECT_EQ(fetched, 0);

    NamedCommit::Log log;
    const NamedCommit one(u"one", nullptr, log);
    const NamedCommit two(u"two", nullptr, log);
    const NamedCommit again(u"one", immu::make<Commit>(), log);
    // Packing leaves nothing behind that comparisons would trust.
    static_cast<void>(one.GetPackedData());
    static_cast<void>(one.Commit::GetId());
    static_cast<void>(two.Commit::GetId());
    EXPECT_TRUE(!one.HasSameId(two) && one.HasSameId(again) && !one.HasSameId(Commit()));
    EXPECT_TRUE(one.GetIdPrefix() == again.GetIdPrefix() && one.GetIdPrefix() != two.GetIdPrefix());
}

/// A blob that was made with its identifier, and must not be asked what it shows.
class TellingBlob final : public Blob {
public:
    explicit TellingBlob(Id::Digest const& digest) : Blob(digest) {}
    TellingBlob(TellingBlob const& other) : Blob(*other.GetKnownDigest()) {}
    KivStringT<char> GetHeader() const override { throw std::logic_error("asked"); }
    KivStringT<char> GetStoragePrefix() const override { throw std::logic_error("asked"); }
    Buffer const& GetData() const override { throw std::logic_error("asked"); }

protected:
    cow_ptr<Blob> Copy() const override { return immu::make<TellingBlob>(*this); }
};

TEST(HostObjects, AreShownByTheIdentifierThatTheyWereMadeWith) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    const TellingBlob telling(*Id::Parse(abcId)->GetDigest());
    Tree told;
    for (int i = 0; i < 300; ++i)
        told.AddBlob(&repo, Wide("f" + std::to_string(i)), MakeBlob(std::to_string(i)));
    told.AddBlob(&repo, u"f7", telling);
    told.RemoveObject(&repo, u"f9");
    EXPECT_TRUE(dynamic_cast<TellingBlob const*>(told.GetLocalBlob(u"f7").get()) != nullptr);
    // A repository of its own, in which nobody has stored the same content.
    Repository own(std::make_unique<MemObjectsStorage>());
    Tree plain = told;
    plain.AddBlob(&own, u"f7", MakeBlob("abc"));
    EXPECT_EQ(IdText(told), IdText(plain));
    EXPECT_TRUE(Bytes(told.GetData()) == Bytes(plain.GetData()));
    const TellingBlob copy(telling);
    EXPECT_TRUE(IdText(copy) == abcId && copy.HasSameId(MakeBlob("abc")) && copy.IsOfHostClass());
    const Blob sliced(copy);
    EXPECT_EQ(IdText(sliced), IdText(Blob()));
}

TEST(HostObjects, AreCopiedAsWhatTheyAre) {
    int fetched = 0;
    cow_ptr<Blob> shared = immu::make<LazyBlob>("abc", fetched);
    const cow_ptr<Blob> other = shared;
    Blob const* const written = shared.write();
    EXPECT_TRUE(written != other.get() && dynamic_cast<LazyBlob const*>(written) != nullptr);
    EXPECT_TRUE(dynamic_cast<LazyBlob const*>(CopyOf(*other).get()) != nullptr && written->HasSameId(*other));
    EXPECT_EQ(fetched, 0);
    // What does not copy itself becomes one of the library's blobs, with the content that it shows.
    const Note note("abc");
    EXPECT_EQ(Bytes(CopyOf(note)->GetPackedData()), std::string("blob 3\0abc", 10));

    NamedCommit::Log log;
    NamedCommit commit(u"named", nullptr, log);
    cow_ptr<Commit> line = CopyOf(commit);
    const cow_ptr<Commit> kept = line;
    line.write()->SetDescription(u"changed");
    EXPECT_EQ(IdText(*line) + IdText(*kept), "namednamed");
    EXPECT_EQ(NameOf(line) + NameOf(kept), "changed");

    /// Hands itself out instead of a copy.
    class Sharing final : public Commit {
        cow_ptr<Commit> Copy() const override { return cow_ptr<Commit>::share(this); }
    };
    cow_ptr<Commit> sharing = immu::make<Sharing>();
    const cow_ptr<Commit> held = sharing;
    sharing.write()->SetDescription(u"changed");
    EXPECT_EQ(NameOf(held), "");
}

TEST(HostObjects, AreAskedForTheirParentsIdentifierAlone) {
    NamedCommit::Log log;
    cow_ptr<Commit> line;
    for (int index = 0; index < 100; ++index)
        line = immu::make<NamedCommit>(Wide(std::to_string(index)), line, log);
    for (int index = 0; index < 100'000; ++index)
        line = immu::make<Commit>(line, false);
    log.asked = 0;
    static_cast<void>(line->GetId());
    EXPECT_EQ(log.asked, 1);
    static_cast<void>(line->GetData());
    EXPECT_EQ(log.asked, 1);
}

TEST(HostObjects, ShowTheirIdentifiersUpToTheFirstZero) {
    NamedCommit::Log log;
    const Commit child(immu::make<NamedCommit>(KivStringT<char16_t>(u"caf\u00E9\0x", 6), nullptr, log), false);
    EXPECT_EQ(Bytes(child.GetData()), "tree \nparent caf\xC3\xA9\nauthor  <> 0 +0000\ncommitter  <> 0 +0000\n\n\n");
    const Commit nameless(immu::make<NamedCommit>(u"", nullptr, log), false);
    EXPECT_EQ(Bytes(nameless.GetData()).substr(0, 14), "tree \nparent \n");
}

TEST(HostObjects, AreWholeUntilTheirDestructorHasRun) {
    NamedCommit::Log log;
    constexpr int length = 1'000'000;
    cow_ptr<Commit> line;
    for (int index = 0; index < length; ++index) {
        if (index % 2 == 0)
            line = immu::make<NamedCommit>(u"", std::move(line), log);
        else
            line = immu::make<Commit>(std::move(line), false);
    }
    line.reset();
    EXPECT_EQ(log.died, length / 2);
    EXPECT_EQ(log.diedWithParent, length / 2 - 1);
}

TEST(Objects, AreIdentifiedByWhatTheyHoldAfterAMove) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    Blob blob = MakeBlob("abc");
    Tree tree = *MakeTree(repo, "a=1");
    Commit commit;
    commit.SetDescription(u"described");
    const auto know = [](Object const& object) { return IdText(object) + Bytes(object.GetPackedData()); };
    const std::string known = know(blob) + know(tree) + know(commit);
    Blob blobs[] = {MakeBlob("x"), MakeBlob("y")};
    Tree trees[] = {*MakeTree(repo, "x=x"), *MakeTree(repo, "y=y")};
    Commit commits[2];
    commits[1].SetDescription(u"y");
    for (std::size_t index : {0U, 1U})
        know(blobs[index]) + know(trees[index]) + know(commits[index]);
    blobs[0] = std::move(blob);
    trees[0] = std::move(tree);
    commits[0] = std::move(commit);
    EXPECT_EQ(know(blobs[0]) + know(trees[0]) + know(commits[0]), known);
    // NOLINTBEGIN(bugprone-use-after-move): what is left is what this is about
    const auto holdsWhatItShows = [&know](auto const& object) {
        using Kind = std::decay_t<decltype(object)>;
        Kind fresh(object);
        fresh.ResetState();
        return know(object) == know(fresh);
    };
    EXPECT_TRUE(holdsWhatItShows(blob) && holdsWhatItShows(tree) && holdsWhatItShows(commit));
    EXPECT_EQ(IdText(blob), IdText(Blob()));
    EXPECT_EQ(IdText(tree), IdText(Tree()));
    // NOLINTEND(bugprone-use-after-move)
    Commit second(std::move(commits[0]));
    EXPECT_EQ(know(second), known.substr(known.size() - know(second).size()));
}

} // namespace
} // namespace KivVcs
