#include "Fuzzing.h"

#include <KivArchive/ArchiveConformance.h>
#include <KivArchive/KivArchive.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <unistd.h>

/// Files of archives that somebody has changed: an input is a list of changes to a sound one. Whatever it becomes, opening,
/// reading, listing, collecting from and salvaging it ends, and gives nothing that is not what its identifier says.

namespace {

using namespace KivArchive;
using KivVcs::Fuzzing::Input;
using KivVcs::Fuzzing::Require;

std::string PathOf(const char* name) {
    static std::string const directory = [] {
        namespace fs = std::filesystem;
        fs::path const place = fs::is_directory("/dev/shm") ? fs::path("/dev/shm") : fs::temp_directory_path();
        std::string made = place / ("fuzz-files-" + std::to_string(getpid()));
        fs::create_directories(made);
        return made;
    }();
    return directory + "/" + name;
}

/// Two versions and what else an archive holds.
std::string MakeSound() {
    std::string const path = PathOf("sound");
    {
        SqliteArchive archive(path);
        Id head;
        Id earlier;
        for (int i = 0; i < 2; ++i) {
            NewObject const blob =
                Conformance::Object(ObjectType::Blob, Conformance::SomeText(1, 3000) + std::to_string(i), earlier);
            NewObject const tree = Conformance::Object(ObjectType::Tree, Conformance::TreeOf({{"file", blob.id}}));
            Conformance::NewCommit commit = Conformance::Commit(tree.id, head, "version " + std::to_string(i));
            commit.facts.contains = {{Containment::Merged, blob.id}};
            Change change;
            change.objects = {blob, tree, commit.object};
            change.ancestry = {commit.facts};
            change.branches = {{u"master", head, commit.object.id}};
            change.records.push_back({{u"record", Conformance::BufferOf("value")}, false, {}});
            archive.Apply(change);
            head = commit.object.id;
            earlier = blob.id;
        }
        std::vector<Id> const marked{earlier};
        archive.Mark(marked);
    }
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// Runs @p use, which may fail as archives do.
template <class Use>
void Try(Use use) {
    try {
        use();
    } catch (ArchiveError const& error) {
        Require(error.GetKind() != Failure::Unavailable || std::string_view(error.what()).size() > 20,
                "a failure has a sentence");
    }
}

void UseAll(IArchive& archive) {
    auto const read = [&](std::vector<Id> const& ids) {
        archive.Read(ids, [](ArchivedObject const& object) {
            Require(object.size != object.data.size() || Identify(object.type, object.data) == object.id,
                    "what is read is what its identifier says");
        });
    };
    Try([&] {
        std::vector<Id> ids;
        for (ObjectInfo const& info : archive.ListObjects({}, 1000))
            ids.push_back(info.id);
        read(ids);
        static_cast<void>(archive.Describe(ids));
    });
    Try([&] { static_cast<void>(archive.ReadRecords(archive.ListRecords())); });
    Try([&] { static_cast<void>(archive.GetStatistics()); });
    Try([&] {
        std::vector<Id> heads;
        for (Branch const& branch : archive.ReadBranches())
            heads.push_back(branch.head);
        CommitListOptions options;
        options.follow = Follow::Everything;
        options.atMost = 100;
        ListCommits(
            archive, heads, options,
            [&](CommitRecord const& commit) {
                Try([&] { static_cast<void>(ListFiles(archive, commit.tree, 100, nullptr)); });
                return true;
            },
            nullptr);
    });
    Try([&] { static_cast<void>(Verify(archive, nullptr)); });
    Try([&] {
        CollectOptions options;
        options.grace = std::chrono::seconds(0);
        Collect(archive, options, nullptr);
    });
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static std::string const sound = MakeSound();
    std::string bytes = sound;
    constexpr std::size_t page = 4096;
    std::size_t const pages = bytes.size() / page;
    for (Input input(data, size); !input.IsUsedUp();) {
        // Near the beginning of a page, where its numbers are, or near its end, where rows begin.
        std::size_t const begin = input.Byte() % pages * page;
        std::size_t const offset = input.Byte();
        std::size_t const at = input.Byte() % 2 == 0 ? begin + offset : begin + page - 1 - offset;
        bytes[at] = static_cast<char>(input.Byte());
    }
    std::string const path = PathOf("changed");
    for (const char* const suffix : {"", "-wal", "-shm", "-journal"})
        std::filesystem::remove(path + suffix);
    std::ofstream(path, std::ios::binary) << bytes;
    Try([&] {
        MemArchive salvaged;
        Salvage(path, salvaged, nullptr);
        Require(Verify(salvaged, nullptr).damaged.empty(), "what is salvaged is sound");
    });
    Try([&] {
        SqliteOptions options;
        options.workers = 1;
        SqliteArchive archive(path, options);
        UseAll(archive);
    });
    return 0;
}
