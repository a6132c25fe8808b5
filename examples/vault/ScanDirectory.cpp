#include "DirectoryPath.h"
#include "Problem.h"
#include "VaultFile.h"
#include "Workspace.h"

#include <algorithm>
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

/// What is known of a directory on the way from the top to where the scan is.
struct Level {
    std::vector<std::string> entries;
    std::size_t next = 0;
    Tree tree{};
    cow_ptr<Tree> previous;
};

class Scanner {
public:
    Scanner(std::filesystem::path const& directory, ScanOptions const& options, KivVcs::IRepository& repository,
            Progress& progress)
        : path_(directory.native()), options_(options), repository_(repository), progress_(progress) {
        const auto vaultDirectory = options.vaultFile.parent_path();
        hasVaultFile_ = stat(options.vaultFile.c_str(), &vaultFile_) == 0 &&
                        stat(vaultDirectory.empty() ? "." : vaultDirectory.c_str(), &vaultDirectory_) == 0;
    }

    cow_ptr<Tree> Scan() {
        Begin(options_.previous);
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
    void Begin(cow_ptr<Tree> previous) {
        levels_.push_back({.entries = path_.ReadNames(), .previous = std::move(previous)});
    }

    void Enter(std::string const& name, Text const& text) {
        path_.Enter(name);
        auto const& previous = levels_.back().previous;
        Begin(previous ? previous->GetLocalTree(text) : nullptr);
    }

    void Leave() {
        const auto finished = std::move(levels_.back());
        levels_.pop_back();
        path_.Leave();
        auto& level = levels_.back();
        level.tree.AddTree(&repository_, *FromUtf8(level.entries[level.next - 1]), finished.tree);
    }

    void Add(std::string const& name) {
        auto& level = levels_.back();
        struct stat status {};
        if (fstatat(path_.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
            ThrowSystemProblem("cannot read", path_.PathOf(name));
        const auto text = FromUtf8(name);
        if (!text)
            Skip(name, "its name is not UTF-8");
        else if (S_ISDIR(status.st_mode))
            Enter(name, *text);
        else if (IsVault(name, status))
            Skip(name, "it is the vault");
        else if (S_ISREG(status.st_mode))
            level.tree.AddBlob(&repository_, *text, Blob(ReadFile(name)));
        else
            Skip(name, S_ISLNK(status.st_mode) ? "it is a symbolic link" : "it is a special file");
    }

    Buffer ReadFile(std::string const& name) {
        // Not blocking matters only if the file has been exchanged for a pipe since its kind was looked at.
        const Descriptor file(openat(path_.Get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
        struct stat status {};
        if (!file.IsOpen() || fstat(file.Get(), &status) != 0)
            ThrowSystemProblem("cannot read", path_.PathOf(name));
        if (!S_ISREG(status.st_mode))
            throw Problem("changed while it was read: " + Printable(path_.PathOf(name)));
        const auto size = static_cast<std::uint64_t>(status.st_size);
        if (size > VaultFile::largestObject)
            throw Problem("larger than a vault can hold: " + Printable(path_.PathOf(name)));
        auto content = Buffer::Build(size, [&](std::byte* to) { ReadExactly(file, to, size, name); });
        progress_.Step(size);
        return content;
    }

    void ReadExactly(Descriptor const& file, std::byte* to, std::uint64_t size, std::string const& name) {
        for (std::uint64_t done = 0; done < size;) {
            const auto count = read(file.Get(), to + done, size - done);
            if (count < 0 && errno != EINTR)
                ThrowSystemProblem("cannot read", path_.PathOf(name));
            if (count == 0)
                throw Problem("changed while it was read: " + Printable(path_.PathOf(name)));
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
        if (AreSame(status, vaultFile_))
            return true;
        struct stat directory {};
        return name == options_.vaultFile.filename().native() + "-journal" && fstat(path_.Get(), &directory) == 0 &&
               AreSame(directory, vaultDirectory_);
    }

    static bool AreSame(struct stat const& left, struct stat const& right) noexcept {
        return left.st_dev == right.st_dev && left.st_ino == right.st_ino;
    }

    void Skip(std::string const& name, std::string const& reason) {
        progress_.Say("skipped " + Printable(path_.PathOf(name)) + ": " + reason);
    }

    DirectoryPath path_;
    ScanOptions const& options_;
    KivVcs::IRepository& repository_;
    Progress& progress_;
    std::vector<Level> levels_;
    struct stat vaultFile_ {};
    struct stat vaultDirectory_ {};
    bool hasVaultFile_ = false;
};

} // namespace

cow_ptr<Tree> ScanDirectory(std::filesystem::path const& directory, ScanOptions const& options,
                            KivVcs::IRepository& repository, Progress& progress) {
    return Scanner(directory, options, repository, progress).Scan();
}

} // namespace vault
