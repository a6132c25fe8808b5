#include "Descriptor.h"
#include "Problem.h"
#include "VaultFile.h"
#include "Workspace.h"

#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace vault {

using KivVcs::Blob;
using KivVcs::Buffer;
using KivVcs::cow_ptr;
using KivVcs::Tree;

namespace {

/// A directory on the way from the top to where the scan is.
struct Level {
    Descriptor directory;
    std::string name;
    std::vector<std::string> entries;
    std::size_t next = 0;
    Tree tree;
    cow_ptr<Tree> previous;
};

class Scanner {
public:
    Scanner(ScanOptions const& options, KivVcs::IRepository& repository, Progress& progress)
        : options_(options), repository_(repository), progress_(progress) {
        hasVaultFile_ = stat(options.vaultFile.c_str(), &vaultFile_) == 0;
    }

    cow_ptr<Tree> Scan(std::filesystem::path const& directory) {
        Enter(OpenDirectory(AT_FDCWD, directory.c_str(), true), directory.native(), options_.previous);
        // The levels are kept here and not in recursive calls, so that any depth is fine.
        for (;;) {
            auto& level = levels_.back();
            if (level.next < level.entries.size()) {
                Add(level.entries[level.next++]);
                continue;
            }
            if (options_.stamp)
                Stamp(level);
            if (levels_.size() == 1)
                return repository_.SyncWithStorage(KivVcs::immu::make<Tree>(level.tree));
            Leave();
        }
    }

private:
    void Enter(Descriptor directory, std::string const& name, cow_ptr<Tree> previous) {
        const auto path = PathOf(name);
        if (!directory.IsOpen())
            ThrowSystemProblem("cannot open directory", path);
        auto entries = ReadNames(directory, path);
        levels_.push_back({std::move(directory), name, std::move(entries), 0, Tree(), std::move(previous)});
    }

    void Leave() {
        const auto finished = std::move(levels_.back());
        levels_.pop_back();
        levels_.back().tree.AddTree(&repository_, *FromUtf8(finished.name), finished.tree);
    }

    void Add(std::string const& name) {
        auto& level = levels_.back();
        struct stat status {};
        if (fstatat(level.directory.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
            ThrowSystemProblem("cannot read", PathOf(name));
        const auto text = FromUtf8(name);
        if (!text)
            Skip(name, "its name is not UTF-8");
        else if (S_ISDIR(status.st_mode))
            Enter(OpenDirectory(level.directory.Get(), name.c_str()), name,
                  level.previous ? level.previous->GetLocalTree(*text) : nullptr);
        else if (IsVault(name, status))
            Skip(name, "it is the vault");
        else if (S_ISREG(status.st_mode))
            level.tree.AddBlob(&repository_, *text, Blob(ReadFile(name)));
        else
            Skip(name, S_ISLNK(status.st_mode) ? "it is a symbolic link" : "it is a special file");
    }

    Buffer ReadFile(std::string const& name) {
        // Not blocking matters only if the file has been exchanged for a pipe since its kind was looked at.
        const Descriptor file(
            openat(levels_.back().directory.Get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
        struct stat status {};
        if (!file.IsOpen() || fstat(file.Get(), &status) != 0)
            ThrowSystemProblem("cannot read", PathOf(name));
        if (!S_ISREG(status.st_mode))
            throw Problem("changed while it was read: " + Printable(PathOf(name)));
        const auto size = static_cast<std::uint64_t>(status.st_size);
        if (size > VaultFile::largestObject)
            throw Problem("larger than a vault can hold: " + Printable(PathOf(name)));
        auto content = Buffer::Build(size, [&](std::byte* to) { ReadExactly(file, to, size, name); });
        progress_.Step(size);
        return content;
    }

    void ReadExactly(Descriptor const& file, std::byte* to, std::uint64_t size, std::string const& name) {
        for (std::uint64_t done = 0; done < size;) {
            const auto count = read(file.Get(), to + done, size - done);
            if (count < 0 && errno != EINTR)
                ThrowSystemProblem("cannot read", PathOf(name));
            if (count == 0)
                throw Problem("changed while it was read: " + Printable(PathOf(name)));
            done += static_cast<std::uint64_t>(std::max<ssize_t>(count, 0));
        }
    }

    /// Stamps a directory whose content, stamps aside, is not that of the last version; otherwise takes its stamp over.
    void Stamp(Level& level) {
        level.tree.RemoveObject(&repository_, stampName);
        if (level.previous) {
            Tree before = *level.previous;
            before.RemoveObject(&repository_, stampName);
            if (before == level.tree) {
                level.tree = *level.previous;
                return;
            }
        }
        const auto seconds = std::to_string(options_.stamp->ToTimeT(KivVcs::TimeZone::Utc));
        Buffer content;
        content.Append(seconds.data(), seconds.size());
        level.tree.AddBlob(&repository_, stampName, Blob(std::move(content)));
    }

    [[nodiscard]] bool IsVault(std::string const& name, struct stat const& status) const {
        if (!hasVaultFile_)
            return false;
        return (status.st_dev == vaultFile_.st_dev && status.st_ino == vaultFile_.st_ino) ||
               name == options_.vaultFile.filename().native() + "-journal";
    }

    void Skip(std::string const& name, std::string const& reason) {
        progress_.Say("skipped " + Printable(PathOf(name)) + ": " + reason);
    }

    [[nodiscard]] std::string PathOf(std::string const& name) const {
        std::string path;
        for (auto const& level : levels_)
            path += level.name + '/';
        return path + name;
    }

    ScanOptions const& options_;
    KivVcs::IRepository& repository_;
    Progress& progress_;
    std::vector<Level> levels_;
    struct stat vaultFile_ {};
    bool hasVaultFile_ = false;
};

} // namespace

cow_ptr<Tree> ScanDirectory(std::filesystem::path const& directory, ScanOptions const& options,
                            KivVcs::IRepository& repository, Progress& progress) {
    return Scanner(options, repository, progress).Scan(directory);
}

} // namespace vault
