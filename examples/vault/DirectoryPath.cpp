#include "DirectoryPath.h"

#include "Problem.h"
#include "Text.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>

namespace vault {

namespace {

struct CloseListing {
    void operator()(DIR* listing) const noexcept { closedir(listing); }
};

Descriptor OpenDirectory(int parent, char const* name, int flags) {
    return Descriptor(openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | flags));
}

} // namespace

DirectoryPath::DirectoryPath(std::string const& top) : innermost_(OpenDirectory(AT_FDCWD, top.c_str(), 0)) {
    Arrive(top);
}

void DirectoryPath::Enter(std::string const& name) {
    innermost_ = OpenDirectory(innermost_.Get(), name.c_str(), O_NOFOLLOW);
    Arrive(name);
}

void DirectoryPath::Arrive(std::string const& name) {
    struct stat status {};
    if (!innermost_.IsOpen() || fstat(innermost_.Get(), &status) != 0)
        ThrowSystemProblem("cannot open directory", PathOf(name));
    levels_.push_back({name, status.st_dev, status.st_ino});
}

void DirectoryPath::Leave() {
    levels_.pop_back();
    innermost_ = OpenDirectory(innermost_.Get(), "..", O_NOFOLLOW);
    if (!IsAt(levels_.back()))
        throw Problem("moved while it was worked on: " + Printable(PathOf("")));
}

bool DirectoryPath::IsAt(Level const& level) const {
    struct stat status {};
    return innermost_.IsOpen() && fstat(innermost_.Get(), &status) == 0 && status.st_dev == level.device &&
           status.st_ino == level.inode;
}

std::vector<std::string> DirectoryPath::ReadNames() const {
    // The listing closes its descriptor, so it gets one of its own.
    Descriptor own = OpenDirectory(innermost_.Get(), ".", 0);
    const std::unique_ptr<DIR, CloseListing> listing(own.IsOpen() ? fdopendir(own.Get()) : nullptr);
    if (!listing)
        ThrowSystemProblem("cannot list", PathOf(""));
    own.Release();
    std::vector<std::string> names;
    errno = 0;
    // NOLINTNEXTLINE(concurrency-mt-unsafe): unsafe only for threads that share one listing
    while (dirent const* const entry = readdir(listing.get())) {
        const std::string name(entry->d_name);
        if (name != "." && name != "..")
            names.push_back(name);
    }
    if (errno != 0)
        ThrowSystemProblem("cannot list", PathOf(""));
    std::sort(names.begin(), names.end());
    return names;
}

std::string DirectoryPath::PathOf(std::string_view name) const {
    std::string path;
    for (auto const& level : levels_)
        path += level.name + '/';
    return path += name;
}

} // namespace vault
