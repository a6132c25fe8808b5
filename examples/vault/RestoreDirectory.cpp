#include "DirectoryPath.h"
#include "Problem.h"
#include "Workspace.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <span>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace vault {

using KivVcs::Blob;
using KivVcs::cow_ptr;
using KivVcs::Tree;

namespace {

constexpr mode_t fileMode = 0666;
constexpr mode_t directoryMode = 0777;

/// What is known of a directory on the way from the top to where the restoring is.
struct Level {
    cow_ptr<Tree> tree;
    KivVcs::PathList subtrees;
    std::size_t next = 0;
};

/// An entry's name, if it is one that stays in its directory. Vaults come from other people.
std::string SafeName(TextView entry) {
    auto name = ToUtf8(entry);
    if (name.empty() || name == "." || name == ".." || name.find_first_of(std::string("/\0", 2)) != std::string::npos)
        throw Problem("this name cannot be restored: " + Printable(name));
    return name;
}

bool WriteAll(Descriptor const& file, std::span<const std::byte> bytes) {
    while (!bytes.empty()) {
        const auto count = write(file.Get(), bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR)
            return false;
        bytes = bytes.subspan(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    }
    return true;
}

void WriteFile(DirectoryPath const& directory, TextView entry, Blob const& blob) {
    const auto name = SafeName(entry);
    // Never written through: what is there may be a link, or the same file as one elsewhere.
    if (unlinkat(directory.Get(), name.c_str(), 0) != 0 && errno != ENOENT)
        ThrowSystemProblem("cannot replace", directory.PathOf(name));
    Descriptor file(
        openat(directory.Get(), name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, fileMode));
    bool isWritten = file.IsOpen();
    for (auto const& chunk : blob.GetData().LockForRead())
        isWritten = isWritten && WriteAll(file, chunk);
    if (!isWritten || !file.Close())
        ThrowSystemProblem("cannot write", directory.PathOf(name));
}

void MakeDirectory(DirectoryPath const& directory, std::string const& name) {
    if (mkdirat(directory.Get(), name.c_str(), directoryMode) == 0)
        return;
    struct stat status {};
    const bool isThere = errno == EEXIST && fstatat(directory.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
    if (isThere && S_ISDIR(status.st_mode))
        return;
    // A file or a link is in the way.
    if (!isThere || unlinkat(directory.Get(), name.c_str(), 0) != 0 ||
        mkdirat(directory.Get(), name.c_str(), directoryMode) != 0)
        ThrowSystemProblem("cannot make directory", directory.PathOf(name));
}

Level WriteLevel(DirectoryPath const& directory, cow_ptr<Tree> const& tree, Progress& progress) {
    for (auto const& name : tree->GetLocalBlobPaths()) {
        const auto blob = tree->GetLocalBlob(name);
        WriteFile(directory, name, *blob);
        progress.Step(blob->GetData().GetSize());
    }
    return {tree, tree->GetLocalSubtreePaths()};
}

} // namespace

void RestoreDirectory(cow_ptr<Tree> const& tree, std::filesystem::path const& top, bool force, Progress& progress) {
    std::error_code error;
    std::filesystem::create_directories(top, error);
    if (error)
        throw Problem("cannot make directory " + Printable(top.native()) + ": " + error.message());
    DirectoryPath directory(top.native());
    if (!force && !directory.ReadNames().empty())
        throw Problem(Printable(top.native()) + " is not empty (--force writes into it all the same)");
    if (!tree)
        return;

    std::vector<Level> levels;
    levels.push_back(WriteLevel(directory, tree, progress));
    for (;;) {
        auto& level = levels.back();
        if (level.next < level.subtrees.size()) {
            auto const& entry = level.subtrees[level.next++];
            const auto name = SafeName(entry);
            MakeDirectory(directory, name);
            directory.Enter(name);
            levels.push_back(WriteLevel(directory, level.tree->GetLocalTree(entry), progress));
            continue;
        }
        levels.pop_back();
        if (levels.empty())
            return;
        directory.Leave();
    }
}

} // namespace vault
