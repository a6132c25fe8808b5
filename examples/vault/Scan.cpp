#include "Scan.h"

#include "Descriptor.h"
#include "Names.h"
#include "Parallel.h"
#include "Problem.h"

#include <algorithm>
#include <cerrno>
#include <condition_variable>
#include <fcntl.h>
#include <fnmatch.h>
#include <fstream>
#include <iterator>
#include <memory>
#include <system_error>

namespace vault {

namespace {

/// How many directories wait with a descriptor of the one that they are in; the rest is opened by its path.
constexpr int mostHeld = 200;
/// Every directory below has a path that is longer than this one's: what a chain of them takes grows with its square.
constexpr std::size_t longestPath = std::size_t{64} * 1024;

struct Pattern {
    std::string text;
    bool isPath = false;
    bool directoriesOnly = false;
    bool isLiteral = false;
};

Pattern ParsePattern(std::string text) {
    Pattern pattern;
    pattern.directoriesOnly = text.ends_with('/');
    if (pattern.directoriesOnly)
        text.pop_back();
    pattern.isPath = text.find('/') != std::string::npos;
    pattern.text = text.starts_with('/') ? text.substr(1) : text;
    pattern.isLiteral = pattern.text.find_first_of("*?[\\") == std::string::npos;
    return pattern;
}

std::vector<Pattern> ReadPatterns(ScanOptions const& options) {
    std::vector<Pattern> patterns;
    std::ifstream file(options.top + "/.vaultignore");
    for (std::string line; std::getline(file, line);) {
        if (!line.empty() && line.front() != '#')
            patterns.push_back(ParsePattern(line));
    }
    for (auto const& text : options.excluded)
        patterns.push_back(ParsePattern(text));
    return patterns;
}

class Scanner {
public:
    explicit Scanner(ScanOptions const& options)
        : options_(options), patterns_(ReadPatterns(options)), top_(options.top) {
        const auto slash = options.vaultFile.find_last_of('/');
        vaultName_ = slash == std::string::npos ? options.vaultFile : options.vaultFile.substr(slash + 1);
        const auto directory = slash == std::string::npos ? "." : options.vaultFile.substr(0, slash + 1);
        hasVaultDirectory_ = stat(directory.c_str(), &vaultDirectory_) == 0;
        hasVault_ = stat(options.vaultFile.c_str(), &vault_) == 0;
    }

    Scan Run() {
        struct stat status {};
        if (fstat(top_.Top(), &status) != 0)
            ThrowSystemProblem("cannot read", options_.top);
        device_ = status.st_dev;
        scan_.directories.emplace_back();
        waiting_.push_back({});
        InParallel([this] { Work(); });
        if (topProblem_ != 0) {
            errno = topProblem_;
            ThrowSystemProblem("cannot read", options_.top);
        }
        for (auto* const list : {&scan_.problems, &scan_.specials, &scan_.excludedSaved})
            std::sort(list->begin(), list->end());
        return std::move(scan_);
    }

private:
    struct Task {
        std::size_t directory = 0;
        /// Of the directory that it is in, or null.
        std::shared_ptr<Descriptor> parent;
        std::string name;
        ScannedEntry* entry = nullptr;
    };

    /// What one thread works with.
    struct Worker {
        DirectoryOpener opener;
        std::vector<ScannedEntry> found;
    };

    void Work() {
        Worker worker{DirectoryOpener(OpenDirectory(top_.Top(), ".")), {}};
        std::unique_lock lock(mutex_);
        for (;;) {
            changed_.wait(lock, [this] { return !waiting_.empty() || working_ == 0 || isStopped_; });
            if (waiting_.empty() || isStopped_)
                return;
            const auto task = std::move(waiting_.back());
            waiting_.pop_back();
            ++working_;
            auto& directory = scan_.directories[task.directory];
            lock.unlock();
            try {
                Look(task, directory, worker);
            } catch (...) {
                lock.lock();
                isStopped_ = true;
                --working_;
                changed_.notify_all();
                throw;
            }
            lock.lock();
            --working_;
            changed_.notify_all();
        }
    }

    void Look(Task const& task, ScannedDirectory& directory, Worker& worker) {
        auto opened = std::make_shared<Descriptor>(Open(task, directory, worker.opener));
        struct stat status {};
        auto& found = worker.found;
        found.clear();
        if (!opened->IsOpen() || fstat(opened->Get(), &status) != 0 ||
            !ForEachName(*opened, [&, hasVault = hasVaultDirectory_ && AreSame(status, vaultDirectory_)](
                                      char const* name) { Add(directory, *opened, name, hasVault, found); })) {
            if (task.entry == nullptr)
                topProblem_ = errno;
            else
                Report(*task.entry, directory.path.substr(0, directory.path.size() - 1));
            return;
        }
        directory.state = StateOf(status);
        std::sort(found.begin(), found.end(),
                  [](auto const& left, auto const& right) { return ComesBefore(left.name, right.name); });
        // A directory that is changed while it is listed may show a name twice.
        const auto end = std::unique(found.begin(), found.end(),
                                     [](auto const& left, auto const& right) { return left.name == right.name; });
        directory.entries.assign(std::move_iterator(found.begin()), std::move_iterator(end));
        PutOff(directory, opened);
    }

    Descriptor Open(Task const& task, ScannedDirectory const& directory, DirectoryOpener& opener) {
        if (task.entry == nullptr)
            return OpenDirectory(top_.Top(), ".");
        if (task.parent) {
            auto opened = OpenDirectory(task.parent->Get(), task.name.c_str());
            --held_;
            return opened;
        }
        return OpenDirectory(opener.Open(FilePath(directory.path)), ".");
    }

    void Add(ScannedDirectory const& directory, Descriptor const& opened, char const* name, bool hasVault,
             std::vector<ScannedEntry>& found) {
        ScannedEntry entry{StoredName(name), ScannedEntry::Kind::File, {}, 0};
        struct stat status {};
        if (fstatat(opened.Get(), name, &status, AT_SYMLINK_NOFOLLOW) != 0) {
            Report(entry, directory.path + entry.name);
        } else {
            if ((hasVault && IsVaultName(name)) || (hasVault_ && AreSame(status, vault_)))
                return;
            if (!patterns_.empty() && IsExcluded(directory.path, entry.name, name, S_ISDIR(status.st_mode)))
                return;
            entry.state = StateOf(status);
            entry.kind = KindOf(status);
            if (entry.kind == ScannedEntry::Kind::Special)
                Note(scan_.specials, PrintableName(directory.path + entry.name));
        }
        found.push_back(std::move(entry));
    }

    [[nodiscard]] ScannedEntry::Kind KindOf(struct stat const& status) const noexcept {
        if (S_ISDIR(status.st_mode))
            return options_.oneFileSystem && status.st_dev != device_ ? ScannedEntry::Kind::Elsewhere
                                                                      : ScannedEntry::Kind::Directory;
        if (S_ISREG(status.st_mode))
            return ScannedEntry::Kind::File;
        return S_ISLNK(status.st_mode) ? ScannedEntry::Kind::Link : ScannedEntry::Kind::Special;
    }

    /// Leaves the directories in @p directory to whoever has time.
    void PutOff(ScannedDirectory& directory, std::shared_ptr<Descriptor> const& opened) {
        const std::scoped_lock lock(mutex_);
        for (auto& entry : directory.entries) {
            if (entry.kind != ScannedEntry::Kind::Directory)
                continue;
            // Before anything is stored that could not be read back.
            if (directory.path.size() + entry.name.size() >= longestPath)
                throw Problem("nested too deep, nothing was saved: " + PrintableName(directory.path.substr(0, 200)) +
                              "... and below that " + PrintableName(entry.name));
            entry.directory = scan_.directories.size();
            scan_.directories.push_back({directory.path + entry.name + '/', {}, {}});
            const bool isHeld = held_ < mostHeld;
            held_ += isHeld ? 1 : 0;
            waiting_.push_back(
                {entry.directory, isHeld ? opened : nullptr, isHeld ? FilePath(entry.name) : std::string(), &entry});
        }
    }

    bool IsExcluded(std::string const& directory, std::string const& storedName, char const* name, bool isDirectory) {
        const auto matches = [&](Pattern const& pattern) {
            if (pattern.directoriesOnly && !isDirectory)
                return false;
            if (pattern.isPath)
                return fnmatch(pattern.text.c_str(), FilePath(directory + storedName).c_str(), FNM_PATHNAME) == 0;
            return pattern.isLiteral ? pattern.text == name : fnmatch(pattern.text.c_str(), name, 0) == 0;
        };
        if (std::none_of(patterns_.begin(), patterns_.end(), matches))
            return false;
        const auto path = directory + storedName;
        if (!options_.isSaved || !options_.isSaved(path))
            return true;
        Note(scan_.excludedSaved, path);
        return false;
    }

    [[nodiscard]] bool IsVaultName(std::string_view name) const {
        if (!name.starts_with(vaultName_))
            return false;
        name.remove_prefix(vaultName_.size());
        return name.empty() || name == "-wal" || name == "-shm" || name == "-journal";
    }

    static bool AreSame(struct stat const& left, struct stat const& right) noexcept {
        return left.st_dev == right.st_dev && left.st_ino == right.st_ino;
    }

    void Report(ScannedEntry& entry, std::string const& path) {
        entry.kind = ScannedEntry::Kind::Unreadable;
        Note(scan_.problems, PrintableName(path) + ": " + std::generic_category().message(errno));
    }

    void Note(std::vector<std::string>& list, std::string text) {
        const std::scoped_lock lock(notesMutex_);
        list.push_back(std::move(text));
    }

    ScanOptions const& options_;
    std::vector<Pattern> patterns_;
    DirectoryOpener top_;
    std::string vaultName_;
    struct stat vaultDirectory_ {};
    struct stat vault_ {};
    bool hasVaultDirectory_ = false;
    bool hasVault_ = false;
    dev_t device_ = 0;

    std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<Task> waiting_;
    int working_ = 0;
    bool isStopped_ = false;
    int topProblem_ = 0;
    std::atomic<int> held_ = 0;
    std::mutex notesMutex_;
    Scan scan_;
};

} // namespace

Scan ScanDirectory(ScanOptions const& options) {
    return Scanner(options).Run();
}

} // namespace vault
