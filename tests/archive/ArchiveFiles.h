#pragma once

#include "KivArchive/ArchiveConformance.h"
#include "KivArchive/SqliteArchive.h"
#include "KivArchive/Upkeep.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <stdlib.h>
#include <string>

/// Helpers for the tests of archives in files.
namespace KivArchive {

/// A directory for the files of one test; in memory where the system has such a place, since no test depends on the
/// disk.
class TemporaryDirectory {
public:
    TemporaryDirectory() {
        namespace fs = std::filesystem;
        fs::path const inMemory = "/dev/shm";
        fs::path const place = fs::is_directory(inMemory) ? inMemory : fs::temp_directory_path();
        std::string name = (place / "archive_test_XXXXXX").string();
        if (mkdtemp(name.data()) == nullptr)
            throw std::runtime_error("no temporary directory");
        path_ = name;
    }
    TemporaryDirectory(TemporaryDirectory const&) = delete;
    TemporaryDirectory& operator=(TemporaryDirectory const&) = delete;
    ~TemporaryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    [[nodiscard]] std::string Path(std::string const& name) const { return (path_ / name).string(); }

private:
    std::filesystem::path path_;
};

inline std::string ReadFile(std::string const& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

inline void WriteFile(std::string const& path, std::string const& bytes) {
    // A log of an earlier file with that name must not be taken for this one's.
    for (const char* const suffix : {"", "-wal", "-shm", "-journal"})
        std::filesystem::remove(path + suffix);
    std::ofstream(path, std::ios::binary).write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
}

/// Describes what `Verify` finds wrong; empty for nothing.
inline std::string ProblemsOf(IArchive& archive) {
    VerifyReport const report = Verify(archive, nullptr);
    if (report.IsSound())
        return {};
    return std::to_string(report.damaged.size()) + " damaged, " + std::to_string(report.missing.size()) + " missing, " +
           std::to_string(report.branches.size()) + " branches, " + std::to_string(report.ancestry.size()) +
           " ancestries";
}

inline Id HeadOf(IArchive& archive) {
    auto const branches = archive.ReadBranches();
    return branches.empty() ? Id() : branches.front().head;
}

/// Publishes versions on "master". Each edits a text and a directory; every fourth adds a large content.
class SmallHost {
public:
    /// Continues from the archive's head. @param seed the edits depend on it
    SmallHost(IArchive& archive, std::uint32_t seed)
        : archive_(archive), seed_(seed), head_(HeadOf(archive)), text_(Conformance::SomeText(seed, 30000)) {}

    [[nodiscard]] Id const& Head() const noexcept { return head_; }

    bool Publish() {
        ++number_;
        std::string const version = std::to_string(seed_) + "/" + std::to_string(number_);
        text_.insert(text_.size() * (number_ % 7) / 8, "edit " + version + "\n");
        NewObject const text = Conformance::Object(ObjectType::Blob, text_, textId_);
        NewObject const small = Conformance::Object(ObjectType::Blob, version);
        std::vector<std::pair<std::string, Id>> files{{"small", small.id}, {"text", text.id}};
        if (number_ % 4 == 0) {
            std::string const content = Conformance::SomeNoise(number_ / 8, 1100000) + version;
            Buffer bytes = Conformance::BufferOf(content);
            Id const id = Identify(ObjectType::Blob, bytes);
            StreamIO stream(KivVcs::MemStream::CreateOnRef(bytes));
            archive_.StoreContent(id, stream, contentId_, nullptr);
            contentId_ = id;
            files.insert(files.begin(), {"content", id});
        }
        NewObject const tree = Conformance::Object(ObjectType::Tree, Conformance::TreeOf(files), treeId_);
        Conformance::NewCommit const commit = Conformance::Commit(tree.id, head_, version);
        Change change;
        change.objects = {text, small, tree, commit.object};
        if (number_ % 4 == 0)
            change.relied.push_back(contentId_);
        change.ancestry = {commit.facts};
        change.branches = {{u"master", head_, commit.object.id}};
        if (!archive_.Apply(change).applied)
            return false;
        textId_ = text.id;
        treeId_ = tree.id;
        head_ = commit.object.id;
        return true;
    }

private:
    IArchive& archive_;
    std::uint32_t seed_;
    std::uint32_t number_ = 0;
    Id head_;
    Id textId_;
    Id treeId_;
    Id contentId_;
    std::string text_;
};

/// A number from the environment, for trials that can be made longer.
inline int CountFromEnvironment(const char* name, int otherwise) {
    const char* const value = std::getenv(name);
    return value == nullptr ? otherwise : std::atoi(value);
}

} // namespace KivArchive
