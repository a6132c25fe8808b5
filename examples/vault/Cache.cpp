#include "Cache.h"

#include "Trees.h"

#include <cstdlib>
#include <filesystem>

namespace vault {

std::optional<std::string> CacheDirectory() {
    namespace fs = std::filesystem;
    // Nobody changes the environment.
    char const* const caches = std::getenv("XDG_CACHE_HOME"); // NOLINT(concurrency-mt-unsafe)
    char const* const home = std::getenv("HOME");             // NOLINT(concurrency-mt-unsafe)
    if (caches == nullptr && home == nullptr)
        return std::nullopt;
    const fs::path directory = (caches != nullptr ? fs::path(caches) : fs::path(home) / ".cache") / "vault";
    std::error_code failure;
    if (fs::create_directories(directory, failure))
        fs::permissions(directory, fs::perms::owner_all, failure);
    return failure ? std::nullopt : std::optional(directory.string() + '/');
}

std::string CacheName(std::string const& subject) {
    const auto id = KivArchive::Identify(KivArchive::ObjectType::Blob, std::as_bytes(std::span(subject)));
    return DigitsOf(id).substr(0, 32);
}

} // namespace vault
