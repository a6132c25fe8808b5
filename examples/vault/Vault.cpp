#include "Vault.h"

#include "Cache.h"
#include "Database.h"
#include "Descriptor.h"
#include "Names.h"
#include "OldVault.h"
#include "Output.h"
#include "Problem.h"
#include "Progress.h"

#include <KivArchive/SqliteArchive.h>
#include <algorithm>
#include <charconv>
#include <fstream>
#include <limits>
#include <sstream>
#include <sys/stat.h>

namespace vault {

namespace {

constexpr char16_t const* firstBranch = u"master";
constexpr char16_t const* currentBranchRecord = u"vault/branch";

/// Of an identifier's beginning; shorter ones are rather names, of directories or of branches that are not there.
constexpr std::size_t leastDigits = 4;

/// As many as are told apart where a beginning is not unique.
constexpr std::size_t mostFound = 16;

CommitRecord RequireSound(CommitRecord commit) {
    if (commit.state != KivArchive::CommitState::Sound)
        throw Problem("version " + DigitsOf(commit.id) + " is damaged or missing", findingsExitStatus);
    return commit;
}

/// Who is writing to a vault, or nobody that can be seen from here. SQLite's own files are not opened for that: the locks of
/// this process would go when they are closed.
std::string WhoWrites(std::string const& file) {
    struct stat shared {};
    constexpr unsigned long long writing = 120;
    if (stat((file + "-shm").c_str(), &shared) != 0)
        return {};
    std::ifstream locks("/proc/locks");
    for (std::string line; std::getline(locks, line);) {
        // "1: POSIX  ADVISORY  WRITE 4711 08:01:1234 120 120"
        std::istringstream words(line);
        std::string number;
        std::string kind;
        std::string strength;
        std::string access;
        std::string process;
        std::string inode;
        unsigned long long first = 0;
        unsigned long long last = 0;
        words >> number >> kind >> strength >> access >> process >> inode >> first >> last;
        if (words && access == "WRITE" && inode.ends_with(':' + std::to_string(shared.st_ino)) && first <= writing &&
            writing <= last)
            return process;
    }
    return {};
}

void TellWhoWrites(std::string const& file, std::chrono::seconds wait) {
    const auto process = WhoWrites(file);
    Warn("waiting, at most " + std::to_string(wait.count()) + " s, for " +
         (process.empty() ? "another process" : "process " + process) + ", which is writing to " +
         PrintableName(StoredName(file)));
}

} // namespace

Vault::Vault(VaultPlace const& place, Access access)
    : file_(IsDatabase(place.file) ? place.file : RealPath(place.file)) {
    if (IsDatabase(file_)) {
        auto database = OpenDatabase(file_, access, place.wait);
        archive_ = std::move(database.cached);
        stored_ = std::move(database.stored);
        return;
    }
    struct stat status {};
    const bool isThere = !place.file.empty() && stat(file_.c_str(), &status) == 0;
    if (!isThere && access != Access::Create)
        throw Problem("there is no vault " + PrintableName(StoredName(place.file)) + " (save makes one)");
    if (isThere && S_ISDIR(status.st_mode))
        throw Problem(PrintableName(StoredName(place.file)) + " is a directory, not a vault file");
    isMadeHere_ = !isThere;
    KivArchive::SqliteOptions options;
    options.create = access == Access::Create;
    options.wait = place.wait;
    options.waiting = [this, wait = place.wait] {
        if (!hasTold_.test_and_set())
            TellWhoWrites(file_, wait);
    };
    try {
        archive_ = std::make_shared<KivArchive::SqliteArchive>(file_, options);
    } catch (KivArchive::ArchiveError const& error) {
        if (error.GetKind() != KivArchive::Failure::Foreign)
            throw;
        UpgradeOldVault(file_, place.wait);
        archive_ = std::make_shared<KivArchive::SqliteArchive>(file_, options);
    }
    stored_ = archive_;
}

Vault::~Vault() {
    if (!isMadeHere_)
        return;
    try {
        if (!archive_->ReadBranches().empty())
            return;
        archive_.reset();
        stored_.reset();
        for (auto const* const suffix : {"", "-wal", "-shm"})
            unlink((file_ + suffix).c_str());
    } catch (std::exception const&) {
        // It stays; the next save uses it.
    }
}

Text Vault::CurrentBranch() const {
    if (IsDatabase(file_)) {
        const auto note = ReadNote(file_);
        return note ? RequireUtf8(*note, "the current branch") : Text(firstBranch);
    }
    const Text name = currentBranchRecord;
    const auto records = archive_->ReadRecords(std::span(&name, 1));
    if (records.empty() || !records.front().value)
        return firstBranch;
    return RequireUtf8(BytesOf(*records.front().value), "the current branch");
}

KivArchive::RecordChange Vault::MakeCurrent(Text const& name) {
    return {{currentBranchRecord, BufferOf(ToUtf8(name))}, false, {}};
}

void Vault::Checkout(Text const& name) {
    if (IsDatabase(file_)) {
        WriteNote(file_, ToUtf8(name));
        return;
    }
    KivArchive::Change change;
    change.records.push_back(MakeCurrent(name));
    archive_->Apply(change);
}

Id Vault::HeadOf(Text const& branch) const {
    for (auto const& [name, head] : archive_->ReadBranches()) {
        if (name == branch)
            return head;
    }
    return {};
}

Id Vault::RequireBranch(std::string const& name) const {
    auto head = HeadOf(RequireUtf8(name, "a branch name"));
    if (head.IsEmpty())
        throw Problem("no such branch: " + Printable(name));
    return head;
}

CommitRecord Vault::Find(std::string const& revision) const {
    if (auto found = TryFind(revision))
        return *std::move(found);
    throw Problem("no such revision: " + Printable(revision) +
                  " (a branch or an identifier, with :PATH behind it for a file of a version)");
}

std::optional<CommitRecord> Vault::TryFind(std::string const& revision) const {
    auto name = revision;
    std::size_t steps = 0;
    // A branch may have such a name.
    for (auto earlier = ReadEarlier(name); earlier && HeadOf(KivVcs::FromUtf8(name)).IsEmpty();
         earlier = ReadEarlier(name)) {
        steps += std::min(earlier->steps, std::numeric_limits<std::size_t>::max() - steps);
        name = std::move(earlier->revision);
    }
    auto found = TryFindNamed(name);
    return found && steps > 0 ? FindEarlier(found->id, steps) : std::move(found);
}

std::optional<CommitRecord> Vault::TryFindNamed(std::string const& revision) const {
    const auto name = revision.empty() ? CurrentBranch() : FromUtf8(revision);
    if (!name)
        return std::nullopt;
    const auto head = HeadOf(*name);
    if (!head.IsEmpty())
        return RequireSound(KivArchive::ReadCommits(*archive_, std::span(&head, 1)).front());
    const auto whole = Id::Parse(revision);
    if (!whole && (revision.empty() || name == CurrentBranch()))
        throw Problem("branch " + Printable(*name) + " has no versions yet");
    std::vector<Id> ids;
    if (whole)
        ids.push_back(*whole);
    else if (revision.size() >= leastDigits)
        ids = KivArchive::FindCommits(*archive_, revision, mostFound);
    auto commits = KivArchive::ReadCommits(*archive_, ids);
    const auto isMissing = [](CommitRecord const& commit) { return commit.state == KivArchive::CommitState::Missing; };
    const bool isForgotten =
        std::any_of(commits.begin(), commits.end(), [](CommitRecord const& commit) { return !commit.tree.IsEmpty(); });
    std::erase_if(commits, isMissing);
    if (commits.size() > 1)
        throw Problem("ambiguous revision: " + Printable(revision) + " begins " + std::to_string(commits.size()) +
                      " identifiers");
    if (!commits.empty())
        return RequireSound(std::move(commits.front()));
    if (isForgotten)
        throw Problem("version " + Printable(revision) + " has been forgotten");
    return std::nullopt;
}

std::optional<Vault::Earlier> Vault::ReadEarlier(std::string const& revision) {
    const auto tilde = revision.rfind('~');
    if (tilde == std::string::npos)
        return std::nullopt;
    Earlier earlier{revision.substr(0, tilde)};
    auto const* const last = revision.data() + revision.size();
    auto const* const first = revision.data() + tilde + 1;
    const auto [end, error] = std::from_chars(first, last, earlier.steps);
    return first == last || (error == std::errc() && end == last) ? std::optional(std::move(earlier)) : std::nullopt;
}

CommitRecord Vault::FindEarlier(Id const& later, std::size_t steps) const {
    const auto line = archive_->ReadAncestry(std::span(&later, 1), KivArchive::Follow::Parents, steps);
    if (line.size() <= steps)
        throw Problem("there are only " + std::to_string(line.size() - std::min<std::size_t>(line.size(), 1)) +
                      " versions before " + Shortened(later));
    return RequireSound(KivArchive::ReadCommits(*archive_, std::span(&line[steps].commit, 1)).front());
}

Target Vault::FindTarget(std::string const& target) const {
    const auto colon = target.find(':');
    Target found{Find(target.substr(0, colon)), {}, {}};
    if (colon != std::string::npos)
        found.path = StoredPath(std::string_view(target).substr(colon + 1));
    TreeReader reader(*archive_);
    auto entry = reader.Find(found.commit.tree, found.path);
    if (!entry)
        throw Problem("no such file or directory in this version: " + PrintableName(found.path));
    found.entry = *std::move(entry);
    return found;
}

Text RequireBranchName(std::string const& name) {
    if (name.empty() || name.find(':') != std::string::npos || Printable(name) != name)
        throw Problem("a branch name is not empty and has neither ':' nor control characters: " + Printable(name));
    return RequireUtf8(name, "a branch name");
}

std::string StoredPath(std::string_view filePath) {
    std::string path;
    while (!filePath.empty()) {
        const auto end = std::min(filePath.find('/'), filePath.size());
        const auto name = filePath.substr(0, end);
        filePath.remove_prefix(std::min(end + 1, filePath.size()));
        if (!name.empty() && name != ".")
            path += (path.empty() ? "" : "/") + StoredName(name);
    }
    return path;
}

bool MoveHead(Vault& vault, KivArchive::Change change, Text const& branch, Id const& expected, Id const& head) {
    change.branches.push_back({branch, expected, head});
    return vault.Archive().Apply(change).applied;
}

void Publish(KivArchive::ArchivedRepository& repository) {
    Progress progress("writing");
    if (!repository.Publish(&progress).published)
        throw Problem("somebody else changed the branches meanwhile; nothing was changed. Try again");
}

} // namespace vault
