#include "support/HostObjects.h"
#include "support/PackedForms.h"
#include "support/RecordingRepository.h"

#include <gtest/gtest.h>

#include <map>
#include <random>
#include <set>

/// Repositories and storages whose hosts override operations, refuse, or change things meanwhile.

namespace KivVcs {
namespace {

/// Makes another branch current whenever it is asked to look at or move one, and notes the names that it was given.
class SwitchingStorage : public MemObjectsStorage {
public:
    SwitchingStorage() : MemObjectsStorage{u"first!", u"second"} {}

    cow_ptr<Commit> GetHead(KivStringViewT<char16_t> name) const override {
        Switch(name);
        return MemObjectsStorage::GetHead(name);
    }
    bool UpdateBranch(KivStringViewT<char16_t> name, cow_ptr<Commit> commit) override {
        Switch(name);
        return MemObjectsStorage::UpdateBranch(name, std::move(commit));
    }

    Repository* repository = nullptr;
    mutable std::vector<std::string> names;

private:
    void Switch(KivStringViewT<char16_t> name) const {
        const KivStringT<char16_t> former = repository->GetCurentBranch();
        repository->Checkout(former == u"first!" ? u"second" : u"first!");
        // Takes the memory of a name that nobody holds any more.
        const KivStringT<char16_t> other = KivStringT<char16_t>(u"other") + u"!";
        names.push_back(Narrow(name));
    }
};

TEST(HostRepositories, AreGivenTheNameOfTheBranchThatIsCurrentAtTheMomentOfTheCall) {
    auto owned = std::make_unique<SwitchingStorage>();
    SwitchingStorage& storage = *owned;
    Repository repo(std::move(owned));
    storage.repository = &repo;
    repo.Checkout(u"first!");
    Commit commit(nullptr, false);
    const auto stored = repo.DoCommit(commit);
    EXPECT_FALSE(repo.GetHead());
    EXPECT_TRUE(repo.GetHead() == stored);
    EXPECT_TRUE(repo.FastForwardMerge(stored));
    EXPECT_EQ(Joined(storage.names), "first! second first! second first!");
}

TEST(HostRepositories, HaveTheirStoragesAskedForAllThatTreesTakeInOrRead) {
    class Noting : public MemObjectsStorage {
    public:
        cow_ptr<Blob> GetBlob(Id const& id) const override {
            calls += "blob? ";
            return MemObjectsStorage::GetBlob(id);
        }
        cow_ptr<Tree> GetTree(Id const& id) const override {
            calls += "tree? ";
            return MemObjectsStorage::GetTree(id);
        }
        void AddBlob(cow_ptr<Blob> blob) override {
            calls += "blob! ";
            MemObjectsStorage::AddBlob(std::move(blob));
        }
        void AddTree(cow_ptr<Tree> tree) override {
            calls += "tree! ";
            MemObjectsStorage::AddTree(std::move(tree));
        }
        mutable std::string calls;
    };
    auto owned = std::make_unique<Noting>();
    std::string const& calls = owned->calls;
    Repository repo(std::move(owned));
    Tree tree;
    tree.AddBlob(&repo, u"d/x", MakeBlob("1"));
    EXPECT_EQ(calls, "blob? blob? blob! tree? tree? tree! ");
    auto other = std::make_unique<Noting>();
    std::string const& read = other->calls;
    Repository reader(std::move(other));
    ASSERT_TRUE(repo.SyncWithStorage(immu::make<Tree>(tree)));
    PackedFormsOf forms(repo);
    EXPECT_TRUE(Tree::Deserialize(tree.GetId(), &reader, forms.Loader()));
    EXPECT_EQ(read, "tree? tree? blob? blob? blob? blob! tree? tree! tree? tree? tree? tree! ");
}

TEST(HostRepositories, FindInATableThatTheyHaveAskedForWhatTreesTakeInAfterwards) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    Tree tree;
    for (auto const* path : {u"d/x", u"d/y", u"d/z"}) {
        const auto blob = tree.AddBlob(&repo, path, MakeBlob(Narrow(path)));
        auto const& table = repo.GetStorage()->GetBlobs();
        ASSERT_TRUE(blob && table.contains(blob->GetId()));
        EXPECT_TRUE(tree.AddBlob(&repo, u"again", MakeBlob(Narrow(path))) == blob);
        EXPECT_EQ(repo.GetBlobCount(), table.size());
    }
    EXPECT_EQ(repo.GetBlobCount(), 3U);
}

TEST(HostRepositories, DecideWhatTheirOverridesAreAskedAbout) {
    class Claiming : public Repository {
    public:
        using Repository::Repository;
        bool BranchExist(KivStringViewT<char16_t>) override { return true; }
    };
    Claiming none(nullptr);
    EXPECT_FALSE(none.Checkout(u"anything"));
    EXPECT_EQ(Narrow(none.GetCurentBranch()), "master");

    class Hiding : public MemObjectsStorage {
    public:
        cow_ptr<Commit> GetCommit(Id const&) const override { return nullptr; }
    };
    Hiding storage;
    const auto commit = immu::make<Commit>();
    storage.AddCommit(commit);
    storage.DeleteCommit(commit);
    EXPECT_EQ(storage.GetCommitCount(), 1U);
}

TEST(HostRepositories, FindTheirTablesAsTheyWereAfterAddingWhatIsThere) {
    MemObjectsStorage storage;
    const auto order = [&storage] {
        std::vector<Blob const*> blobs;
        for (auto const& [id, blob] : storage.GetBlobs())
            blobs.push_back(blob.get());
        return blobs;
    };
    for (int number = 0; number < 200; ++number) {
        const Blob blob = MakeBlob(std::to_string(number));
        storage.AddBlob(immu::make<Blob>(blob));
        const auto before = order();
        const std::size_t buckets = storage.GetBlobs().bucket_count();
        storage.AddBlob(immu::make<Blob>(blob));
        ASSERT_TRUE(order() == before && storage.GetBlobs().bucket_count() == buckets) << number;
    }
}

/// Reports one of a few identifiers, most of which are no digests, or nobody's.
class Impostor : public Blob {
public:
    explicit Impostor(int number) : number_(number) {}
    Id GetId() const override { return number_ == 0 ? Id() : Id(Wide("impostor " + std::to_string(number_))); }

private:
    int number_;
};

TEST(HostRepositories, FindTheSameInTheirStoragesWheneverTheyAskForATable) {
    std::mt19937 random(11);
    std::vector<cow_ptr<Commit>> all;
    for (int number = 0; number < 400; ++number) {
        all.push_back(immu::make<Commit>());
        all.back().write()->SetDescription(Wide(std::to_string(number)));
    }
    for (int round = 0; round < 60; ++round) {
        std::unique_ptr<IObjectsStorage> storage = std::make_unique<MemObjectsStorage>();
        std::map<Id, Commit const*> expected;
        // A table is asked for late, early, or never.
        IObjectsStorage::CommitTable const* table = nullptr;
        const auto showing = random() % 1500;
        const auto spread = 10 + random() % 390;
        for (std::mt19937::result_type step = 0; step < 1000; ++step) {
            auto const& commit = all[random() % spread];
            if (random() % 3 != 0) {
                storage->AddCommit(commit);
                expected.emplace(commit->GetId(), commit.get());
            } else {
                storage->DeleteCommit(commit);
                expected.erase(commit->GetId());
            }
            if (step == showing) {
                table = &storage->GetCommits();
                // A clone of what is shown, and what is shown of a clone, before and after changes.
                storage = random() % 2 == 0 ? storage->Clone() : std::move(storage);
                table = &storage->GetCommits();
            }
            ASSERT_EQ(storage->GetCommitCount(), expected.size());
            ASSERT_TRUE(table == nullptr || table->size() == expected.size());
            auto const& other = all[random() % spread];
            const auto known = expected.find(other->GetId());
            ASSERT_EQ(storage->GetCommit(other->GetId()).get(), known == expected.end() ? nullptr : known->second);
        }
        const auto clone = storage->Clone();
        for (auto const& commit : all) {
            const std::uint32_t holders = expected.contains(commit->GetId()) ? 3 : 1;
            ASSERT_TRUE(commit.use_count() == holders && (holders == 1) == !clone->GetCommit(commit->GetId()));
        }
        for (auto const& [id, commit] : clone->GetCommits())
            ASSERT_TRUE(commit.use_count() == 3 && expected.at(id) == commit.get() && storage->GetCommit(id) == commit);
        // Nothing but the storages holds what nobody else does.
        storage->AddCommit(immu::make<Commit>());
        storage->PurgeUnusedObjects();
        ASSERT_EQ(storage->GetCommitCount(), expected.size());
    }
    for (auto const& commit : all)
        EXPECT_EQ(commit.use_count(), 1U);

    MemObjectsStorage storage;
    const auto blob = immu::make<Blob>(MakeBlob("blob"));
    storage.AddBlob(blob);
    for (int number : {1, 0, 2, 1})
        storage.AddBlob(immu::make<Impostor>(number));
    EXPECT_TRUE(storage.GetBlobCount() == 4 && storage.GetBlob(Id()) && storage.GetBlob(Impostor(2).GetId()));
    EXPECT_TRUE(storage.GetBlob(blob->GetId()) == blob && !storage.GetBlob(Impostor(3).GetId()));
    storage.PurgeUnusedObjects();
    EXPECT_TRUE(storage.GetBlobs().size() == 1 && storage.GetBlobs().begin()->second == blob);
}

std::multiset<std::string> NamesOf(IObjectsStorage const& storage, cow_ptr<Commit> const& head, bool scanning) {
    std::multiset<std::string> names;
    if (scanning) {
        for (auto const& [name, each] : storage.GetRefs()) {
            if (each == head)
                names.insert(Narrow(name));
        }
    } else {
        for (auto const& name : storage.GetCommitBranches(head))
            names.insert(Narrow(name));
    }
    return names;
}

TEST(HostRepositories, FindTheBranchesOfACommitHoweverTheyWereMoved) {
    std::mt19937 random(7);
    const cow_ptr<Commit> heads[] = {nullptr, immu::make<Commit>(), immu::make<Commit>(), immu::make<Commit>()};
    std::unique_ptr<IObjectsStorage> storage = std::make_unique<MemObjectsStorage>();
    for (int step = 0; step < 2000; ++step) {
        const auto name = Wide("b" + std::to_string(random() % 20));
        auto const& head = heads[random() % 4];
        switch (random() % 4) {
        case 0:
            storage->CreateBranch(name, head);
            break;
        case 1:
            storage->RemoveBranch(name);
            break;
        default:
            storage->UpdateBranch(name, head);
            break;
        }
        if (step % 100 == 0)
            storage = storage->Clone();
        for (auto const& each : heads)
            ASSERT_EQ(NamesOf(*storage, each, false), NamesOf(*storage, each, true)) << step;
    }
}

/// Notes what becomes of commits, with the line of each old one, and who stands where then; fails on request.
class NotingRepository : public RecordingRepository {
public:
    using RecordingRepository::RecordingRepository;

    std::string broken;
    std::vector<std::string> rewrites;

protected:
    void CommitRewritten(cow_ptr<Commit> old, cow_ptr<Commit> rebuilt) override {
        if (NameOf(old) == broken)
            throw std::runtime_error(broken);
        EXPECT_TRUE(GetCommitFromStorage(rebuilt->GetId()) == rebuilt && *old != *rebuilt);
        EXPECT_TRUE(GetStorage()->GetCommitBranches(rebuilt).empty());
        rewrites.push_back(Line(old) + ">" + Line(rebuilt));
    }

private:
    static std::string Line(cow_ptr<Commit> const& commit) {
        return NameOf(commit) + (commit->GetParent() ? "/" + Line(commit->GetParent()) : "");
    }
};

class Rewriting : public testing::Test {
protected:
    std::string TakeRewrites() {
        std::sort(repo.rewrites.begin(), repo.rewrites.end());
        return Joined(std::exchange(repo.rewrites, {}));
    }

    NotingRepository repo{std::make_unique<MemObjectsStorage>()};
    GrownHistory history{repo};
};

TEST_F(Rewriting, IsToldToTheHostBeforeBranchesMoveAndAnythingIsPurged) {
    history.Grow("r a:r b:a c:b x:a");
    history.Point("master=c topic=a side=x");
    history.Forget();
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_EQ(TakeRewrites(), "a/r>a c/b/a/r>c/a x/a/r>x/a");
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_EQ(TakeRewrites(), "");

    history.Grow("d e:d f:e");
    history.Point("one=f two=d three=f");
    history.Forget();
    // The oldest stays what it is.
    EXPECT_TRUE(repo.DeleteCommits(repo.GetHead(u"one")));
    EXPECT_EQ(TakeRewrites(), "f/e/d>f/d");
    EXPECT_EQ(history.Branches(), "master=c/a one=f/d side=x/a three=f/d topic=a two=d");

    repo.MergelessRebase(KivStringViewT<char16_t>(u"side"), u"master");
    EXPECT_EQ(TakeRewrites(), "x/a>x/c/a");
    EXPECT_TRUE(repo.EnsureCommonRootFor(u"master", u"one", u"side"));
    EXPECT_EQ(TakeRewrites(), "d>d/x/a f/d>f/d/x/a");
    repo.broken = "f";
    const auto head = repo.GetHead(u"one");
    EXPECT_THROW(repo.DeleteCommits(head), std::runtime_error);
    EXPECT_TRUE(repo.GetHead(u"one") == head);
}

TEST_F(Rewriting, LetsThePurgeHaveTheOldCommitsAndNotTheNewOnes) {
    class Refusing : public Repository {
    public:
        using Repository::Repository;
        bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) override {
            return NameOf(commit) != "b" && Repository::MoveBranchTo(branch, commit);
        }
        void UpdateStorage() override {
            countBefore = GetCommitCount();
            RemoveBranch(u"master");
            Repository::UpdateStorage();
        }
        std::uint64_t countBefore = 0;
    };
    Refusing refusing(std::make_unique<MemObjectsStorage>());
    GrownHistory line(refusing);
    line.Grow("a b:a c:b d:c");
    refusing.CreateBranch(u"topic", line["b"]);
    refusing.MoveBranchTo(u"master", line["d"]);
    // Nobody else holds the commit that is given, and nobody at all the rewritten ones once their branch is gone.
    refusing.GetStorage()->DeleteCommit(line["a"]);
    auto given = line["d"];
    line.Forget();
    EXPECT_TRUE(refusing.DeleteCommits(std::move(given)));
    EXPECT_EQ(line.Branches(), "topic=b/a");
    EXPECT_EQ(refusing.countBefore, 2U);
    EXPECT_EQ(line.Counts(), "2 3 4");
    refusing.UpdateStorage();
    EXPECT_EQ(line.Counts(), "0 2 2");
}

TEST(HostObjects, MeetAreStoredAndAreRewrittenByTheirOwnIdentifiers) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    NamedCommit::Log log;
    const auto named = [&](const char16_t* name, cow_ptr<Commit> parent) {
        return repo.SyncWithStorage(cow_ptr<Commit>(immu::make<NamedCommit>(name, std::move(parent), log)));
    };
    const auto base = named(u"base", named(u"root", nullptr));
    const auto left = named(u"left", base);
    const cow_ptr<Commit> twin = immu::make<NamedCommit>(u"base", nullptr, log);
    const auto right = named(u"right", twin);
    EXPECT_TRUE(repo.GetCommonBase(left, right) == twin && repo.GetCommonBase(right, left) == base);
    EXPECT_FALSE(repo.GetCommonBase(left, immu::make<NamedCommit>(u"other", nullptr, log)));

    // The branches' commits, and the one in which they meet, with the identifiers that they had.
    repo.CreateBranch(u"left", left);
    repo.CreateBranch(u"right", right);
    EXPECT_TRUE(repo.SimplifyCommitGraph(true));
    EXPECT_TRUE(repo.GetHead(u"left") == left && repo.GetHead(u"right") == right);

    NamedCommit draft(u"draft", left, log);
    const auto stored = repo.DoCommit(draft);
    EXPECT_TRUE(repo.GetCommitFromStorage(Id(u"draft")) == stored && repo.GetHead() == stored);
    EXPECT_NE(dynamic_cast<NamedCommit const*>(stored.get()), nullptr);
}

/// A line of commits and a nest of directories, stored but for every second one.
struct Line {
    Line(Repository& repo, int stored) {
        // Keeps the line apart from all others.
        Repository home(std::make_unique<MemObjectsStorage>());
        for (int number = 0; number < 64; ++number) {
            Commit next(std::move(commit), false);
            next.SetDescription(Wide(std::to_string(number)));
            commit = immu::make<Commit>(std::move(next));
            Tree above;
            above.AddBlob(&home, Wide(std::to_string(number)), MakeBlob(std::to_string(number)));
            if (tree)
                above.AddTree(&home, u"below", *tree);
            tree = home.SyncWithStorage(immu::make<Tree>(std::move(above)));
            if (number % 2 == stored) {
                repo.AddCommitToStorage(commit);
                repo.AddTreeToStorage(tree);
            }
        }
    }

    cow_ptr<Commit> commit;
    cow_ptr<Tree> tree;
};

TEST(Purges, RemoveAllThatDiesAtOnceAlsoBelowWhatIsEqualToObjectsThatStay) {
    Repository repo(std::make_unique<MemObjectsStorage>());
    const auto left = [&repo] {
        return std::to_string(repo.GetCommitCount()) + " " + std::to_string(repo.GetTreeCount());
    };
    Line(repo, 1);
    EXPECT_EQ(left(), "32 32");
    {
        const Line twins(repo, 0);
        EXPECT_EQ(left(), "64 64");
        repo.UpdateStorage();
        EXPECT_EQ(left(), "32 32");
    }
    repo.UpdateStorage();
    EXPECT_EQ(left(), "0 0");
}

} // namespace
} // namespace KivVcs
