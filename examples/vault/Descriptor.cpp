#include "Descriptor.h"

#include "Names.h"
#include "Problem.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <system_error>

namespace vault {

namespace {

constexpr std::size_t mostOpened = 32;

struct CloseListing {
    void operator()(DIR* listing) const noexcept { closedir(listing); }
};

} // namespace

void ThrowSystemProblem(std::string const& what, std::string const& path) {
    const auto reason = std::generic_category().message(errno);
    throw Problem(what + " " + PrintableName(StoredName(path)) + ": " + reason);
}

std::string RealPath(std::string const& path) {
    const std::unique_ptr<char, decltype(&free)> real(realpath(path.c_str(), nullptr), &free);
    return real ? real.get() : path;
}

Descriptor OpenDirectory(int parent, char const* name, int moreFlags) noexcept {
    return Descriptor(openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW | moreFlags));
}

bool ForEachName(Descriptor const& directory, std::function<void(char const*)> const& receiver) {
    // The listing closes its descriptor, so it gets one of its own.
    Descriptor own = OpenDirectory(directory.Get(), ".");
    const std::unique_ptr<DIR, CloseListing> listing(own.IsOpen() ? fdopendir(own.Get()) : nullptr);
    if (!listing)
        return false;
    own.Release();
    for (;;) {
        errno = 0;
        // NOLINTNEXTLINE(concurrency-mt-unsafe): unsafe only for threads that share one listing
        dirent const* const entry = readdir(listing.get());
        if (entry == nullptr)
            return errno == 0;
        const std::string_view name(entry->d_name);
        if (name != "." && name != "..")
            receiver(entry->d_name);
    }
}

bool ReadNames(Descriptor const& directory, std::vector<std::string>& names) {
    return ForEachName(directory, [&names](char const* name) { names.emplace_back(name); });
}

std::optional<std::uint64_t> ReadUpTo(int file, std::span<std::byte> to) noexcept {
    std::size_t done = 0;
    while (done < to.size()) {
        const auto count = read(file, to.data() + done, to.size() - done);
        if (count < 0 && errno != EINTR)
            return std::nullopt;
        if (count == 0)
            break;
        done += static_cast<std::size_t>(std::max<ssize_t>(count, 0));
    }
    return done;
}

bool WriteAll(int file, std::span<const std::byte> bytes) noexcept {
    while (!bytes.empty()) {
        const auto count = write(file, bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR)
            return false;
        bytes = bytes.subspan(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    }
    return true;
}

DirectoryOpener::DirectoryOpener(std::string const& top) : top_(open(top.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {
    if (!top_.IsOpen())
        ThrowSystemProblem("cannot open directory", top);
}

int DirectoryOpener::Open(std::string_view path) {
    if (path.empty())
        return top_.Get();
    auto nearest = opened_.end();
    for (auto at = opened_.begin(); at != opened_.end(); ++at) {
        if (path.starts_with(at->path) && (nearest == opened_.end() || at->path.size() > nearest->path.size()))
            nearest = at;
    }
    std::size_t done = 0;
    if (nearest != opened_.end()) {
        opened_.splice(opened_.begin(), opened_, nearest);
        done = nearest->path.size();
    }
    while (done < path.size()) {
        const auto end = path.find('/', done);
        const std::string name(path.substr(done, end - done));
        auto directory = OpenDirectory(done == 0 ? top_.Get() : opened_.front().directory.Get(), name.c_str());
        if (!directory.IsOpen())
            return -1;
        done = end + 1;
        opened_.push_front({std::string(path.substr(0, done)), std::move(directory)});
        if (opened_.size() > mostOpened)
            opened_.pop_back();
    }
    return opened_.front().directory.Get();
}

} // namespace vault
