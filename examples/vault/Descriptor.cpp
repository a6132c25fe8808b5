#include "Descriptor.h"

#include "Problem.h"
#include "Text.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <system_error>

namespace vault {

namespace {

struct CloseListing {
    void operator()(DIR* listing) const noexcept { closedir(listing); }
};

} // namespace

void ThrowSystemProblem(std::string const& what, std::string const& path) {
    const auto reason = std::generic_category().message(errno);
    throw Problem(what + " " + Printable(path) + ": " + reason);
}

Descriptor OpenDirectory(int parent, char const* name, bool followLink) {
    return Descriptor(openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | (followLink ? 0 : O_NOFOLLOW)));
}

std::vector<std::string> ReadNames(Descriptor const& directory, std::string const& path) {
    // The listing closes its descriptor, so it gets one of its own.
    Descriptor own = OpenDirectory(directory.Get(), ".");
    const std::unique_ptr<DIR, CloseListing> listing(own.IsOpen() ? fdopendir(own.Get()) : nullptr);
    if (!listing)
        ThrowSystemProblem("cannot list", path);
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
        ThrowSystemProblem("cannot list", path);
    std::sort(names.begin(), names.end());
    return names;
}

} // namespace vault
