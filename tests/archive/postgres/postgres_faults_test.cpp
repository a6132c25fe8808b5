#include "CuttingProxy.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"
#include "PostgresServer.h"
#include "support/Builders.h"

#include <KivVcs/History.h>

#include <array>
#include <csignal>
#include <libpq-fe.h>
#include <random>
#include <sys/wait.h>
#include <unordered_set>

/// What happens to archives in databases while connections, servers and clients end, and many parties publish.

namespace {

using namespace KivArchive;

enum class Interruption : std::uint8_t { CrashOfServer, EndOfBackends, CutConnection, KilledClient };
constexpr std::array interruptionNames{"server crashed", "backends ended", "connection cut", "client killed"};

enum class Operation : std::uint8_t { Publish, Refresh, Synchronize, Collect };

/// One archive, which each trial goes on with.
class Trials {
public:
    Trials() : proxy_(directory_.Path(""), theServer->Directory()), checked_(theServer->MakeArchive()) {
        options_.schema = theServer->LastSchema();
        options_.reconnect = std::chrono::seconds(60);
        SmallHost source(source_, 99);
        for (int i = 0; i < 6; ++i)
            source.Publish();
    }

    void Run(std::uint32_t number) {
        auto const interruption = static_cast<Interruption>(number % 4);
        auto const operation = static_cast<Operation>(number / 4 % 4);
        SCOPED_TRACE(std::string(interruptionNames[number % 4]) + ", trial " + std::to_string(number));
        if (interruption == Interruption::KilledClient)
            KillWhile(operation, number);
        else
            InterruptWhile(operation, number, interruption);
        Check(number);
    }

private:
    /// What a client does, again and again until @p isDone.
    void Work(Operation operation, std::uint32_t number, PostgresArchive& archive, std::atomic<bool> const& isDone) {
        SmallHost host(archive, number);
        while (!isDone)
            switch (operation) {
            case Operation::Publish:
                if (host.Publish())
                    published_.push_back(host.Head());
                else
                    ADD_FAILURE() << "a race is lost that nobody else runs";
                break;
            case Operation::Refresh: {
                ArchivedRepository repository(std::shared_ptr<IArchive>(&archive, [](IArchive*) {}));
                static_cast<void>(repository.Refresh());
                int walked = 0;
                for (auto commit = repository.GetHead(); commit && walked < 5; commit = commit->GetParent(), ++walked)
                    static_cast<void>(commit->GetCommitTree()->GetRoot());
                break;
            }
            case Operation::Synchronize: {
                SynchronizeOptions options;
                // Behind the one that hosts go on with.
                options.branches = {{u"master", u"other"}};
                Synchronize(source_, archive, options, nullptr);
                break;
            }
            case Operation::Collect: {
                // Something for it to remove.
                Change change;
                change.objects = {Conformance::Object(ObjectType::Blob, Conformance::SomeText(number, 20000))};
                archive.Apply(change);
                Collect(archive, {std::chrono::seconds(0), {}, 5, 1000}, nullptr);
                break;
            }
            }
    }

    void InterruptWhile(Operation operation, std::uint32_t number, Interruption interruption) {
        std::atomic<bool> isDone{false};
        PostgresArchive archive("user=postgres dbname=postgres host=" + directory_.Path(""), options_);
        std::thread client([&] {
            try {
                Work(operation, number, archive, isDone);
            } catch (std::exception const& error) {
                ADD_FAILURE() << "not tried again: " << error.what();
            }
        });
        Wait();
        if (interruption == Interruption::CrashOfServer) {
            theServer->Crash();
            theServer->Restart();
        } else if (interruption == Interruption::EndOfBackends) {
            EndBackends();
        } else {
            proxy_.CutAfter(static_cast<long>(random_() % 20000));
        }
        Wait();
        isDone = true;
        client.join();
        // What was left to pass before the cut must not meet the next client.
        proxy_.CutAfter(LONG_MAX);
    }

    void KillWhile(Operation operation, std::uint32_t number) {
        pid_t const child = fork();
        if (child == 0) {
            try {
                std::atomic<bool> const never{false};
                PostgresArchive archive(theServer->Address(), options_);
                Work(operation, number, archive, never);
            } catch (...) {
                _exit(1);
            }
        }
        Wait();
        kill(child, SIGKILL);
        int status = 0;
        waitpid(child, &status, 0);
        EXPECT_TRUE(WIFSIGNALED(status)) << "it has failed before it was killed";
    }

    static void EndBackends() {
        std::unique_ptr<PGconn, decltype(&PQfinish)> const connection(PQconnectdb(theServer->Address().c_str()),
                                                                      &PQfinish);
        PQclear(PQexec(connection.get(), "SELECT pg_terminate_backend(pid) FROM pg_stat_activity "
                                         "WHERE pid <> pg_backend_pid() AND application_name = 'KivArchive'"));
    }

    /// Nothing lost, nothing half visible, and the next try works.
    void Check(std::uint32_t number) {
        EXPECT_EQ(ProblemsOf(*checked_), "");
        Id const head = HeadOn(u"master");
        std::unordered_set<Id> reached;
        for (Ancestry const& facts : checked_->ReadAncestry({&head, 1}, Follow::Parents, 100000))
            reached.insert(facts.commit);
        for (Id const& id : published_)
            EXPECT_EQ(reached.count(id), 1U) << "a version that was published is lost";
        SmallHost next(*checked_, 10000 + number);
        EXPECT_TRUE(next.Publish());
        published_.push_back(next.Head());
    }

    [[nodiscard]] Id HeadOn(KivStringT<char16_t> const& name) {
        for (Branch const& branch : checked_->ReadBranches())
            if (branch.name == name)
                return branch.head;
        return Conformance::Object(ObjectType::Commit, "none").id;
    }

    void Wait() { std::this_thread::sleep_for(std::chrono::microseconds(random_() % 150000)); }

    TemporaryDirectory directory_;
    CuttingProxy proxy_;
    std::unique_ptr<PostgresArchive> checked_;
    PostgresOptions options_;
    MemArchive source_;
    std::vector<Id> published_;
    std::mt19937 random_{4711};
};

TEST(PostgresFaults, InterruptionsLoseNothing) {
    int const count = CountFromEnvironment("KIVVCS_POSTGRES_INTERRUPTIONS", 8);
    Trials trials;
    for (int number = 0; number < count; ++number)
        trials.Run(static_cast<std::uint32_t>(number));
    std::cout << count << " interruptions in the middle of publishing, refreshing, synchronizing and collecting\n";
}

/// Parties that edit files of their own on one branch, each when it comes to it.
class Party {
public:
    Party(std::string const& address, PostgresOptions const& options, std::uint32_t number)
        : repository_(std::make_shared<PostgresArchive>(address, options)), number_(number), random_(number) {}

    /// Edits and publishes, half of the time. @return how often publishing was tried
    unsigned Play() {
        if (random_() % 2 == 0)
            return 0;
        KivVcs::Commit commit(&repository_, false);
        std::string const path = "p" + std::to_string(number_) + "/" + std::to_string(random_() % 4);
        if (random_() % 5 == 0 && files.erase(path) > 0) {
            commit.RemoveObject(&repository_, KivVcs::Wide(path));
        } else {
            files[path] = std::to_string(random_());
            commit.AddBlob(&repository_, KivVcs::Wide(path), KivVcs::MakeBlob(files[path]));
        }
        commit.SetDescription(KivVcs::Wide(path));
        repository_.DoCommit(commit);
        auto const outcome = repository_.PublishMerging(KivVcs::Resolvers{
            KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }});
        EXPECT_EQ(outcome.result, PublishMergingResult::Published);
        return outcome.attempts;
    }

    [[nodiscard]] std::string Refreshed() {
        static_cast<void>(repository_.Refresh());
        auto const head = repository_.GetHead();
        return head ? KivVcs::Files(head->GetCommitTree()->GetRoot()) : "";
    }
    [[nodiscard]] Id Head() { return repository_.GetHead() ? repository_.GetHead()->GetId() : Id(); }

    /// What the plain model says of its files.
    std::map<std::string, std::string> files;

private:
    ArchivedRepository repository_;
    std::uint32_t number_;
    std::mt19937 random_;
};

/// Parties on an archive of their own, and what they have done.
class Team {
public:
    explicit Team(std::uint32_t number) {
        static_cast<void>(theServer->MakeArchive());
        PostgresOptions options;
        options.schema = theServer->LastSchema();
        for (std::uint32_t i = 0; i < size; ++i)
            parties_.push_back(std::make_unique<Party>(theServer->Address(), options, number * size + i));
    }

    void PlayRound(int round) {
        std::vector<std::thread> threads;
        for (auto const& party : parties_)
            threads.emplace_back([this, &party] {
                unsigned const tried = party->Play();
                attempts += tried;
                published += tried > 0 ? 1 : 0;
            });
        for (std::thread& thread : threads)
            thread.join();
        std::vector<std::string> expected;
        for (auto const& party : parties_)
            for (auto const& [path, content] : party->files)
                expected.push_back(path + "=" + content);
        std::sort(expected.begin(), expected.end());
        for (auto const& party : parties_) {
            ASSERT_EQ(party->Refreshed(), KivVcs::Joined(expected)) << "round " << round;
            ASSERT_EQ(party->Head(), parties_.front()->Head());
        }
    }

    static constexpr std::uint32_t size = 8;
    std::atomic<unsigned> attempts{0};
    std::atomic<unsigned> published{0};

private:
    std::vector<std::unique_ptr<Party>> parties_;
};

TEST(PostgresFaults, PartiesThatPublishAtOnceLoseNoEdit) {
    int const rounds = CountFromEnvironment("KIVVCS_POSTGRES_ROUNDS", 10);
    // Several teams at once make the most of waiting.
    constexpr int roundsOfTeam = 1000;
    std::vector<std::unique_ptr<Team>> teams;
    std::vector<std::thread> threads;
    for (int first = 0; first < rounds; first += roundsOfTeam) {
        Team& team = *teams.emplace_back(std::make_unique<Team>(static_cast<std::uint32_t>(teams.size())));
        threads.emplace_back([&team, count = std::min(roundsOfTeam, rounds - first)] {
            for (int round = 0; round < count && !testing::Test::HasFatalFailure(); ++round)
                team.PlayRound(round);
        });
    }
    for (std::thread& thread : threads)
        thread.join();
    unsigned published = 0;
    unsigned attempts = 0;
    for (auto const& team : teams) {
        published += team->published;
        attempts += team->attempts;
    }
    std::cout << rounds << " rounds of " << Team::size << " parties, " << published << " edits, "
              << static_cast<double>(attempts) / std::max(1U, published) << " attempts on average\n";
}

} // namespace

int main(int argc, char** argv) {
    return KivArchive::RunTestsWithServer(argc, argv, "");
}
