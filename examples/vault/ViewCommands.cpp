#include "Changes.h"
#include "Commands.h"
#include "Descriptor.h"
#include "Listing.h"
#include "Names.h"
#include "Output.h"
#include "Overlay.h"
#include "Problem.h"
#include "Snapshot.h"

#include <KivArchive/TextLines.h>
#include <algorithm>
#include <fcntl.h>
#include <iostream>
#include <sys/stat.h>
#include <unordered_set>

namespace vault {

namespace {

/// As many as somebody might look through.
constexpr std::size_t mostOnTerminal = 10'000;

std::string ColouredWord(PathChange::Kind kind) {
    std::string word(WordFor(kind));
    word.resize(std::max<std::size_t>(word.size(), 7), ' ');
    return Coloured(word, kind == PathChange::Kind::Added     ? Colour::Green
                          : kind == PathChange::Kind::Removed ? Colour::Red
                                                              : Colour::Yellow);
}

void ListChange(PathChange const& change) {
    std::cout << ColouredWord(change.kind) << ' ' << PrintableName(change.path)
              << (change.sameAs.empty() ? "" : " (as in " + PrintableName(change.sameAs) + ')') << '\n';
}

/// @return the exit status
int TellOfRest(std::size_t count) {
    if (count == 0)
        return 0;
    Warn(std::to_string(count) + " more paths differ");
    return cutOffExitStatus;
}

void ListEntries(Directory const& directory) {
    for (auto const& entry : directory.entries) {
        std::cout << (entry.isDirectory                 ? "tree "
                      : entry.Kind() == EntryKind::Link ? "link "
                                                        : "blob ")
                  << DigitsOf(entry.id) << ' ' << PrintableName(entry.name) << '\n';
    }
}

void WriteContent(IArchive& archive, Id const& id) {
    auto stream = KivArchive::ContentStream(archive, id);
    if (!stream)
        throw Problem("the content is damaged or missing", findingsExitStatus);
    std::vector<char> piece(std::size_t{1} << 20U);
    for (auto rest = stream.GetSize(); rest > 0;) {
        const auto size = std::min<std::uint64_t>(rest, piece.size());
        if (!stream.Read(piece.data(), size))
            throw Problem("the content is damaged", findingsExitStatus);
        std::cout.write(piece.data(), static_cast<std::streamsize>(size));
        rest -= size;
    }
}

void ShowCommit(CommitRecord const& commit) {
    std::cout << "commit  " << Coloured(DigitsOf(commit.id), Colour::Yellow) << '\n';
    if (!commit.parent.IsEmpty())
        std::cout << "parent  " << DigitsOf(commit.parent) << '\n';
    for (auto const& merged : commit.merged)
        std::cout << "merged  " << DigitsOf(merged) << '\n';
    std::cout << "author  " << DescribeAuthor(commit) << '\n'
              << "time    " << DescribeTime(commit) << '\n'
              << "message " << DescribeMessage(commit) << '\n'
              << "root    " << DigitsOf(commit.tree) << '\n';
}

/// A directory is meant also where its name begins an identifier.
bool IsDirectory(Vault const& vault, std::string const& what) {
    struct stat status {};
    return stat(what.c_str(), &status) == 0 && S_ISDIR(status.st_mode) &&
           vault.HeadOf(KivVcs::FromUtf8(what)).IsEmpty();
}

/// One side of a comparison: a version, or a directory on the disk.
class Side {
public:
    Side(Vault& vault, Overlay& archive, std::string const& what, Id const& previous) : archive_(archive) {
        if (!IsDirectory(vault, what)) {
            tree_ = vault.Find(what).tree;
            return;
        }
        directory_ = what;
        SnapshotOptions options;
        options.scan.top = what;
        options.scan.vaultFile = vault.File();
        options.previous = previous;
        options.stores = false;
        Progress progress("looking");
        const auto snapshot = TakeSnapshot(vault.Archive(), options, progress);
        for (auto const& problem : snapshot.problems)
            Warn(problem);
        archive.Add(snapshot.change);
        tree_ = snapshot.tree;
    }

    [[nodiscard]] Id const& Tree() const noexcept { return tree_; }

    /// The content at a path; empty for the null identifier, nothing if it cannot be had.
    [[nodiscard]] std::optional<Buffer> Read(std::string const& path, Id const& id) const {
        if (id.IsEmpty())
            return Buffer();
        TreeReader reader(archive_);
        return directory_.empty() ? reader.ReadContent(id, KivArchive::largestText) : ReadFile(path);
    }

private:
    [[nodiscard]] std::optional<Buffer> ReadFile(std::string const& path) const {
        DirectoryOpener opener(directory_);
        const auto nameAt = path.find_last_of('/') + 1;
        const int directory = opener.Open(FilePath(path.substr(0, nameAt)));
        const Descriptor file(
            openat(directory, FilePath(path.substr(nameAt)).c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
        struct stat status {};
        if (!file.IsOpen() || fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode) ||
            static_cast<std::uint64_t>(status.st_size) > KivArchive::largestText)
            return std::nullopt;
        std::string bytes(static_cast<std::size_t>(status.st_size), '\0');
        std::size_t done = 0;
        for (ssize_t count = 1; count > 0 && done < bytes.size();
             done += static_cast<std::size_t>(std::max<ssize_t>(count, 0)))
            count = read(file.Get(), bytes.data() + done, bytes.size() - done);
        bytes.resize(done);
        return BufferOf(bytes);
    }

    Overlay& archive_;
    Id tree_;
    std::string directory_;
};

/// Writes what differs as `patch` reads it.
void WriteTextDifferences(std::span<PathChange const> changes, Side const& before, Side const& after) {
    for (auto const& change : changes) {
        const auto path = PrintableName(change.path);
        const auto old = before.Read(change.path, change.oldId);
        const auto current = after.Read(change.path, change.newId);
        KivArchive::UnifiedTextOptions options;
        options.oldLabel = (change.oldId.IsEmpty() ? "/dev/null" : "a/" + path).c_str();
        options.newLabel = (change.newId.IsEmpty() ? "/dev/null" : "b/" + path).c_str();
        const auto text = old && current ? KivArchive::UnifiedText(*old, *current, options) : std::nullopt;
        if (change.oldId.IsEmpty() && change.newId.IsEmpty())
            ListChange(change);
        else if (text)
            std::cout << BytesOf(*text);
        else
            std::cout << "no texts: " << path << '\n';
    }
}

/// Along parents and what was merged: nothing that somebody did is left out.
void ForEachCommit(IArchive& archive, Id const& head, std::optional<Text> const& changing,
                   KivArchive::CommitReceiver const& receiver) {
    KivArchive::CommitListOptions options;
    options.follow = KivArchive::Follow::Reachable;
    options.changing = changing;
    KivArchive::ListCommits(archive, std::span(&head, 1), options, receiver, nullptr);
}

/// What REVISION, REVISION:PATH or PATH asks the history of.
std::pair<CommitRecord, std::optional<std::string>> FindHistory(Vault const& vault, std::string const& target) {
    const auto colon = target.find(':');
    const auto revision = target.substr(0, colon);
    if (colon != std::string::npos)
        return {vault.Find(revision), StoredPath(std::string_view(target).substr(colon + 1))};
    if (auto found = vault.TryFind(revision))
        return {*std::move(found), std::nullopt};
    // Not a revision: a path, then.
    auto head = vault.Find("");
    auto path = StoredPath(revision);
    if (!TreeReader(vault.Archive()).Find(head.tree, path) && revision.find('/') == std::string::npos)
        throw Problem("no such revision, and no such path in the current version: " + Printable(StoredName(revision)));
    return {std::move(head), std::move(path)};
}

/// Those that changed what is at a path, be it only a file's mode.
std::unordered_set<Id> CommitsChanging(IArchive& archive, CommitRecord const& head, std::string const& path) {
    std::unordered_set<Id> changing;
    ForEachCommit(archive, head.id, KivVcs::FromUtf8(path), [&](CommitRecord const& commit) {
        changing.insert(commit.id);
        return true;
    });
    TreeReader reader(archive);
    const auto attributesIn = [&](Id const& tree) {
        const auto entry = tree.IsEmpty() ? std::nullopt : reader.Find(tree, path);
        return entry ? entry->attributes : std::nullopt;
    };
    for (auto const& place : AttributePaths(path)) {
        ForEachCommit(archive, head.id, KivVcs::FromUtf8(place), [&](CommitRecord const& commit) {
            if (changing.contains(commit.id) || commit.parent.IsEmpty())
                return true;
            const auto now = attributesIn(commit.tree);
            const auto parents = KivArchive::ReadCommits(archive, std::span(&commit.parent, 1));
            const auto before = attributesIn(parents.empty() ? Id() : parents.front().tree);
            if (now && before && !now->IsLike(*before))
                changing.insert(commit.id);
            return true;
        });
    }
    return changing;
}

} // namespace

int ListChanges(std::vector<PathChange> const& changes, ListingOptions const& listing) {
    const auto most = std::min(listing.limit, IsTerminal() && !listing.json ? mostOnTerminal : listing.limit);
    const auto shown = std::min(most, changes.size());
    std::cout << (listing.json ? "[" : "");
    for (std::size_t i = 0; i < shown; ++i) {
        auto const& change = changes[i];
        if (listing.json)
            std::cout << (i == 0 ? "\n" : ",\n") << R"({"change":")" << WordFor(change.kind) << R"(","path":)"
                      << JsonText(change.path) << R"(,"old":")" << DigitsOf(change.oldId) << R"(","new":")"
                      << DigitsOf(change.newId) << '"'
                      << (change.sameAs.empty() ? "" : R"(,"as":)" + JsonText(change.sameAs)) << '}';
        else
            ListChange(change);
    }
    if (listing.json)
        std::cout << "\n]\n";
    if (changes.empty() && IsTerminal() && !listing.json)
        std::cout << "nothing differs\n";
    return TellOfRest(changes.size() - shown);
}

int Log(VaultPlace const& place, std::string const& target, ListingOptions const& listing) {
    Vault vault(place);
    const auto [head, path] = FindHistory(vault, target);
    std::optional<std::unordered_set<Id>> shownOnly;
    if (path)
        shownOnly = CommitsChanging(vault.Archive(), head, *path);
    std::size_t shown = 0;
    bool isCutOff = false;
    if (listing.json)
        std::cout << '[';
    ForEachCommit(vault.Archive(), head.id, {}, [&](CommitRecord const& commit) {
        if (shownOnly && !shownOnly->contains(commit.id))
            return true;
        isCutOff = shown == listing.limit;
        if (isCutOff)
            return false;
        if (listing.json)
            std::cout << (shown == 0 ? "\n" : ",\n") << JsonCommit(commit);
        else
            std::cout << Coloured(DigitsOf(commit.id), Colour::Yellow) << "  " << DescribeTime(commit) << "  "
                      << DescribeAuthor(commit) << "  " << DescribeMessage(commit) << '\n';
        ++shown;
        return static_cast<bool>(std::cout);
    });
    if (listing.json)
        std::cout << "\n]\n";
    if (isCutOff && listing.json)
        Warn("there are more versions");
    return isCutOff ? cutOffExitStatus : 0;
}

int Show(VaultPlace const& place, std::string const& target) {
    Vault vault(place);
    const auto found = vault.FindTarget(target);
    TreeReader reader(vault.Archive());
    if (target.find(':') == std::string::npos)
        ShowCommit(found.commit);
    if (found.entry.isDirectory)
        ListEntries(reader.Read(found.entry.id));
    else
        WriteContent(vault.Archive(), found.entry.id);
    return 0;
}

int Diff(VaultPlace const& place, DiffOptions const& options) {
    Vault vault(place);
    Overlay archive(vault.Archive());
    // Alone, a version is before the current one, and a directory after it.
    const bool isReversed = options.after.empty() && IsDirectory(vault, options.before);
    const Side before(vault, archive, isReversed ? std::string() : options.before, {});
    const Side after(vault, archive, isReversed ? options.before : options.after, before.Tree());
    const auto changes = FindChanges(archive, before.Tree(), after.Tree(), StoredPath(options.path));
    if (!options.text)
        return ListChanges(changes, options.listing);
    const auto shown = std::min(options.listing.limit, changes.size());
    WriteTextDifferences(std::span(changes).first(shown), before, after);
    return TellOfRest(changes.size() - shown);
}

} // namespace vault
