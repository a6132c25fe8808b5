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
//   store ARCHIVE FILE, fetch ARCHIVE FILE    streams one content in, and out

#include "OpenArchive.h"
#include "Publishing.h"

#include <KivVcs/SHADigest256.h>

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

std::string TextOf(std::span<const std::byte> bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

Id HeadOf(IArchive& archive) {
    auto const branches = archive.ReadBranches();
    return branches.empty() ? Id() : branches.front().head;
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

void EditDirectory(IArchive& archive, std::size_t count, std::size_t edits) {
    std::string data;
    std::vector<std::size_t> positions;
    for (std::size_t i = 0; i < count; ++i) {
        std::string name = std::to_string(1000000 + i);
        data += "100644 blob file" + name + ".txt" + '\0';
        positions.push_back(data.size());
        data += DigitsOf(Identify(ObjectType::Blob, BufferOf(name)));
    }
    Id head;
    Id before;
    std::vector<double> times;
    std::vector<double> hashing;
    std::uint64_t sizeAtFirst = 0;
    std::string const author = "Ada <ada@example.org> 1700000000 +0100\n";
    for (std::size_t edit = 0; edit <= edits; ++edit) {
        Buffer const blob = BufferOf("edit " + std::to_string(edit));
        Id const blobId = Identify(ObjectType::Blob, blob);
        data.replace(positions[edit * 7919 % count], 64, DigitsOf(blobId));
        Buffer const tree = BufferOf(data);
        auto const hashStart = std::chrono::steady_clock::now();
        Id const treeId = Identify(ObjectType::Tree, tree);
        hashing.push_back(Seconds(hashStart));
        std::string const parent = head.IsEmpty() ? "" : "parent " + DigitsOf(head) + "\n";
        Buffer const commit = BufferOf("tree " + DigitsOf(treeId) + "\n" + parent + "author " + author + "committer " +
                                       author + "\nedit " + std::to_string(edit) + "\n");
        Id const id = Identify(ObjectType::Commit, commit);
        Change change;
        change.objects = {{blobId, ObjectType::Blob, blob, {}},
                          {treeId, ObjectType::Tree, tree, before},
                          {id, ObjectType::Commit, commit, {}}};
        if (!before.IsEmpty())
            change.relied = {before};
        change.ancestry = {{id, head, treeId, {}}};
        change.branches = {{u"master", head, id}};
        auto const start = std::chrono::steady_clock::now();
        archive.Apply(change);
        times.push_back(Seconds(start));
        if (edit == 0)
            sizeAtFirst = archive.GetStatistics().bytes;
        head = id;
        before = treeId;
    }
    std::sort(hashing.begin(), hashing.end());
    times.erase(times.begin());
    for (double& time : times)
        time += hashing[hashing.size() / 2];
    PrintTimes("directory", times);
    std::printf("hash_ms=%.3f growth=%.0f\n", hashing[hashing.size() / 2] * 1e3,
                static_cast<double>(archive.GetStatistics().bytes - sizeAtFirst) / static_cast<double>(edits));
}

void Edits(IArchive& archive, int count) {
    Publisher publisher(archive, workers);
    for (int i = 0; i < 1000; ++i)
        publisher.Set("d" + std::to_string(i % 20) + "/file" + std::to_string(i), "content " + std::to_string(i));
    publisher.Commit("start");
    std::vector<double> times;
    for (int i = 0; i < count; ++i) {
        auto const start = std::chrono::steady_clock::now();
        publisher.Set("d3/file3", "edited " + std::to_string(i) + std::string(2000, 'x'));
        publisher.Commit("edit " + std::to_string(i));
        times.push_back(Seconds(start));
    }
    PrintTimes("edits", times);
}

/// The file as a stream, so that no more of it is held than is asked for.
class FileStream final : public KivVcs::IStream {
public:
    explicit FileStream(std::string const& path)
        : file_(path, std::ios::binary), size_(std::filesystem::file_size(path)) {}
    bool Read(void* destination, std::uint64_t size) override {
        file_.read(static_cast<char*>(destination), static_cast<std::streamsize>(size));
        position_ += size;
        return static_cast<bool>(file_);
    }
    bool Write(const void* /*source*/, std::uint64_t /*size*/) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return size_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    std::ifstream file_;
    std::uint64_t size_;
    std::uint64_t position_ = 0;
};

void StoreFile(IArchive& archive, std::string const& path, std::string const& archivePath) {
    KivVcs::SHADigest256 digest;
    std::uint64_t const size = std::filesystem::file_size(path);
    std::string const header = "blob " + std::to_string(size);
    digest.InitData(header.c_str(), header.size() + 1);
    std::string piece(largestWholeContent, '\0');
    for (std::ifstream file(path, std::ios::binary); file;) {
        file.read(piece.data(), static_cast<std::streamsize>(piece.size()));
        digest.InitData(piece.data(), static_cast<std::size_t>(file.gcount()));
    }
    Id::Digest bytes{};
    digest.FinalDigest(bytes.data());
    Id const id = Id::FromDigest(bytes);
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
    StreamIO stream(KivVcs::Stream(std::make_unique<FileStream>(path)));
    bool const isStored = archive.StoreContent(id, stream, {}, &watch);
    Change change;
    change.records.push_back({{u"content", BufferOf(DigitsOf(id))}, false, {}});
    archive.Apply(change);
    std::printf("stored=%d wal_mib=%.1f\n", static_cast<int>(isStored), static_cast<double>(watch.longest) / 1048576);
}

void FetchFile(IArchive& archive, std::string const& path) {
    std::vector<KivStringT<char16_t>> const names{u"content"};
    Buffer const digits = *archive.ReadRecords(names).at(0).value;
    StreamIO content = ContentStream(archive, IdOfDigits(TextOf(*digits.LockForRead().begin())));
    std::ofstream file(path, std::ios::binary);
    std::string piece(largestWholeContent, '\0');
    for (std::uint64_t rest = content.GetSize(); rest > 0;) {
        std::uint64_t const size = std::min<std::uint64_t>(rest, piece.size());
        if (!content.Read(piece.data(), size))
            throw std::runtime_error("the content cannot be read");
        file.write(piece.data(), static_cast<std::streamsize>(size));
        rest -= size;
    }
}

/// Writes the most memory that this process has had, in MiB, where it is asked for.
void TellPeak() {
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
    auto const opened = OpenArchive(arguments[1], workers);
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
        EditDirectory(archive, static_cast<std::size_t>(number(0)), static_cast<std::size_t>(number(1)));
    } else if (command == "edits") {
        Edits(archive, number(0));
    } else if (command == "store") {
        StoreFile(archive, argument(0), arguments[1]);
    } else if (command == "fetch") {
        FetchFile(archive, argument(0));
    } else {
        throw std::invalid_argument("there is no command " + command);
    }
    TellPeak();
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
