#include "Restore.h"

#include "Descriptor.h"
#include "Names.h"
#include "Parallel.h"
#include "Place.h"
#include "Problem.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <sys/stat.h>
#include <system_error>
#include <unordered_set>

namespace vault {

using KivArchive::ArchivedObject;

namespace {

constexpr std::size_t directoriesAtOnce = 256;
constexpr std::size_t filesAtOnce = 1000;
constexpr std::uint64_t pieceSize = std::uint64_t{4} * 1024 * 1024;
constexpr mode_t ordinaryBits = 0777;

struct PendingDirectory {
    /// Of file names; ends with "/" unless it is empty.
    std::string path;
    Id tree;
};

struct PendingFile {
    std::size_t directory = 0;
    std::string name;
    Entry const* entry = nullptr;
};

/// What a directory gets when everything is in it.
struct LateAttributes {
    std::string path;
    std::optional<Attributes> attributes;
};

mode_t OrdinaryDirectoryMode() noexcept {
    const mode_t mask = umask(0);
    umask(mask);
    return ordinaryBits & ~mask;
}

std::array<timespec, 2> TimesOf(Attributes const& attributes) noexcept {
    constexpr std::int64_t second = 1'000'000'000;
    const auto nanoseconds = ((attributes.time % second) + second) % second;
    timespec modified{};
    modified.tv_sec = static_cast<time_t>((attributes.time - nanoseconds) / second);
    modified.tv_nsec = static_cast<decltype(modified.tv_nsec)>(nanoseconds);
    timespec accessed{};
    accessed.tv_nsec = UTIME_OMIT;
    return {accessed, modified};
}

std::string Shown(std::string const& filePath) {
    return PrintableName(StoredName(filePath));
}

/// Writes into one directory, which is there.
class Writer {
public:
    Writer(IArchive& archive, int top, RestoreOptions const& options, bool isFresh, Progress& progress)
        : archive_(archive), reader_(archive), top_(OpenDirectory(top, ".")), options_(options), isFresh_(isFresh),
          progress_(progress) {}

    std::vector<std::string> WriteTree(Id const& tree) {
        std::vector<PendingDirectory> rest{{"", tree}};
        while (!rest.empty()) {
            const auto count = std::min(rest.size(), directoriesAtOnce);
            std::vector<PendingDirectory> directories(
                std::make_move_iterator(rest.end() - static_cast<std::ptrdiff_t>(count)),
                std::make_move_iterator(rest.end()));
            rest.resize(rest.size() - count);
            // Kept in the order of their paths, in which contents lie beside each other.
            std::reverse(directories.begin(), directories.end());
            WriteDirectories(directories, rest);
        }
        // The innermost ones first: what is written into a directory changes its time.
        std::reverse(late_.begin(), late_.end());
        for (auto const& [path, attributes] : late_) {
            const int directory = top_.Open(path);
            if (directory < 0 ||
                !(attributes ? SetAttributes(directory, *attributes) : fchmod(directory, OrdinaryDirectoryMode()) == 0))
                Fail(path, "cannot set its attributes");
        }
        std::sort(problems_.begin(), problems_.end());
        return std::move(problems_);
    }

    std::vector<std::string> WriteOne(Entry const& entry, std::string const& name) {
        const std::vector<PendingDirectory> top{{"", {}}};
        const PendingFile file{0, name, &entry};
        WriteFiles(top, std::span(&file, 1));
        return std::move(problems_);
    }

private:
    void WriteDirectories(std::vector<PendingDirectory> const& directories, std::vector<PendingDirectory>& rest) {
        std::vector<Id> trees;
        trees.reserve(directories.size());
        for (auto const& pending : directories)
            trees.push_back(pending.tree);
        const auto read = reader_.Read(trees);
        std::vector<PendingFile> files;
        std::vector<PendingDirectory> below;
        for (std::size_t at = 0; at < directories.size(); ++at) {
            auto const& pending = directories[at];
            const auto found = read.find(pending.tree);
            if (found == read.end()) {
                Fail(pending.path, "the directory is damaged or missing");
                continue;
            }
            auto const& directory = found->second;
            PrepareDirectory(pending, directory);
            for (auto const& entry : directory.entries)
                Prepare(pending, at, entry, files, below);
            if (directory.own || isFresh_)
                late_.push_back({pending.path, directory.own});
        }
        rest.insert(rest.end(), std::make_move_iterator(below.rbegin()), std::make_move_iterator(below.rend()));
        const std::size_t pieces = (files.size() + filesAtOnce - 1) / filesAtOnce;
        std::atomic<std::size_t> next = 0;
        InParallel(
            [&] {
                for (auto piece = next++; piece < pieces; piece = next++)
                    WriteFiles(directories, std::span(files)
                                                .subspan(piece * filesAtOnce)
                                                .first(std::min(filesAtOnce, files.size() - piece * filesAtOnce)));
            },
            static_cast<unsigned>(std::min<std::size_t>(pieces, WorkerCount())));
    }

    /// Makes room for what the version has, and with `removesOthers` for nothing else.
    void PrepareDirectory(PendingDirectory const& pending, Directory const& directory) {
        if (isFresh_)
            return;
        const Descriptor opened = OpenDirectory(top_.Open(pending.path), ".");
        std::vector<std::string> names;
        // A mode that was restored before may be in the way.
        if (opened.IsOpen())
            fchmod(opened.Get(), S_IRWXU);
        if (!opened.IsOpen() || !ReadNames(opened, names)) {
            Fail(pending.path, std::generic_category().message(errno));
            return;
        }
        for (auto const& name : names) {
            if (directory.Find(StoredName(name)) == nullptr &&
                (options_.removesOthers || name.starts_with(temporaryPrefix)) && !RemoveAll(opened.Get(), name))
                Fail(pending.path + name, "cannot be removed: " + std::generic_category().message(errno));
        }
    }

    void Prepare(PendingDirectory const& pending, std::size_t at, Entry const& entry, std::vector<PendingFile>& files,
                 std::vector<PendingDirectory>& below) {
        const auto name = FileName(entry.name);
        if (!name) {
            Fail(pending.path, "this name cannot be restored: " + PrintableName(entry.name));
            return;
        }
        if (!entry.isDirectory)
            files.push_back({at, *name, &entry});
        else if (MakeDirectory(pending.path, *name))
            below.push_back({pending.path + *name + '/', entry.id});
    }

    bool MakeDirectory(std::string const& path, std::string const& name) {
        const int parent = top_.Open(path);
        if (parent >= 0 && mkdirat(parent, name.c_str(), S_IRWXU) == 0)
            return true;
        struct stat status {};
        const bool isThere = parent >= 0 && errno == EEXIST && !isFresh_ &&
                             fstatat(parent, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
        if (isThere && S_ISDIR(status.st_mode))
            return true;
        // A file or a link is in the way.
        if (isThere && unlinkat(parent, name.c_str(), 0) == 0 && mkdirat(parent, name.c_str(), S_IRWXU) == 0)
            return true;
        FailBySystem(path + name);
        return false;
    }

    /// Reads these files' contents by one call and writes them where they belong. Runs on several threads.
    void WriteFiles(std::vector<PendingDirectory> const& directories, std::span<PendingFile const> files) {
        DirectoryOpener opener(OpenDirectory(top_.Top(), "."));
        std::unordered_multimap<Id, PendingFile const*> wanted;
        std::vector<Id> ids;
        for (auto const& file : files) {
            if (!wanted.contains(file.entry->id))
                ids.push_back(file.entry->id);
            wanted.emplace(file.entry->id, &file);
        }
        archive_.Read(ids, [&](ArchivedObject const& object) {
            auto [file, end] = wanted.equal_range(object.id);
            for (; file != end; ++file) {
                auto const& pending = *file->second;
                auto const& path = directories[pending.directory].path;
                if (object.type == KivArchive::ObjectType::Blob)
                    WriteFile(opener, path, pending, object);
                else
                    Fail(path + pending.name, "is no content");
                const std::scoped_lock lock(mutex_);
                progress_.Step(object.size);
            }
            wanted.erase(object.id);
        });
        for (auto const& [id, file] : wanted)
            Fail(directories[file->directory].path + file->name, "its content is damaged or missing");
    }

    void WriteFile(DirectoryOpener& opener, std::string const& path, PendingFile const& file,
                   ArchivedObject const& object) {
        const int directory = opener.Open(path);
        const auto temporary = isFresh_ ? file.name : TemporaryName();
        bool isWritten = false;
        try {
            isWritten = directory >= 0 && (file.entry->Kind() == EntryKind::Link
                                               ? WriteLink(directory, temporary, object)
                                               : WriteContent(directory, temporary, *file.entry, object));
        } catch (KivArchive::ArchiveError const& error) {
            unlinkat(directory, temporary.c_str(), 0);
            if (error.GetKind() != KivArchive::Failure::Damaged)
                throw;
            Fail(path + file.name, "its content is damaged or missing");
            return;
        }
        if (isWritten && file.entry->Kind() == EntryKind::Link && file.entry->attributes)
            utimensat(directory, temporary.c_str(), TimesOf(*file.entry->attributes).data(), AT_SYMLINK_NOFOLLOW);
        if (isWritten && !isFresh_)
            isWritten = Replace(directory, temporary, file.name);
        if (isWritten)
            return;
        const int reason = errno;
        if (directory >= 0)
            unlinkat(directory, temporary.c_str(), 0);
        errno = reason;
        FailBySystem(path + file.name);
    }

    bool WriteContent(int directory, std::string const& name, Entry const& entry, ArchivedObject const& object) {
        const mode_t mode =
            entry.attributes ? S_IRUSR | S_IWUSR : S_IRUSR | S_IWUSR | S_IRGRP | S_IWGRP | S_IROTH | S_IWOTH;
        Descriptor file(openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, mode));
        bool isWritten = file.IsOpen();
        if (object.size > object.data.size())
            isWritten = isWritten && WriteLarge(file.Get(), object);
        else
            isWritten = isWritten && WriteAll(file.Get(), object.data);
        if (isWritten && entry.attributes)
            isWritten = SetAttributes(file.Get(), *entry.attributes);
        return isWritten && file.Close();
    }

    bool WriteLarge(int file, ArchivedObject const& object) {
        auto stream = KivArchive::ContentStream(archive_, object.id);
        std::vector<std::byte> piece(pieceSize);
        for (std::uint64_t rest = object.size; rest > 0;) {
            const auto size = std::min(rest, pieceSize);
            if (!stream.Read(piece.data(), size))
                throw KivArchive::ArchiveError(KivArchive::Failure::Damaged, "", "a content is damaged");
            if (!WriteAll(file, std::span(piece).first(size)))
                return false;
            rest -= size;
        }
        return true;
    }

    static bool WriteLink(int directory, std::string const& name, ArchivedObject const& object) {
        const std::string target(reinterpret_cast<char const*>(object.data.data()), object.data.size());
        if (target.empty() || target.find('\0') != std::string::npos) {
            errno = EINVAL;
            return false;
        }
        return symlinkat(target.c_str(), directory, name.c_str()) == 0;
    }

    bool Replace(int directory, std::string const& temporary, std::string const& name) const {
        if (renameat(directory, temporary.c_str(), directory, name.c_str()) == 0)
            return true;
        return options_.removesOthers && errno == EISDIR && RemoveAll(directory, name) &&
               renameat(directory, temporary.c_str(), directory, name.c_str()) == 0;
    }

    [[nodiscard]] bool SetAttributes(int file, Attributes const& attributes) const {
        const auto mode = static_cast<mode_t>(attributes.mode) & (options_.specialModes ? 07777U : ordinaryBits);
        return fchmod(file, mode) == 0 && futimens(file, TimesOf(attributes).data()) == 0;
    }

    std::string TemporaryName() {
        return std::string(temporaryPrefix) + std::to_string(getpid()) + '-' + std::to_string(++temporaries_);
    }

    void FailBySystem(std::string const& path) {
        // The rest would not fit either.
        if (errno == ENOSPC || errno == EDQUOT || errno == EIO || errno == EROFS)
            ThrowSystemProblem("cannot write", path);
        Fail(path, std::generic_category().message(errno));
    }

    void Fail(std::string const& path, std::string const& reason) {
        const std::scoped_lock lock(mutex_);
        problems_.push_back((path.empty() ? "." : Shown(path)) + ": " + reason);
    }

    IArchive& archive_;
    TreeReader reader_;
    DirectoryOpener top_;
    RestoreOptions const& options_;
    bool isFresh_;
    Progress& progress_;
    std::vector<LateAttributes> late_;
    std::mutex mutex_;
    std::vector<std::string> problems_;
    std::atomic<std::uint64_t> temporaries_ = 0;
};

} // namespace

std::vector<std::string> Restore(IArchive& archive, Entry const& entry, RestoreOptions const& options,
                                 Progress& progress) {
    struct stat status {};
    struct stat here {};
    const bool isThere = stat(options.target.c_str(), &status) == 0;
    if (isThere && entry.isDirectory && S_ISDIR(status.st_mode)) {
        const DirectoryOpener existing(options.target);
        std::vector<std::string> names;
        const Descriptor listed = OpenDirectory(existing.Top(), ".");
        if (!ReadNames(listed, names) || (!options.force && !names.empty()))
            throw Problem(Shown(options.target) + " is not empty (--force writes into it all the same)");
        // Whoever stands in a directory would not be in the one that replaces it.
        const bool isHere = stat(".", &here) == 0 && here.st_dev == status.st_dev && here.st_ino == status.st_ino;
        if (options.force || isHere)
            return Writer(archive, existing.Top(), options, false, progress).WriteTree(entry.id);
    } else if (isThere && (entry.isDirectory || S_ISDIR(status.st_mode) || !options.force)) {
        throw Problem(Shown(options.target) + " is there already" +
                      (entry.isDirectory         ? ""
                       : S_ISDIR(status.st_mode) ? " (name the file that it is to become)"
                                                 : " (--force replaces it)"));
    }
    const auto place = FindPlace(isThere ? RealPath(options.target) : options.target);
    Sibling sibling(place);
    Writer writer(archive, sibling.Get(), options, true, progress);
    const std::string name = "restored";
    auto problems = entry.isDirectory ? writer.WriteTree(entry.id) : writer.WriteOne(entry, name);
    if (entry.isDirectory || problems.empty())
        sibling.Rename(entry.isDirectory ? "" : name);
    return problems;
}

} // namespace vault
