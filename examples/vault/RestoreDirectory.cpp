#include "Descriptor.h"
#include "Problem.h"
#include "Workspace.h"

#include <cerrno>
#include <fcntl.h>
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

/// A directory on the way from the top to where the restoring is.
struct Level {
    Descriptor directory;
    std::string path;
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

void WriteAll(Descriptor const& file, std::span<const std::byte> bytes, std::string const& path) {
    while (!bytes.empty()) {
        const auto count = write(file.Get(), bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR)
            ThrowSystemProblem("cannot write", path);
        bytes = bytes.subspan(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    }
}

void WriteFile(Level const& level, TextView entry, Blob const& blob) {
    const auto name = SafeName(entry);
    const auto path = level.path + name;
    // Never written through: what is there may be a link, or the same file as one elsewhere.
    if (unlinkat(level.directory.Get(), name.c_str(), 0) != 0 && errno != ENOENT)
        ThrowSystemProblem("cannot replace", path);
    Descriptor file(
        openat(level.directory.Get(), name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, fileMode));
    if (!file.IsOpen())
        ThrowSystemProblem("cannot write", path);
    for (auto const& chunk : blob.GetData().LockForRead())
        WriteAll(file, chunk, path);
    if (!file.Close())
        ThrowSystemProblem("cannot write", path);
}

Descriptor EnterSubdirectory(Level const& level, std::string const& name) {
    const int parent = level.directory.Get();
    if (mkdirat(parent, name.c_str(), directoryMode) != 0 && errno == EEXIST) {
        if (auto existing = OpenDirectory(parent, name.c_str()); existing.IsOpen())
            return existing;
        // A file or a link is in the way.
        if (unlinkat(parent, name.c_str(), 0) != 0 || mkdirat(parent, name.c_str(), directoryMode) != 0)
            ThrowSystemProblem("cannot make directory", level.path + name);
    }
    auto made = OpenDirectory(parent, name.c_str());
    if (!made.IsOpen())
        ThrowSystemProblem("cannot make directory", level.path + name);
    return made;
}

Level WriteLevel(Descriptor directory, std::string path, cow_ptr<Tree> tree, Progress& progress) {
    Level level{std::move(directory), std::move(path), tree, tree->GetLocalSubtreePaths(), 0};
    for (auto const& name : tree->GetLocalBlobPaths()) {
        const auto blob = tree->GetLocalBlob(name);
        WriteFile(level, name, *blob);
        progress.Step(blob->GetData().GetSize());
    }
    return level;
}

} // namespace

void RestoreDirectory(cow_ptr<Tree> const& tree, std::filesystem::path const& directory, bool force,
                      Progress& progress) {
    std::error_code error;
    std::filesystem::create_directories(directory, error);
    auto top = OpenDirectory(AT_FDCWD, directory.c_str(), true);
    if (!top.IsOpen())
        ThrowSystemProblem("cannot open directory", directory.native());
    if (!force && !ReadNames(top, directory.native()).empty())
        throw Problem(Printable(directory.native()) + " is not empty (--force writes into it all the same)");
    if (!tree)
        return;

    std::vector<Level> levels;
    levels.push_back(WriteLevel(std::move(top), directory.native() + '/', tree, progress));
    while (!levels.empty()) {
        auto& level = levels.back();
        if (level.next == level.subtrees.size()) {
            levels.pop_back();
            continue;
        }
        auto const& entry = level.subtrees[level.next++];
        const auto name = SafeName(entry);
        levels.push_back(WriteLevel(EnterSubdirectory(level, name), level.path + name + '/',
                                    level.tree->GetLocalTree(entry), progress));
    }
}

} // namespace vault
