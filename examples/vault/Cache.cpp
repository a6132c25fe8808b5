#include "Cache.h"

#include "Descriptor.h"
#include "Problem.h"
#include "Trees.h"

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>

namespace vault {

namespace {

namespace fs = std::filesystem;

constexpr std::size_t largestNote = 4096;

/// The vault's directory where @p variable says, or otherwise at @p usual in the user's home.
std::optional<std::string> UserDirectory(char const* variable, char const* usual) {
    // Nobody changes the environment.
    char const* const given = std::getenv(variable); // NOLINT(concurrency-mt-unsafe)
    char const* const home = std::getenv("HOME");    // NOLINT(concurrency-mt-unsafe)
    if (given == nullptr && home == nullptr)
        return std::nullopt;
    const fs::path directory = (given != nullptr ? fs::path(given) : fs::path(home) / usual) / "vault";
    std::error_code failure;
    if (fs::create_directories(directory, failure))
        fs::permissions(directory, fs::perms::owner_all, failure);
    return failure ? std::nullopt : std::optional(directory.string() + '/');
}

std::optional<std::string> NoteFile(std::string const& subject) {
    const auto directory = UserDirectory("XDG_STATE_HOME", ".local/state");
    return directory ? std::optional(*directory + CacheName(subject)) : std::nullopt;
}

} // namespace

std::optional<std::string> CacheDirectory() {
    return UserDirectory("XDG_CACHE_HOME", ".cache");
}

std::string CacheName(std::string const& subject) {
    const auto id = KivArchive::Identify(KivArchive::ObjectType::Blob, std::as_bytes(std::span(subject)));
    return DigitsOf(id).substr(0, 32);
}

std::optional<std::string> ReadNote(std::string const& subject) {
    const auto path = NoteFile(subject);
    const Descriptor file(path ? open(path->c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC) : -1);
    std::string note(largestNote, '\0');
    const auto size = file.IsOpen() ? ReadUpTo(file.Get(), std::as_writable_bytes(std::span(note))) : std::nullopt;
    return size ? std::optional(note.substr(0, *size)) : std::nullopt;
}

void WriteNote(std::string const& subject, std::string const& note) {
    const auto path = NoteFile(subject);
    if (note.size() > largestNote)
        throw Problem("this is too long to be noted");
    if (!path)
        throw Problem("there is no place for notes of yours: neither HOME nor XDG_STATE_HOME is set");
    // Whoever reads it meanwhile finds the one before.
    const auto temporary = *path + '-' + std::to_string(getpid());
    Descriptor file(open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!file.IsOpen() || !WriteAll(file.Get(), std::as_bytes(std::span(note))) || !file.Close() ||
        rename(temporary.c_str(), path->c_str()) != 0)
        ThrowSystemProblem("cannot write", *path);
}

} // namespace vault
