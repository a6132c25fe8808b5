#include "CuttingProxy.h"
#include "KivArchive/ArchivedRepository.h"
#include "PostgresServer.h"
#include "support/Builders.h"

#include <KivVcs/History.h>

#include <libpq-fe.h>

namespace {

using namespace KivArchive;
using Conformance::NewCommit;
using Conformance::Object;
using Conformance::SomeNoise;
using Conformance::SomeText;
using Conformance::TreeOf;
using KivVcs::MakeBlob;
using KivVcs::Wide;

TEST(PostgresArchive, Conforms) {
    CheckArchiveConformance([] { return theServer->MakeArchive(); },
                            [](std::string const& failure) { ADD_FAILURE() << failure; });
}

/// Lets the server run statements of the test's own.
void Execute(std::string const& sql) {
    std::unique_ptr<PGconn, decltype(&PQfinish)> const connection(PQconnectdb(theServer->Address().c_str()), &PQfinish);
    std::unique_ptr<PGresult, decltype(&PQclear)> const result(PQexec(connection.get(), sql.c_str()), &PQclear);
    EXPECT_EQ(PQresultStatus(result.get()), PGRES_COMMAND_OK) << PQerrorMessage(connection.get());
}

cow_ptr<Commit> CommitFile(ArchivedRepository& repository, std::string const& path, std::string const& content) {
    Commit commit(&repository, false);
    commit.AddBlob(&repository, Wide(path), MakeBlob(content));
    commit.SetDescription(Wide(path));
    return repository.DoCommit(commit);
}

TEST(PostgresArchive, TakesFewRoundTrips) {
    std::shared_ptr<PostgresArchive> const archive = theServer->MakeArchive();
    auto trips = [&archive, before = archive->GetRoundTrips()]() mutable {
        return archive->GetRoundTrips() - std::exchange(before, archive->GetRoundTrips());
    };
    {
        ArchivedRepository repository(archive);
        Commit commit(&repository, false);
        std::uint64_t size = 0;
        for (std::uint32_t i = 0; i < 10000; ++i) {
            std::string const content = SomeNoise(i, 2000);
            size += content.size();
            commit.AddBlob(&repository, Wide("d" + std::to_string(i % 10) + "/sub/f" + std::to_string(i)),
                           MakeBlob(content));
        }
        repository.DoCommit(commit);
        trips();
        EXPECT_TRUE(repository.Publish().published);
        EXPECT_LE(trips(), 12 + size / (4 * largestWholeContent)) << "10,000 objects";
        for (int i = 0; i < 25; ++i) {
            // The file is stored as a difference, as its directory is.
            CommitFile(repository, "d1/sub/f1", SomeNoise(1, 2000) + std::to_string(i));
            trips();
            EXPECT_TRUE(repository.Publish().published);
            EXPECT_LE(trips(), i == 0 ? 6U : 1U) << "one edit";
        }
    }
    trips();
    ArchivedRepository const repository(archive);
    int listed = 0;
    for (cow_ptr<Commit> commit = repository.GetHead(); listed < 20; commit = commit->GetParent())
        ++listed;
    EXPECT_LE(trips(), 6U) << "listing 20 commits";
    constexpr std::uint64_t depth = 3;
    EXPECT_TRUE(repository.GetHead()->GetCommitTree()->GetRoot()->GetDeepBlob(u"d3/sub/f3"));
    EXPECT_LE(trips(), depth + 2) << "a tree";
}

/// First it is small enough to be stored as it is, and compact; then it is stored whole once, and as differences from there on.
TEST(PostgresArchive, StoresEachVersionOfADirectoryThatGrows) {
    std::shared_ptr<PostgresArchive> const archive = theServer->MakeArchive();
    {
        ArchivedRepository repository(archive);
        for (int i = 0; i < 40; ++i) {
            CommitFile(repository, "d/f" + std::to_string(i), std::to_string(i));
            EXPECT_TRUE(repository.Publish().published);
        }
    }
    EXPECT_EQ(ProblemsOf(*archive), "");
    // The versions of the directory take 64 KB as they are packed.
    EXPECT_LT(archive->GetStatistics().bytes, 24'000U);
    ArchivedRepository const repository(archive);
    int count = 40;
    for (cow_ptr<Commit> commit = repository.GetHead(); commit; commit = commit->GetParent(), --count)
        EXPECT_EQ(commit->GetCommitTree()->GetRoot()->GetLocalTree(u"d")->GetLocalBlobPaths().size(),
                  static_cast<std::size_t>(count));
    EXPECT_EQ(count, 0);
}

TEST(PostgresArchive, StoresAFileThatChangesNearItsEndsAsADifference) {
    std::shared_ptr<PostgresArchive> const archive = theServer->MakeArchive();
    ArchivedRepository repository(archive);
    std::string content = SomeNoise(1, 900);
    CommitFile(repository, "f", content);
    EXPECT_TRUE(repository.Publish().published);
    std::uint64_t const before = archive->GetStatistics().bytes;
    content[200] = '!';
    content[650] = '!';
    CommitFile(repository, "f", content);
    EXPECT_TRUE(repository.Publish().published);
    EXPECT_LT(archive->GetStatistics().bytes - before, content.size()) << "with a commit and its root";
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST(PostgresArchive, LooksUpChangesWhoseAnswersAreLost) {
    TemporaryDirectory const directory;
    CuttingProxy proxy(directory.Path(""), theServer->Directory());
    static_cast<void>(theServer->MakeArchive());
    PostgresOptions options;
    options.schema = theServer->LastSchema();
    PostgresArchive archive("host=" + directory.Path("") + " user=postgres dbname=postgres", options);
    SmallHost host(archive, 1);
    EXPECT_TRUE(host.Publish());
    for (int i = 0; i < 3; ++i) {
        proxy.LoseNextAnswer();
        EXPECT_TRUE(host.Publish()) << "the race was not lost to oneself";
    }
    EXPECT_EQ(archive.ReadAncestry({&host.Head(), 1}, Follow::Parents, 9).size(), 4U);
    // So are small edits, each of which is one statement.
    ArchivedRepository repository(std::shared_ptr<IArchive>(&archive, [](IArchive*) {}));
    for (int i = 0; i < 4; ++i) {
        CommitFile(repository, "file", std::to_string(i));
        if (i > 0)
            proxy.LoseNextAnswer();
        std::uint64_t const before = archive.GetRoundTrips();
        EXPECT_TRUE(repository.Publish().published);
        EXPECT_LE(archive.GetRoundTrips() - before, 4U) << "sent, sent again, looked up";
    }
    EXPECT_EQ(archive.ReadAncestry({&host.Head(), 1}, Follow::Parents, 9).size(), 4U);
    Id const head = repository.GetHead()->GetId();
    EXPECT_EQ(archive.ReadAncestry({&head, 1}, Follow::Parents, 9).size(), 8U);
    EXPECT_EQ(HeadOf(archive), head);
    NewObject const blob = Object(ObjectType::Blob, "to be removed");
    Change change;
    change.objects = {blob};
    archive.Apply(change);
    archive.Mark({&blob.id, 1});
    proxy.LoseNextAnswer();
    EXPECT_TRUE(archive.Remove({&blob.id, 1}, std::chrono::seconds(0)).empty());
    EXPECT_EQ(ProblemsOf(archive), "");
}

TEST(PostgresArchive, KeepsWhatIsUsedWhileOthersCollect) {
    auto const archive = theServer->MakeArchive();
    std::atomic<bool> isDone{false};
    std::atomic<int> collections{0};
    std::thread collector([&] {
        CollectOptions options;
        options.grace = std::chrono::seconds(0);
        for (; !isDone; ++collections)
            Collect(*archive, options, nullptr);
    });
    // Three versions in turns, each of which the next one leaves unreached.
    std::array<NewObject, 3> blobs;
    std::array<NewObject, 3> trees;
    for (std::size_t i = 0; i < 3; ++i) {
        blobs[i] = Object(ObjectType::Blob, SomeText(static_cast<std::uint32_t>(i), 3000));
        trees[i] = Object(ObjectType::Tree, TreeOf({{"file", blobs[i].id}}));
    }
    int reused = 0;
    for (std::size_t round = 0; round < 150 || collections < 20; ++round) {
        NewObject const& tree = trees[round % 3];
        NewCommit const commit = Conformance::Commit(tree.id, {}, std::to_string(round));
        for (bool isPublished = false; !isPublished;)
            try {
                Change change = {{}, {}, {commit.facts}, {{u"master", HeadOf(*archive), commit.object.id}}, {}};
                if (archive->FindMissing({&tree.id, 1}).empty()) {
                    change.relied = {tree.id};
                    ++reused;
                } else {
                    change.objects = {blobs[round % 3], tree};
                }
                change.objects.push_back(commit.object);
                isPublished = archive->Apply(change).applied;
            } catch (ArchiveError const& error) {
                ASSERT_EQ(error.GetKind(), Failure::Collected) << error.what();
            }
        std::vector<Id> const needed{commit.object.id, tree.id, blobs[round % 3].id};
        ASSERT_TRUE(archive->FindMissing(needed).empty()) << "round " << round;
    }
    isDone = true;
    collector.join();
    EXPECT_GT(reused, 0);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

/// Another host goes back, collects what it has left with all that it was made from, and stores it again: whole this time.
TEST(PostgresArchive, TakesNoNoticeOfRowsThatHaveBeenStoredAnew) {
    using Conformance::TextVersion;
    auto const archive = theServer->MakeArchive();
    PostgresOptions options;
    options.schema = theServer->LastSchema();
    PostgresArchive other(theServer->Address(), options);
    Conformance::Store(*archive, {Object(ObjectType::Blob, "")});
    std::vector<TextVersion> versions;
    versions.reserve(4);
    for (std::uint32_t number = 0; number < 4; ++number) {
        TextVersion const* const before = versions.empty() ? nullptr : &versions.back();
        TextVersion const& version = versions.emplace_back(number, before);
        ASSERT_TRUE(archive->Apply(version.After(before)).applied);
    }
    TextVersion const& last = versions.back();
    TextVersion const next(4, &last);
    TextVersion const elsewhere(5, nullptr);

    Change away = elsewhere.After(nullptr);
    away.branches.front().expected = last.commit.object.id;
    ASSERT_TRUE(other.Apply(away).applied);
    for (int i = 0; i < 6; ++i)
        Collect(other, {std::chrono::seconds(0), {}, 1000, 1000}, nullptr);
    std::vector<Id> const collected = last.Ids();
    ASSERT_EQ(other.FindMissing(collected).size(), 3U);
    Change back = last.After(nullptr);
    back.branches.front().expected = elsewhere.commit.object.id;
    for (NewObject& object : back.objects)
        object.earlier = {};
    ASSERT_TRUE(other.Apply(back).applied);

    // As the first host remembers it, the fifth version is a difference to the first one.
    EXPECT_TRUE(archive->Apply(next.After(&last)).applied);
    EXPECT_TRUE(next.IsIn(other));
    EXPECT_EQ(ProblemsOf(other), "");
}

TEST(PostgresArchive, RolesMayReadOnlyOrWrite) {
    auto const archive = theServer->MakeArchive();
    SmallHost host(*archive, 3);
    EXPECT_TRUE(host.Publish());
    PostgresOptions options;
    options.schema = theServer->LastSchema();
    Execute("CREATE ROLE reader LOGIN; CREATE ROLE writer LOGIN; CREATE ROLE stranger LOGIN;"
            "GRANT USAGE ON SCHEMA " +
            options.schema +
            " TO reader, writer;"
            "GRANT SELECT ON ALL TABLES IN SCHEMA " +
            options.schema +
            " TO reader, writer;"
            "GRANT INSERT, UPDATE, DELETE ON ALL TABLES IN SCHEMA " +
            options.schema + " TO writer");
    std::string const address = "dbname=postgres host=" + theServer->Directory() + " user=";
    PostgresArchive reader(address + "reader", options);
    EXPECT_EQ(ProblemsOf(reader), "");
    try {
        SmallHost(reader, 4).Publish();
        ADD_FAILURE() << "a reader has written";
    } catch (ArchiveError const& error) {
        EXPECT_EQ(error.GetKind(), Failure::ReadOnly);
        EXPECT_NE(std::string(error.what()).find("may read this archive, not write"), std::string::npos);
    }
    PostgresArchive writer(address + "writer", options);
    EXPECT_TRUE(SmallHost(writer, 5).Publish());
    Collect(writer, {std::chrono::seconds(0), {}, 1000, 1000}, nullptr);
    EXPECT_THROW(PostgresArchive(address + "stranger", options), ArchiveError);
}

TEST(PostgresArchive, RefusesWhatIsNoArchiveAndShowsNoSecret) {
    Execute("CREATE SCHEMA other; CREATE TABLE other.objects(id integer)");
    PostgresOptions options;
    options.schema = "other";
    auto const failureOf = [&options](std::string const& address) {
        try {
            PostgresArchive const archive(address, options);
        } catch (ArchiveError const& error) {
            EXPECT_EQ(std::string(error.what()).find("geheim"), std::string::npos) << error.what();
            EXPECT_EQ(error.GetFile().find("geheim"), std::string::npos) << error.GetFile();
            return error.GetKind();
        }
        return Failure::Cancelled;
    };
    EXPECT_EQ(failureOf(theServer->Address()), Failure::Foreign);
    options.create = false;
    options.schema = "missing";
    EXPECT_EQ(failureOf(theServer->Address()), Failure::Unavailable);
    EXPECT_EQ(failureOf("postgresql://ada:geheim@/postgres?host=/nowhere"), Failure::Unavailable);
    EXPECT_EQ(failureOf("postgresql://ada@/geheim?password=geheim&host=" + theServer->Directory()),
              Failure::Unavailable);
    EXPECT_EQ(failureOf("host=/nowhere password=ge geheim"), Failure::Unavailable);
}

} // namespace

int main(int argc, char** argv) {
    return KivArchive::RunTestsWithServer(argc, argv, "fsync=off");
}
