// What `scripts/bench.sh postgres` runs as clients of one database: kivvcs_team_bench COMMAND ADDRESS [ARGUMENT...]
// The first three print "ready" when all is prepared, and wait for a line before they begin: so that none measures how the
// others prepare themselves.
//   bare ADDRESS CLIENT SECONDS        inserts, updates and commits through libpq, and prints the rate
//   edits ADDRESS BRANCH SECONDS       publishes small edits on a branch, and prints the rate
//   merging ADDRESS CLIENT EDITS       publishes edits of its own file on one branch with others, and prints the attempts
//   files ADDRESS                      prints how many files these have left
//   ping ADDRESS, list ADDRESS COUNT   prints the median times of an empty query, and of opening and listing commits

#include <KivArchive/ArchivedRepository.h>
#include <KivArchive/PostgresArchive.h>
#include <KivVcs/KivVcs.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <libpq-fe.h>
#include <stdexcept>

namespace {

using namespace KivArchive;
using Clock = std::chrono::steady_clock;

void AwaitStart() {
    std::puts("ready");
    std::fflush(stdout);
    if (std::getchar() == EOF)
        throw std::runtime_error("nobody says when to begin");
}

double Seconds(Clock::time_point since) {
    return std::chrono::duration<double>(Clock::now() - since).count();
}

/// Calls @p work for that long. @return how often a second
template <class Work>
double RateOf(double seconds, Work work) {
    auto const begin = Clock::now();
    int count = 0;
    for (; Seconds(begin) < seconds; ++count)
        work(count);
    return count / Seconds(begin);
}

template <class Work>
double MedianOf(int count, Work work) {
    std::vector<double> times;
    for (int i = 0; i < count; ++i) {
        auto const begin = Clock::now();
        work();
        times.push_back(Seconds(begin));
    }
    std::sort(times.begin(), times.end());
    return times[times.size() / 2];
}

/// The library underneath, without anything in between.
class BareClient {
public:
    explicit BareClient(std::string const& address) : connection_(PQconnectdb(address.c_str()), &PQfinish) {}

    void Execute(std::string const& sql) { Check(PQexec(connection_.get(), sql.c_str())); }
    void Prepare(const char* name, std::string const& sql) {
        Check(PQprepare(connection_.get(), name, sql.c_str(), 0, nullptr));
    }
    void Run(const char* name, const char* parameter) {
        Check(PQexecPrepared(connection_.get(), name, 1, &parameter, nullptr, nullptr, 0));
    }

private:
    void Check(PGresult* result) {
        auto const status = PQresultStatus(result);
        PQclear(result);
        if (status != PGRES_COMMAND_OK && status != PGRES_TUPLES_OK)
            throw std::runtime_error(PQerrorMessage(connection_.get()));
    }

    std::unique_ptr<PGconn, decltype(&PQfinish)> connection_;
};

double RateOfBareTransactions(std::string const& address, std::string const& client, double seconds) {
    BareClient bare(address);
    bare.Execute("SET client_min_messages = error; CREATE TABLE IF NOT EXISTS bare" + client +
                 "(id text PRIMARY KEY, content text); CREATE TABLE IF NOT EXISTS heads" + client +
                 "(name text PRIMARY KEY, head text); INSERT INTO heads" + client + " VALUES('b', '')");
    bare.Prepare("insert", "INSERT INTO bare" + client + " VALUES($1, repeat('content ', 50))");
    bare.Prepare("update", "UPDATE heads" + client + " SET head = $1 WHERE name = 'b'");
    AwaitStart();
    return RateOf(seconds, [&bare](int number) {
        std::string const id = std::to_string(number);
        bare.Execute("BEGIN");
        bare.Run("insert", id.c_str());
        bare.Run("update", id.c_str());
        bare.Execute("COMMIT");
    });
}

void CommitEdit(ArchivedRepository& repository, std::string const& path, int number) {
    std::string const content = "edit of " + path + " " + std::to_string(number) + std::string(300, 'x');
    KivVcs::Buffer data;
    data.Append(content.data(), content.size());
    KivVcs::Commit commit(&repository, false);
    commit.AddBlob(&repository, KivVcs::FromUtf8(path), KivVcs::Blob(std::move(data)));
    commit.SetDescription(KivVcs::FromUtf8(path));
    repository.DoCommit(commit);
}

double RateOfEdits(std::shared_ptr<PostgresArchive> const& archive, std::string const& branch, double seconds) {
    ArchivedRepository repository(archive);
    KivStringT<char16_t> const name = KivVcs::FromUtf8(branch);
    repository.CreateBranch(name, nullptr);
    repository.Checkout(name);
    for (int i = 0; i < 200; ++i)
        CommitEdit(repository, branch + "/file" + std::to_string(i), i);
    if (!repository.Publish().published)
        throw std::runtime_error("the branch is there already");
    AwaitStart();
    return RateOf(seconds, [&](int number) {
        CommitEdit(repository, branch + "/file7", number);
        if (!repository.Publish().published)
            throw std::runtime_error("a branch was moved by somebody else");
    });
}

unsigned PublishMerging(std::shared_ptr<PostgresArchive> const& archive, std::string const& client, int edits) {
    ArchivedRepository repository(archive);
    AwaitStart();
    unsigned attempts = 0;
    for (int i = 0; i < edits; ++i) {
        CommitEdit(repository, "client" + client + "/file" + std::to_string(i), i);
        // Who has lost as many races as a repository tries goes on, as a host would.
        for (auto result = PublishMergingResult::Lost; result != PublishMergingResult::Published;) {
            auto const outcome =
                repository.PublishMerging(KivVcs::Resolvers{KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) {
                                                                return KivVcs::TreeConflictChoice::Merge;
                                                            }});
            if (outcome.result == PublishMergingResult::GaveUp)
                throw std::runtime_error("an edit could not be merged");
            result = outcome.result;
            attempts += outcome.attempts;
        }
    }
    return attempts;
}

/// Files on the branch that clients have published on together.
std::size_t CountFiles(std::shared_ptr<PostgresArchive> const& archive) {
    ArchivedRepository const repository(archive);
    auto const head = repository.GetHead();
    if (!head)
        throw std::runtime_error("nobody has published on master");
    auto const root = head->GetCommitTree()->GetRoot();
    std::size_t count = 0;
    for (auto const& name : root->GetLocalSubtreePaths())
        count += root->GetLocalTree(name)->GetLocalBlobPaths().size();
    return count;
}

double TimeOfListing(std::string const& address, int count) {
    return MedianOf(5, [&] {
        ArchivedRepository const repository(std::make_shared<PostgresArchive>(address));
        auto commit = repository.GetHead();
        for (int i = 1; i < count; ++i)
            commit = commit->GetParent();
    });
}

double TimeOfEmptyQuery(std::string const& address) {
    return MedianOf(5, [&address] { BareClient(address).Execute("SELECT 1"); });
}

void Run(std::vector<std::string> const& arguments) {
    std::string const& command = arguments.at(0);
    std::string const& address = arguments.at(1);
    if (command == "bare") {
        std::printf("%f\n", RateOfBareTransactions(address, arguments.at(2), std::stod(arguments.at(3))));
    } else if (command == "edits") {
        std::printf("%f\n", RateOfEdits(std::make_shared<PostgresArchive>(address), arguments.at(2),
                                        std::stod(arguments.at(3))));
    } else if (command == "merging") {
        std::printf("%u\n", PublishMerging(std::make_shared<PostgresArchive>(address), arguments.at(2),
                                           std::stoi(arguments.at(3))));
    } else if (command == "files") {
        std::printf("%zu\n", CountFiles(std::make_shared<PostgresArchive>(address)));
    } else if (command == "ping") {
        std::printf("%f\n", TimeOfEmptyQuery(address));
    } else if (command == "list") {
        std::printf("%f\n", TimeOfListing(address, std::stoi(arguments.at(2))));
    } else {
        throw std::invalid_argument("there is no command " + command);
    }
}

} // namespace

int main(int count, char** arguments) {
    try {
        Run({arguments + 1, arguments + count});
        return 0;
    } catch (std::exception const& failure) {
        std::fprintf(stderr, "%s\n", failure.what());
        return 1;
    }
}
