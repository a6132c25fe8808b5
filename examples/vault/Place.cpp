#include "Place.h"

#include "Problem.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <sys/stat.h>
#include <vector>

namespace vault {

/// Removes a directory with all that is in it, or anything else, without following links. @return success
bool RemoveAll(int parent, std::string const& name) {
    if (unlinkat(parent, name.c_str(), 0) == 0 || errno == ENOENT)
        return true;
    // The directories on the way are kept here, so that any depth is fine.
    struct Level {
        std::string name;
        Descriptor directory;
        std::vector<std::string> names;
    };
    std::vector<Level> levels;
    const auto enter = [&levels](int above, std::string const& entered) {
        Level level{entered, OpenDirectory(above, entered.c_str()), {}};
        if (!level.directory.IsOpen() || !ReadNames(level.directory, level.names))
            return false;
        levels.push_back(std::move(level));
        return true;
    };
    if (!enter(parent, name))
        return false;
    while (!levels.empty()) {
        auto& level = levels.back();
        if (level.names.empty()) {
            const auto finished = level.name;
            levels.pop_back();
            if (unlinkat(levels.empty() ? parent : levels.back().directory.Get(), finished.c_str(), AT_REMOVEDIR) != 0)
                return false;
            continue;
        }
        const auto next = level.names.back();
        level.names.pop_back();
        const int directory = level.directory.Get();
        if (unlinkat(directory, next.c_str(), 0) != 0 && errno != ENOENT && !enter(directory, next))
            return false;
    }
    return true;
}

Place FindPlace(std::string path) {
    while (path.size() > 1 && path.ends_with('/'))
        path.pop_back();
    const auto slash = path.find_last_of('/');
    const auto parent = slash == std::string::npos ? "." : path.substr(0, slash + 1);
    // As `mkdir -p` does.
    for (auto end = parent.find('/', 1); end != std::string::npos; end = parent.find('/', end + 1))
        mkdir(parent.substr(0, end).c_str(), S_IRWXU | S_IRWXG | S_IRWXO);
    Place place{Descriptor(open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)),
                slash == std::string::npos ? path : path.substr(slash + 1)};
    if (!place.parent.IsOpen())
        ThrowSystemProblem("cannot open directory", parent);
    return place;
}

Sibling::Sibling(Place const& place) : place_(place) {
    for (int attempt = 0;; ++attempt) {
        name_ = "." + place.name.substr(0, 200) + std::string(temporaryPrefix) + std::to_string(getpid()) + '-' +
                std::to_string(attempt);
        if (mkdirat(place.parent.Get(), name_.c_str(), S_IRWXU) == 0)
            break;
        if (errno != EEXIST || attempt > 1000)
            ThrowSystemProblem("cannot write beside", place.name);
    }
    directory_ = OpenDirectory(place.parent.Get(), name_.c_str());
}

Sibling::~Sibling() {
    if (!name_.empty())
        static_cast<void>(RemoveAll(place_.parent.Get(), name_));
}

void Sibling::Rename(std::string const& inner) {
    const int from = inner.empty() ? place_.parent.Get() : directory_.Get();
    auto const& name = inner.empty() ? name_ : inner;
    if (renameat(from, name.c_str(), place_.parent.Get(), place_.name.c_str()) != 0)
        ThrowSystemProblem("cannot put the restored files at", place_.name);
    fsync(place_.parent.Get());
    if (inner.empty())
        name_.clear();
}

} // namespace vault
