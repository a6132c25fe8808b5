#include "Trials.h"

#include <gtest/gtest.h>

#include <csignal>
#include <sqlite3.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

/// Archives in files: files that are no archives, damage, kills, copies and the size of differences.

namespace KivArchive {
namespace {

using namespace Conformance;

void RunSql(std::string const& path, std::string const& sql) {
    sqlite3* database = nullptr;
    ASSERT_EQ(sqlite3_open(path.c_str(), &database), SQLITE_OK);
    char* message = nullptr;
    EXPECT_EQ(sqlite3_exec(database, sql.c_str(), nullptr, nullptr, &message), SQLITE_OK) << message << " by " << sql;
    sqlite3_free(message);
    sqlite3_close(database);
}

/// The kind of failure of opening a file; nothing if it succeeds.
std::optional<Failure> FailureOf(std::string const& path, SqliteOptions const& options = {}) {
    try {
        SqliteArchive archive(path, options);
        return std::nullopt;
    } catch (ArchiveError const& error) {
        EXPECT_EQ(error.GetFile(), path);
        EXPECT_NE(std::string(error.what()).find(path), std::string::npos) << error.what();
        return error.GetKind();
    }
}

std::string MakeArchive(std::string const& path, int versions) {
    SqliteArchive archive(path);
    SmallHost host(archive, 1);
    for (int i = 0; i < versions; ++i)
        EXPECT_TRUE(host.Publish());
    return path;
}

TEST(SqliteArchive, RefusesWhatIsNoArchiveOfIts) {
    TemporaryDirectory const directory;
    SqliteOptions existing;
    existing.create = false;
    EXPECT_EQ(FailureOf(directory.Path("none"), existing), Failure::Unavailable);
    EXPECT_EQ(FailureOf(directory.Path("no/directory")), Failure::Unavailable);
    WriteFile(directory.Path("text"), std::string(5000, 'x'));
    EXPECT_EQ(FailureOf(directory.Path("text")), Failure::Foreign);
    RunSql(directory.Path("other"), "CREATE TABLE objects(id)");
    EXPECT_EQ(FailureOf(directory.Path("other")), Failure::Foreign);

    std::string const sound = ReadFile(MakeArchive(directory.Path("archive"), 2));
    // What an attacker would plant, and a later format.
    for (const char* const change :
         {"CREATE TRIGGER t AFTER INSERT ON segments BEGIN DELETE FROM branches; END",
          "CREATE VIEW v AS WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n) SELECT x FROM n",
          "CREATE INDEX i ON objects(segment)", "ALTER TABLE records ADD COLUMN more BLOB", "DROP TABLE marks",
          "DROP TABLE records; CREATE VIEW records AS SELECT name, head AS value FROM branches",
          "PRAGMA application_id=7"}) {
        std::string const path = directory.Path("changed");
        WriteFile(path, sound);
        RunSql(path, change);
        EXPECT_EQ(FailureOf(path), Failure::Foreign) << change;
    }
    WriteFile(directory.Path("newer"), sound);
    RunSql(directory.Path("newer"), "PRAGMA user_version=2");
    EXPECT_EQ(FailureOf(directory.Path("newer")), Failure::NewerFormat);
    EXPECT_EQ(FailureOf(directory.Path("archive"), existing), std::nullopt);
    EXPECT_EQ(std::filesystem::status(directory.Path("archive")).permissions(), std::filesystem::perms(0600));
}

TEST(SqliteArchive, RunsNoTriggersThatArePlantedWhileItIsOpen) {
    TemporaryDirectory const directory;
    SqliteArchive archive(directory.Path("archive"));
    SmallHost host(archive, 1);
    ASSERT_TRUE(host.Publish());
    RunSql(directory.Path("archive"), "CREATE TRIGGER t AFTER INSERT ON segments BEGIN DELETE FROM branches; END");
    ASSERT_TRUE(host.Publish());
    EXPECT_EQ(HeadOf(archive), host.Head());
}

TEST(SqliteArchive, WaitsForALockAsLongAsItIsTold) {
    TemporaryDirectory const directory;
    SqliteOptions impatient;
    impatient.wait = std::chrono::milliseconds(50);
    SqliteArchive archive(directory.Path("archive"), impatient);
    SmallHost host(archive, 1);
    sqlite3* other = nullptr;
    sqlite3_open(directory.Path("archive").c_str(), &other);
    sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
    try {
        host.Publish();
        ADD_FAILURE() << "the archive is locked";
    } catch (ArchiveError const& error) {
        EXPECT_EQ(error.GetKind(), Failure::Locked);
    }
    EXPECT_TRUE(archive.ReadBranches().empty()) << "readers do not wait";
    sqlite3_close(other);
    EXPECT_TRUE(host.Publish());
}

TEST(SqliteArchive, CopiesOfAnOpenArchiveAreWholeAndOfOneMoment) {
    TemporaryDirectory const directory;
    SqliteArchive archive(directory.Path("archive"));
    SmallHost host(archive, 1);
    for (int i = 0; i < 12; ++i)
        host.Publish();
    struct Publishing final : IProgress {
        bool Report(Progress const& /*progress*/) override { return host->Publish(); }
        SmallHost* host = nullptr;
    } publishing;
    publishing.host = &host;
    Id const head = host.Head();
    archive.Backup(directory.Path("copy"), &publishing);
    EXPECT_FALSE(host.Head() == head);
    SqliteArchive copy(directory.Path("copy"));
    EXPECT_EQ(HeadOf(copy), head);
    EXPECT_EQ(ProblemsOf(copy), "");
    EXPECT_THROW(archive.Backup(directory.Path("copy"), nullptr), ArchiveError);
    EXPECT_EQ(ProblemsOf(copy), "") << "what is there stays";
}

/// An edit takes as many bytes as it changes, whatever the size of what it edits.
TEST(SqliteArchive, VersionsCostWhatTheyChange) {
    TemporaryDirectory const directory;
    SqliteArchive archive(directory.Path("archive"));
    std::vector<std::pair<std::string, Id>> files;
    for (int i = 0; i < 20000; ++i)
        files.emplace_back(std::to_string(100000 + i), Object(ObjectType::Blob, std::to_string(i)).id);
    std::string text = SomeNoise(1, 900000);
    NewObject tree = Object(ObjectType::Tree, TreeOf(files));
    NewObject blob = Object(ObjectType::Blob, text);
    std::uint64_t first = 0;
    constexpr int edits = 64;
    std::vector<Id> ids;
    for (int i = 0; i <= edits; ++i) {
        Change change;
        change.objects = {tree, blob};
        archive.Apply(change);
        ids.insert(ids.end(), {tree.id, blob.id});
        if (i == 0)
            first = archive.GetStatistics().bytes;
        text.insert(static_cast<std::size_t>(i) * 13001, "an edit");
        files[static_cast<std::size_t>(i) * 311].second = blob.id;
        tree = Object(ObjectType::Tree, TreeOf(files), tree.id);
        blob = Object(ObjectType::Blob, text, blob.id);
    }
    EXPECT_LT((archive.GetStatistics().bytes - first) / edits, 1000U);
    // Version 64 is one step away from one that is stored whole, version 63 six.
    EXPECT_EQ(ReadAll(archive, ids).size(), ids.size());
}

class Random {
public:
    explicit Random(std::uint32_t seed) : engine_(seed) {}
    std::size_t Below(std::size_t end) { return static_cast<std::size_t>(engine_()) % end; }

private:
    std::mt19937 engine_;
};

/// Rows in each other's places, absurd numbers and sizes, and what would run: damage by SQL, as an attacker could do
/// it.
const char* const rowDamages[] = {
    "UPDATE objects SET segment=segment+1 WHERE segment%3=0",
    "UPDATE objects SET member=9223372036854775807 WHERE segment%2=0",
    "UPDATE objects SET type=4 WHERE type=0",
    "UPDATE objects SET type=77, segment=-1",
    "UPDATE segments SET form=(SELECT form FROM segments AS other WHERE other.number=segments.number+1) WHERE number<9",
    "UPDATE segments SET form=zeroblob(200000) WHERE number%2=0",
    "UPDATE segments SET form=x'0000000000000000018080808080808080808001' WHERE number%3=1",
    "UPDATE branches SET head=zeroblob(31)",
    "UPDATE branches SET head=zeroblob(0)",
    "UPDATE ancestry SET id=zeroblob(0) WHERE id=(SELECT max(id) FROM ancestry)",
    "UPDATE ancestry SET parent=id, tree=zeroblob(1000000)",
    "UPDATE OR REPLACE dependencies SET base=segment",
    "INSERT OR IGNORE INTO sparse SELECT number FROM segments; UPDATE segments SET number=number+(1<<62)",
    "CREATE TRIGGER t AFTER INSERT ON objects BEGIN DELETE FROM branches; END",
    "CREATE VIEW v AS WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n) SELECT x FROM n",
};

/// Damages a file; the seed decides how and where.
std::string Damage(std::string bytes, std::uint32_t seed) {
    Random random(seed);
    constexpr std::size_t page = 4096;
    std::size_t const pages = bytes.size() / page;
    auto const at = [&](std::size_t number) { return bytes.begin() + static_cast<std::ptrdiff_t>(number * page); };
    switch (seed % 7) {
    case 0:
        for (std::size_t i = 0; i <= random.Below(20); ++i)
            bytes[random.Below(bytes.size())] ^= static_cast<char>(1U << random.Below(8));
        break;
    case 1:
        bytes.resize(random.Below(bytes.size()));
        break;
    case 2: {
        std::size_t const one = 1 + random.Below(pages - 1);
        std::size_t const other = 1 + random.Below(pages - 1);
        if (one != other)
            std::swap_ranges(at(one), at(one) + page, at(other));
        break;
    }
    case 3: {
        std::size_t const number = random.Below(pages);
        std::fill(at(number), at(number) + page, static_cast<char>(random.Below(256)));
        break;
    }
    case 4:
        // Sizes and pointers at the beginnings of pages.
        for (std::size_t i = 0; i < 4; ++i)
            bytes[random.Below(pages) * page + random.Below(16)] = '\x7F';
        break;
    default:
        bytes.insert(random.Below(bytes.size()), random.Below(page), 'x');
        break;
    }
    return bytes;
}

TEST(SqliteArchive, TellsDamageAndGivesWhatIsSound) {
    TemporaryDirectory const directory;
    std::string const sound = ReadFile(MakeArchive(directory.Path("archive"), 20));
    int const trials = CountFromEnvironment("KIVVCS_ARCHIVE_DAMAGES", 300);
    int refused = 0;
    int partial = 0;
    std::uint64_t given = 0;
    for (int trial = 0; trial < trials; ++trial) {
        std::string const path = directory.Path("damaged");
        bool const isOfRows = trial % 7 == 6;
        WriteFile(path, isOfRows ? sound : Damage(sound, static_cast<std::uint32_t>(trial)));
        if (isOfRows)
            RunSql(path, rowDamages[static_cast<std::size_t>(trial / 7) % std::size(rowDamages)]);
        if (trial % 5 == 0) {
            MemArchive salvaged;
            Salvage(path, salvaged, nullptr);
            EXPECT_TRUE(Verify(salvaged, nullptr).damaged.empty());
        }
        try {
            SqliteArchive archive(path);
            std::vector<Id> listed;
            for (ObjectInfo const& info : archive.ListObjects({}, 1U << 20U))
                listed.push_back(info.id);
            archive.Read(listed, [](ArchivedObject const& object) {
                EXPECT_TRUE(object.size > largestWholeContent || Identify(object.type, object.data) == object.id);
            });
            VerifyReport const report = Verify(archive, nullptr);
            partial += report.IsSound() ? 0 : 1;
            given += report.objects;
            SmallHost(archive, 9).Publish();
        } catch (ArchiveError const& error) {
            EXPECT_TRUE(error.GetKind() == Failure::Damaged || error.GetKind() == Failure::Foreign ||
                        error.GetKind() == Failure::NewerFormat || error.GetKind() == Failure::Unavailable)
                << error.what();
            ++refused;
        }
    }
    std::printf("%d damaged files: %d refused with a message, %d read in part, %llu objects read\n", trials, refused,
                partial, static_cast<unsigned long long>(given));
    EXPECT_GT(refused, 0);
    EXPECT_GT(partial, 0);
}

TEST(SqliteArchive, ReadsWhatIsPutRightWhileItIsOpen) {
    TemporaryDirectory const directory;
    std::string const path = MakeArchive(directory.Path("archive"), 6);
    WriteFile(directory.Path("sound"), ReadFile(path));
    SqliteArchive archive(path);
    std::vector<Id> ids;
    for (ObjectInfo const& info : archive.ListObjects({}, 1000))
        ids.push_back(info.id);
    std::size_t given = 0;
    auto const countDamaged = [&] {
        given = 0;
        return archive.Read(ids, [&given](ArchivedObject const& /*object*/) { ++given; }).damaged.size();
    };
    // Damages what one version of the text inserts, and so all later ones that are differences to it.
    RunSql(path, "UPDATE segments SET form=CAST(substr(form, 1, instr(form, x'65646974') - 1) || x'65636974' || "
                 "substr(form, instr(form, x'65646974') + 4) AS BLOB) WHERE instr(form, x'65646974')>0");
    std::size_t const damaged = countDamaged();
    EXPECT_GT(damaged, 0U);
    EXPECT_EQ(given + damaged, ids.size());
    EXPECT_GT(given, damaged) << "what is beside it in its segment is sound";
    RunSql(path, "ATTACH '" + directory.Path("sound") +
                     "' AS sound; UPDATE segments SET form=(SELECT form FROM sound.segments AS one WHERE "
                     "one.number=segments.number)");
    EXPECT_EQ(countDamaged(), 0U);
    EXPECT_EQ(given, ids.size());
}

/// Publishes, synchronizes and collects until it is killed, and reports every head that it has published.
[[noreturn]] void PublishForever(std::string const& path, std::uint32_t seed, int pipe) {
    try {
        auto const shared = std::make_shared<SqliteArchive>(path);
        SqliteArchive& archive = *shared;
        SmallHost host(archive, seed);
        MemArchive elsewhere;
        SmallHost other(elsewhere, seed + 1);
        for (int i = 1;; ++i) {
            if (i % 3 == 0) {
                other.Publish();
                Synchronize(elsewhere, archive, FromElsewhere(), nullptr);
                PublishByRepository(shared, std::to_string(seed) + "." + std::to_string(i));
            }
            if (host.Publish()) {
                Id::Digest const digest = *host.Head().GetDigest();
                if (write(pipe, digest.data(), digest.size()) != static_cast<ssize_t>(digest.size()))
                    _exit(1);
            }
            if (i % 5 == 0) {
                CollectOptions options;
                options.grace = std::chrono::seconds(0);
                options.slice = 5;
                Collect(archive, options, nullptr);
            }
        }
    } catch (...) {
        _exit(1);
    }
}

/// The head that was reported last before the end.
Id LastReported(int pipe) {
    Id last;
    for (Id::Digest digest{}; read(pipe, digest.data(), digest.size()) == static_cast<ssize_t>(digest.size());)
        last = Id::FromDigest(digest);
    return last;
}

TEST(SqliteArchive, KilledWritersLoseNothingAndLockNobodyOut) {
    TemporaryDirectory const directory;
    std::string const path = directory.Path("archive");
    std::string const start = ReadFile(MakeArchive(path, 1));
    int const trials = CountFromEnvironment("KIVVCS_ARCHIVE_KILLS", 20);
    Random random(4);
    int published = 0;
    for (int trial = 0; trial < trials; ++trial) {
        // Verifying after each trial takes the longer the more there is.
        if (trial % 10 == 0)
            WriteFile(path, start);
        int ends[2] = {};
        ASSERT_EQ(pipe(ends), 0);
        pid_t const child = fork();
        ASSERT_GE(child, 0);
        if (child == 0)
            PublishForever(path, static_cast<std::uint32_t>(trial + 10), ends[1]);
        close(ends[1]);
        std::this_thread::sleep_for(std::chrono::microseconds(random.Below(150000)));
        kill(child, SIGKILL);
        int status = 0;
        waitpid(child, &status, 0);
        ASSERT_TRUE(WIFSIGNALED(status)) << "it failed before it was killed";
        Id const reported = LastReported(ends[0]);
        close(ends[0]);

        SqliteOptions options;
        options.wait = std::chrono::milliseconds(0);
        SqliteArchive archive(path, options);
        ASSERT_EQ(ProblemsOf(archive), "") << "after kill " << trial;
        Id const head = HeadOf(archive);
        bool isKnown = reported.IsEmpty();
        for (Ancestry const& facts : archive.ReadAncestry({&head, 1}, Follow::Parents, 1U << 20U))
            isKnown = isKnown || facts.commit == reported;
        EXPECT_TRUE(isKnown) << "a version that was published is lost";
        published += reported.IsEmpty() ? 0 : 1;
        EXPECT_TRUE(SmallHost(archive, static_cast<std::uint32_t>(trial + 1000)).Publish());
    }
    std::printf("%d kills, %d of them after something was published\n", trials, published);
    EXPECT_GT(published, 0);
}

} // namespace
} // namespace KivArchive
