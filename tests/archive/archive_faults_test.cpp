#include "FaultyFiles.h"
#include "KivArchive/ArchivedRepository.h"
#include "Trials.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <utility>

/// Runs operations while one allocation, access to the disk or callback after the other fails. The archive must be
/// sound after each, and the next operation must succeed.

namespace {

/// The state of this program's operators `new` and `delete`, and of SQLite's allocations. On one thread only.
struct Allocations {
    bool isCounting = false;
    long failing = 0;
    long made = 0;
};
Allocations allocations;

bool Fails() {
    return allocations.isCounting && ++allocations.made == allocations.failing;
}

sqlite3_mem_methods plainMemory;

void* AllocateForSqlite(int size) {
    return Fails() ? nullptr : plainMemory.xMalloc(size);
}

void* ReallocateForSqlite(void* memory, int size) {
    return Fails() ? nullptr : plainMemory.xRealloc(memory, size);
}

} // namespace

// Inlined, they would look mismatched to the compiler.
[[gnu::noinline]] void* operator new(std::size_t size) {
    void* const memory = Fails() ? nullptr : std::malloc(size == 0 ? 1 : size);
    if (memory == nullptr)
        throw std::bad_alloc();
    return memory;
}
[[gnu::noinline]] void* operator new(std::size_t size, std::nothrow_t const& /*tag*/) noexcept {
    return Fails() ? nullptr : std::malloc(size == 0 ? 1 : size);
}
[[gnu::noinline]] void operator delete(void* memory) noexcept {
    std::free(memory);
}
[[gnu::noinline]] void operator delete(void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

namespace KivArchive {
namespace {

using namespace Conformance;

constexpr const char* pathOfStart = "start";

/// A host's callback that fails once, by an exception or by asking to stop.
struct Callbacks final : IProgress {
    struct Thrown {};

    bool Report(Progress const& /*progress*/) override {
        if (failing == 0 || ++made != failing)
            return true;
        if (made % 2 == 0)
            throw Thrown();
        return false;
    }

    long failing = 0;
    long made = 0;
};
Callbacks callbacks;

/// The source for synchronizing and repairing; made before anything fails.
std::unique_ptr<MemArchive> elsewhere;

/// An operation that is interrupted. Each begins with the same archive.
struct Operation {
    const char* name;
    void (*run)(std::string const& path);
    bool hasCallbacks = false;
    /// Whether the archive is damaged at the beginning, and repaired from elsewhere in the end.
    bool isDamaged = false;
};

SqliteOptions OneWorker() {
    SqliteOptions options;
    options.workers = 1;
    options.wait = std::chrono::milliseconds(0);
    return options;
}

void Open(std::string const& path) {
    SqliteArchive const archive(path, OneWorker());
}

void MakeNew(std::string const& path) {
    SqliteArchive const archive(path + ".new", OneWorker());
}

void Publish(std::string const& path) {
    SqliteArchive archive(path, OneWorker());
    SmallHost host(archive, 3);
    for (int i = 0; i < 4; ++i)
        host.Publish();
}

void PublishBranch(std::string const& path) {
    auto const archive = std::make_shared<SqliteArchive>(path, OneWorker());
    for (int i = 0; i < 2; ++i)
        PublishByRepository(archive, "file" + std::to_string(i), &callbacks);
}

void CollectAll(std::string const& path) {
    SqliteArchive archive(path, OneWorker());
    CollectOptions options;
    options.grace = std::chrono::seconds(0);
    options.slice = 4;
    for (int i = 0; i < 2; ++i)
        Collect(archive, options, &callbacks);
}

void Take(std::string const& path) {
    SqliteArchive archive(path, OneWorker());
    Synchronize(*elsewhere, archive, FromElsewhere(), &callbacks);
}

void RepairAll(std::string const& path) {
    SqliteArchive archive(path, OneWorker());
    Repair(archive, *elsewhere, &callbacks);
}

void Copy(std::string const& path) {
    SqliteArchive archive(path, OneWorker());
    archive.Backup(path + ".copy", &callbacks);
}

/// Fetches, commits, publishes, walks and refreshes, while others publish. Tries once more after a failed publish,
/// which must have left the repository as it was.
void UseRepository(std::string const& path) {
    auto const archive = std::make_shared<SqliteArchive>(path, OneWorker());
    ArchivedRepository repository(archive);
    KivVcs::Commit commit(&repository, false);
    commit.AddBlob(&repository, u"docs/new", KivVcs::Blob::CopyText("new"));
    commit.AddBlob(&repository, u"text", KivVcs::Blob::CopyText(SomeText(9, 5000)));
    auto const made = repository.DoCommit(commit);
    auto const publish = [&] {
        if (!repository.Publish(&callbacks).published)
            ADD_FAILURE() << "a publish that was refused without a word";
    };
    try {
        publish();
    } catch (...) {
        publish();
        throw;
    }
    if (!(HeadOf(*archive) == made->GetId()))
        ADD_FAILURE() << "a publish that did nothing";
    for (auto ancestor = made; ancestor; ancestor = ancestor->GetParent())
        static_cast<void>(ancestor->GetCommitTree()->GetBlob(u"text")->GetData());
    SmallHost(*archive, 4).Publish();
    if (repository.Refresh(&callbacks).moved.size() != 1)
        ADD_FAILURE() << "a refresh that found nothing";
}

constexpr Operation operations[] = {{"Open", Open},
                                    {"MakeNew", MakeNew},
                                    {"Publish", Publish},
                                    {"PublishBranch", PublishBranch, true},
                                    {"UseRepository", UseRepository, true},
                                    {"Collect", CollectAll, true},
                                    {"Synchronize", Take, true},
                                    {"Repair", RepairAll, true, true},
                                    {"Copy", Copy, true}};

/// Makes an archive with some versions that are reached and some that are not any more.
std::string MakeStart(std::string const& path, bool isDamaged) {
    elsewhere = std::make_unique<MemArchive>();
    std::filesystem::remove(path);
    {
        SqliteArchive archive(path, OneWorker());
        SmallHost host(archive, 1);
        for (int i = 0; i < 9; ++i)
            host.Publish();
        SynchronizeOptions options;
        options.branches = {{u"master", u"master"}};
        Synchronize(archive, *elsewhere, options, nullptr);
        SmallHost others(*elsewhere, 2);
        for (int i = 0; i < 4; ++i)
            EXPECT_TRUE(others.Publish());
        Id const head = host.Head();
        Change change;
        change.branches = {{u"master", head, archive.ReadAncestry({&head, 1}, Follow::Parents, 4).back().commit}};
        archive.Apply(change);
    }
    if (isDamaged) {
        sqlite3* database = nullptr;
        sqlite3_open(path.c_str(), &database);
        sqlite3_exec(database,
                     "UPDATE segments SET form=zeroblob(9) WHERE number%4=1; DELETE FROM objects WHERE segment%4=2",
                     nullptr, nullptr, nullptr);
        sqlite3_close(database);
    }
    return ReadFile(path);
}

/// Counts faults, and those that were reported.
struct Outcomes {
    int faults = 0;
    int refused = 0;
};

class ArchiveFaults : public testing::TestWithParam<Operation> {
protected:
    /// Runs the operation with one fault after the other, until it runs without meeting the fault.
    /// @param arm makes the access or call with the given number fail
    /// @param disarm ends that, and returns whether it has failed
    template <class Arm, class Disarm>
    void TryAll(const char* kind, Arm arm, Disarm disarm) {
        std::string const path = directory_.Path("archive");
        std::string const start = MakeStart(directory_.Path(pathOfStart), GetParam().isDamaged);
        int const stride = CountFromEnvironment("KIVVCS_ARCHIVE_FAULT_STRIDE", 7);
        Outcomes outcomes;
        bool hasFailed = true;
        for (long fault = 1; hasFailed; fault += fault < 100 ? 1 : stride) {
            WriteFile(path, start);
            WriteFile(path + ".new", {});
            std::filesystem::remove(path + ".new");
            std::filesystem::remove(path + ".copy");
            bool isRefused = false;
            arm(fault);
            try {
                GetParam().run(path);
            } catch (ArchiveError const&) {
                isRefused = true;
            } catch (std::bad_alloc const&) {
                isRefused = true;
            } catch (Callbacks::Thrown const&) {
                isRefused = true;
            }
            hasFailed = disarm();
            outcomes.faults += hasFailed ? 1 : 0;
            outcomes.refused += isRefused ? 1 : 0;
            EXPECT_TRUE(hasFailed || !isRefused) << kind << ": refused without a fault";
            ASSERT_NO_FATAL_FAILURE(CheckWhole(path, kind, fault));
        }
        std::printf("%s, %s: %d faults, %d of them reported\n", GetParam().name, kind, outcomes.faults,
                    outcomes.refused);
        EXPECT_GT(outcomes.refused, 0);
    }

    void CheckWhole(std::string const& path, const char* kind, long fault) {
        for (std::string const& file : {path, path + ".new"}) {
            SqliteArchive archive(file, OneWorker());
            if (GetParam().isDamaged && file == path)
                Repair(archive, *elsewhere, nullptr);
            ASSERT_EQ(ProblemsOf(archive), "") << kind << ": after fault " << fault;
            ASSERT_TRUE(SmallHost(archive, 5).Publish()) << kind << ": after fault " << fault;
        }
        // A copy is complete or missing.
        if (std::filesystem::exists(path + ".copy")) {
            SqliteArchive copy(path + ".copy", OneWorker());
            ASSERT_EQ(ProblemsOf(copy), "") << kind << ": after fault " << fault;
        }
    }

    TemporaryDirectory directory_;
};

TEST_P(ArchiveFaults, OfMemory) {
    TryAll(
        "memory",
        [](long fault) {
            allocations = {true, fault, 0};
        },
        [] {
            allocations.isCounting = false;
            return allocations.made >= allocations.failing;
        });
}

TEST_P(ArchiveFaults, OfTheDisk) {
    for (auto const& [kind, code, staysSo] : {std::tuple{"input and output", SQLITE_IOERR, false},
                                              {"input and output from then on", SQLITE_IOERR, true},
                                              {"full disk", SQLITE_FULL, true}}) {
        bool const isOnlyWrites = code == SQLITE_FULL;
        TryAll(
            kind,
            [&, code = code, staysSo = staysSo](long fault) {
                FaultyFiles::Arm({fault, code, staysSo, isOnlyWrites});
            },
            [] { return FaultyFiles::Disarm(); });
    }
}

TEST_P(ArchiveFaults, OfCallbacks) {
    if (!GetParam().hasCallbacks)
        GTEST_SKIP() << "it has none";
    TryAll(
        "callbacks",
        [](long fault) {
            callbacks.failing = fault;
            callbacks.made = 0;
        },
        [] { return callbacks.made >= std::exchange(callbacks.failing, 0); });
}

INSTANTIATE_TEST_SUITE_P(During, ArchiveFaults, testing::ValuesIn(operations),
                         [](auto const& operation) { return operation.param.name; });

} // namespace
} // namespace KivArchive

/// Before anything else uses SQLite.
int main(int count, char** arguments) {
    sqlite3_config(SQLITE_CONFIG_GETMALLOC, &plainMemory);
    sqlite3_mem_methods faulty = plainMemory;
    faulty.xMalloc = AllocateForSqlite;
    faulty.xRealloc = ReallocateForSqlite;
    sqlite3_config(SQLITE_CONFIG_MALLOC, &faulty);
    KivArchive::FaultyFiles::Install();
    testing::InitGoogleTest(&count, arguments);
    return RUN_ALL_TESTS();
}
