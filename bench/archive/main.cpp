// What `scripts/bench.sh archive` runs beside git: kivvcs_archive_bench COMMAND ARCHIVE [ARGUMENT...]
//   import ARCHIVE DIRECTORY      publishes a directory as one version
//   versions ARCHIVE              publishes versions given on standard input: "F PATH SIZE\nBYTES\n", then "C\n" for each
//   restore ARCHIVE DIRECTORY     writes the newest version to a new directory
//   log ARCHIVE COUNT             prints the newest commits
//   diff ARCHIVE COMMIT COMMIT    prints what differs between two versions
//   start ARCHIVE                 does nothing
//   commits ARCHIVE COUNT         makes commits of one empty tree
//   directory ARCHIVE COUNT EDITS edits one entry of a directory again and again, and prints times and growth
//   edits ARCHIVE COUNT           publishes one change again and again, and prints the times
//   store ARCHIVE FILE            publishes one large file, fetch ARCHIVE FILE restores it

#include "OpenArchive.h"
#include "Publishing.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <thread>
#include <unordered_map>

namespace ArchiveBench {

namespace {

constexpr unsigned workers = 2;

double Seconds(std::chrono::steady_clock::time_point since) {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - since).count();
}

Id HeadOf(IArchive& archive) {
    auto const branches = archive.ReadBranches();
    if (branches.empty())
        throw std::runtime_error("there is no branch");
    return branches.front().head;
}

Id IdOfDigits(std::string_view digits) {
    return Id(KivStringT<char16_t>(KivStringT<char>(digits.data(), static_cast<int>(digits.size()))));
}

void Versions(IArchive& archive) {
    Publisher publisher(archive, workers);
    std::string word;
    for (int version = 0; std::cin >> word;) {
        if (word == "C") {
            publisher.Commit("version " + std::to_string(version++));
            continue;
        }
        std::string path;
        std::size_t size = 0;
        std::cin >> path >> size;
        std::cin.get();
        std::string bytes(size, '\0');
        std::cin.read(bytes.data(), static_cast<std::streamsize>(size));
        publisher.Set(path, std::move(bytes));
    }
}

void Restore(IArchive& archive, std::string const& target) {
    namespace fs = std::filesystem;
    Id const head = HeadOf(archive);
    Id const tree = archive.ReadAncestry({&head, 1}, Follow::Parents, 0).at(0).tree;
    std::unordered_map<Id, std::vector<std::string>> paths;
    std::vector<Id> blobs;
    std::string made;
    for (EntryRecord const& file : ListFiles(archive, tree, std::numeric_limits<std::size_t>::max(), nullptr).files) {
        std::string path = target + "/" + KivVcs::ToUtf8(file.path);
        if (std::string directory = SplitPath(path).first; directory != made) {
            fs::create_directories(directory);
            made = std::move(directory);
        }
        auto& names = paths[file.id];
        if (names.empty())
            blobs.push_back(file.id);
        names.push_back(std::move(path));
    }
    auto const write = [&](std::span<const Id> ids) {
        archive.Read(ids, [&](ArchivedObject const& object) {
            for (std::string const& path : paths.at(object.id)) {
                std::ofstream file(path, std::ios::binary);
                if (object.data.empty() && object.size > 0) {
                    StreamIO content = ContentStream(archive, object.id);
                    std::string bytes(largestWholeContent, '\0');
                    for (std::uint64_t rest = object.size; rest > 0;
                         rest -= std::min<std::uint64_t>(rest, bytes.size())) {
                        std::uint64_t const size = std::min<std::uint64_t>(rest, bytes.size());
                        if (content.Read(bytes.data(), size))
                            file.write(bytes.data(), static_cast<std::streamsize>(size));
                    }
                }
                file.write(reinterpret_cast<const char*>(object.data.data()),
                           static_cast<std::streamsize>(object.data.size()));
            }
        });
    };
    std::span<const Id> const all(blobs);
    std::thread other(write, all.first(all.size() / 2));
    write(all.subspan(all.size() / 2));
    other.join();
}

void Log(IArchive& archive, std::uint64_t count) {
    Id const head = HeadOf(archive);
    CommitListOptions options;
    options.atMost = count;
    std::string out;
    ListCommits(
        archive, {&head, 1}, options,
        [&](CommitRecord const& commit) {
            std::string const description = KivVcs::ToUtf8(commit.description);
            out.append(DigitsOf(commit.id)).append(" ").append(description, 0, description.find('\n')).append("\n");
            return true;
        },
        nullptr);
    std::fwrite(out.data(), 1, out.size(), stdout);
}

void Diff(IArchive& archive, std::string_view before, std::string_view after) {
    std::vector<Id> const commits{IdOfDigits(before), IdOfDigits(after)};
    auto const facts = archive.ReadAncestry(commits, Follow::Parents, 0);
    static constexpr std::string_view letters = "UADMTTR";
    std::string out;
    for (auto const& difference :
         ListDifferences(archive, facts.at(0).tree, facts.at(1).tree, {}, nullptr).differences) {
        out += letters[static_cast<std::size_t>(difference.kind)];
        out.append("\t").append(KivVcs::ToUtf8(difference.path)).append("\n");
    }
    std::fwrite(out.data(), 1, out.size(), stdout);
}

void Commits(IArchive& archive, int count) {
    Change change;
    Buffer const nothing;
    Id const tree = Identify(ObjectType::Tree, nothing);
    change.objects.push_back({tree, ObjectType::Tree, nothing, {}});
    Id head;
    std::string const author = "Ada <ada@example.org> 1700000000 +0100\n";
    for (int i = 0; i < count; ++i) {
        std::string const parent = head.IsEmpty() ? "" : "parent " + DigitsOf(head) + "\n";
        Buffer const data = BufferOf("tree " + DigitsOf(tree) + "\n" + parent + "author " + author + "committer " +
                                     author + "\ncommit " + std::to_string(i) + "\n");
        Id id = Identify(ObjectType::Commit, data);
        change.objects.push_back({id, ObjectType::Commit, data, {}});
        change.ancestry.push_back({id, head, tree, {}});
        head = std::move(id);
        if (change.objects.size() == 20000 || i == count - 1) {
            if (i == count - 1)
                change.branches.push_back({u"master", {}, head});
            archive.Apply(change);
            change = {};
        }
    }
}

/// Publishes `change` again and again, each on top of the one before, and prints what it takes.
void PrintTimes(const char* what, std::vector<double> times) {
    double const first = times.front();
    std::vector<double> last(times.end() - static_cast<std::ptrdiff_t>(std::min<std::size_t>(times.size(), 100)),
                             times.end());
    std::sort(last.begin(), last.end());
    std::vector<double> early(times.begin(),
                              times.begin() + static_cast<std::ptrdiff_t>(std::min<std::size_t>(times.size(), 100)));
    std::sort(early.begin(), early.end());
    std::sort(times.begin(), times.end());
    std::printf("%s median_ms=%.3f first_ms=%.3f first100_ms=%.3f last100_ms=%.3f worst_ms=%.3f\n", what,
                times[times.size() / 2] * 1e3, first * 1e3, early[early.size() / 2] * 1e3, last[last.size() / 2] * 1e3,
                times.back() * 1e3);
}

/// Commits a file of that content, and publishes it. @return the seconds that publishing took, until the disk has it
double PublishEdit(ArchivedRepository& repository, KivStringT<char16_t> const& path, std::string const& content) {
    KivVcs::Commit commit(&repository, false);
    commit.AddBlob(&repository, path, KivVcs::Blob::CopyText(content));
    commit.SetDescription(u"edit");
    bool const isCommitted = repository.DoCommit(commit) != nullptr;
    auto const start = std::chrono::steady_clock::now();
    if (!isCommitted || !repository.Publish().published)
        throw std::runtime_error("an edit was not published");
    return Seconds(start);
}

/// Commits and publishes files of these paths, each with its number for a content.
void PublishFiles(ArchivedRepository& repository, std::vector<KivStringT<char16_t>> const& paths) {
    std::vector<KivVcs::BlobAtPath> blobs;
    for (std::size_t i = 0; i < paths.size(); ++i)
        blobs.push_back({paths[i], KivVcs::immu::make<KivVcs::Blob>(KivVcs::Blob::CopyText(std::to_string(i)))});
    KivVcs::Commit commit(&repository, false);
    commit.AddBlobs(&repository, blobs);
    if (!repository.DoCommit(commit) || !repository.Publish().published)
        throw std::runtime_error("the files were not published");
}

void EditDirectory(std::shared_ptr<IArchive> const& archive, std::size_t count, std::size_t edits) {
    ArchivedRepository repository(archive);
    std::vector<KivStringT<char16_t>> paths;
    for (std::size_t i = 0; i < count; ++i)
        paths.push_back(KivVcs::FromUtf8("file" + std::to_string(1000000 + i) + ".txt"));
    PublishFiles(repository, paths);
    std::uint64_t const sizeAtFirst = archive->GetStatistics().bytes;
    std::vector<double> times;
    std::vector<double> hashing;
    for (std::size_t edit = 0; edit < edits; ++edit) {
        times.push_back(PublishEdit(repository, paths[edit * 7919 % count], "edit " + std::to_string(edit)));
        Buffer const form = KivVcs::Tree(*repository.GetHead()->GetCommitTree()->GetRoot()).GetData();
        auto const start = std::chrono::steady_clock::now();
        static_cast<void>(Identify(ObjectType::Tree, form));
        hashing.push_back(Seconds(start));
    }
    std::sort(hashing.begin(), hashing.end());
    PrintTimes("directory", times);
    std::printf("hash_ms=%.3f growth=%.0f\n", hashing[hashing.size() / 2] * 1e3,
                static_cast<double>(archive->GetStatistics().bytes - sizeAtFirst) / static_cast<double>(edits));
}

void Edits(std::shared_ptr<IArchive> const& archive, int count) {
    ArchivedRepository repository(archive);
    std::vector<KivStringT<char16_t>> paths;
    for (int i = 0; i < 1000; ++i)
        paths.push_back(KivVcs::FromUtf8("d" + std::to_string(i % 20) + "/file" + std::to_string(i)));
    PublishFiles(repository, paths);
    std::vector<double> times;
    for (int i = 0; i < count; ++i)
        times.push_back(PublishEdit(repository, u"d3/file3", "edited " + std::to_string(i) + std::string(2000, 'x')));
    PrintTimes("edits", times);
}

constexpr const char16_t* nameOfLarge = u"large";

void StoreLarge(std::shared_ptr<IArchive> const& archive, std::string const& path, std::string const& archivePath) {
    struct Watch final : IProgress {
        bool Report(Progress const& /*progress*/) override {
            std::error_code none;
            auto const now = std::filesystem::file_size(file + "-wal", none);
            longest = none ? longest : std::max<std::uint64_t>(longest, now);
            return true;
        }
        std::string file;
        std::uint64_t longest = 0;
    } watch;
    watch.file = archivePath;
    ArchivedRepository repository(archive);
    KivVcs::Commit commit(&repository, false);
    auto const blob = repository.StoreFile(path, {}, &watch);
    if (!blob || !commit.AddBlob(&repository, nameOfLarge, *blob) || !repository.DoCommit(commit) ||
        !repository.Publish(&watch).published)
        throw std::runtime_error("the content was not published");
    std::printf("wal_mib=%.1f\n", static_cast<double>(watch.longest) / 1048576);
}

void FetchLarge(std::shared_ptr<IArchive> const& archive, std::string const& path) {
    ArchivedRepository repository(archive);
    repository.RestoreFile(repository.GetHead()->GetBlob(nameOfLarge)->GetId(), path);
}

/// Writes the most memory that this process has had, in MiB, where it is asked for.
void WritePeak() {
    const char* const target = std::getenv("ARCHIVE_BENCH_PEAK"); // NOLINT(concurrency-mt-unsafe): one thread is left
    if (target == nullptr)
        return;
    std::ifstream status("/proc/self/status");
    for (std::string word; status >> word;)
        if (double kibibytes = 0; word == "VmHWM:" && status >> kibibytes)
            std::ofstream(target) << kibibytes / 1024;
}

int Run(std::vector<std::string> const& arguments) {
    if (arguments.size() < 2)
        throw std::invalid_argument("kivvcs_archive_bench COMMAND ARCHIVE [ARGUMENT...]");
    std::string const& command = arguments[0];
    if (command == "start")
        return 0;
    std::shared_ptr<IArchive> const opened = OpenArchive(arguments[1], workers);
    IArchive& archive = *opened;
    auto const argument = [&](std::size_t i) { return arguments.at(i + 2); };
    auto const number = [&](std::size_t i) { return std::stoi(argument(i)); };
    if (command == "import") {
        Publisher publisher(archive, workers);
        publisher.SetDirectory(argument(0));
        publisher.Commit("import");
    } else if (command == "versions") {
        Versions(archive);
    } else if (command == "restore") {
        Restore(archive, argument(0));
    } else if (command == "log") {
        Log(archive, static_cast<std::uint64_t>(number(0)));
    } else if (command == "diff") {
        Diff(archive, argument(0), argument(1));
    } else if (command == "commits") {
        Commits(archive, number(0));
    } else if (command == "directory") {
        EditDirectory(opened, static_cast<std::size_t>(number(0)), static_cast<std::size_t>(number(1)));
    } else if (command == "edits") {
        Edits(opened, number(0));
    } else if (command == "store") {
        StoreLarge(opened, argument(0), arguments[1]);
    } else if (command == "fetch") {
        FetchLarge(opened, argument(0));
    } else {
        throw std::invalid_argument("there is no command " + command);
    }
    WritePeak();
    return 0;
}

} // namespace

} // namespace ArchiveBench

int main(int count, char** arguments) {
    try {
        return ArchiveBench::Run({arguments + 1, arguments + count});
    } catch (std::exception const& failure) {
        std::fprintf(stderr, "%s\n", failure.what());
        return 1;
    }
}
