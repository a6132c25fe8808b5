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

/// One side of a comparison: a version, or a directory on the disk.
class Side {
public:
    Side(Vault& vault, Overlay& archive, std::string const& what, Id const& previous) : archive_(archive) {
        struct stat status {};
        bool isRevision = true;
        try {
            tree_ = vault.Find(what).tree;
        } catch (Problem const&) {
            isRevision = false;
            if (stat(what.c_str(), &status) != 0 || !S_ISDIR(status.st_mode))
                throw;
        }
        if (isRevision)
            return;
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
void WriteTextDifferences(std::vector<PathChange> const& changes, Side const& before, Side const& after) {
    for (auto const& change : changes) {
        const auto path = PrintableName(change.path);
        const auto old = before.Read(change.path, change.oldId);
        const auto current = after.Read(change.path, change.newId);
        KivArchive::UnifiedTextOptions options;
        options.oldLabel = (change.oldId.IsEmpty() ? "/dev/null" : "a/" + path).c_str();
        options.newLabel = (change.newId.IsEmpty() ? "/dev/null" : "b/" + path).c_str();
        const auto text = old && current ? KivArchive::UnifiedText(*old, *current, options) : std::nullopt;
        if (change.oldId.IsEmpty() && change.newId.IsEmpty())
            std::cout << WordFor(change.kind) << ' ' << path << '\n';
        else if (text)
            std::cout << BytesOf(*text);
        else
            std::cout << "no texts: " << path << '\n';
    }
}

/// A cursor over the columns of a text graph: which commit each line leads to next.
class TextGraph {
public:
    void Draw(CommitRecord const& commit, std::string const& names) {
        auto column = Column(commit.id);
        if (column == lanes_.size())
            lanes_.push_back(commit.id);
        std::string line;
        for (std::size_t i = 0; i < lanes_.size(); ++i)
            line += i == column ? "* " : "| ";
        std::cout << line << Coloured(Shortened(commit.id), Colour::Yellow)
                  << (names.empty() ? "" : " (" + Coloured(names, Colour::Green) + ')') << "  " << DescribeTime(commit)
                  << "  " << DescribeMessage(commit) << '\n';
        Follow(column, commit);
    }

private:
    [[nodiscard]] std::size_t Column(Id const& id) const {
        return static_cast<std::size_t>(std::find(lanes_.begin(), lanes_.end(), id) - lanes_.begin());
    }

    /// Leads the line on to the parent, and branches lines off to what was merged.
    void Follow(std::size_t column, CommitRecord const& commit) {
        bool isJoined = commit.parent.IsEmpty();
        if (!isJoined) {
            const auto other = Column(commit.parent);
            isJoined = other != lanes_.size() && other != column;
            if (!isJoined)
                lanes_[column] = commit.parent;
        }
        std::size_t added = 0;
        for (auto const& merged : commit.merged) {
            if (Column(merged) == lanes_.size()) {
                lanes_.push_back(merged);
                ++added;
            }
        }
        if (added > 0 || (isJoined && column + 1 < lanes_.size()) || (isJoined && !commit.parent.IsEmpty()))
            DrawLinks(column, added, isJoined);
        if (isJoined)
            lanes_.erase(lanes_.begin() + static_cast<std::ptrdiff_t>(column));
    }

    void DrawLinks(std::size_t column, std::size_t added, bool isJoined) const {
        std::string line;
        for (std::size_t i = 0; i < lanes_.size(); ++i)
            line += i + added >= lanes_.size() ? "\\ "
                    : i > column && isJoined   ? "/ "
                    : i == column && isJoined  ? "/ "
                                               : "| ";
        while (line.ends_with(' '))
            line.pop_back();
        std::cout << line << '\n';
    }

    std::vector<Id> lanes_;
};

/// Graphviz takes what looks like an entity of HTML for one, in plain labels too.
std::string Quoted(std::string const& text) {
    std::string quoted = "\"";
    for (const char c : text) {
        if (c == '"' || c == '\\')
            quoted += '\\';
        quoted += c;
        if (c == '&')
            quoted += "amp;";
    }
    return quoted + '"';
}

void DrawDotCommit(CommitRecord const& commit) {
    const auto id = DigitsOf(commit.id);
    std::cout << "  \"" << id << "\" [label=" << Quoted(Shortened(commit.id) + "  " + DescribeMessage(commit))
              << "];\n";
    if (!commit.parent.IsEmpty())
        std::cout << "  \"" << id << "\" -> \"" << DigitsOf(commit.parent) << "\";\n";
    for (auto const& merged : commit.merged)
        std::cout << "  \"" << id << "\" -> \"" << DigitsOf(merged) << "\" [style=dashed];\n";
}

} // namespace

int ListChanges(std::vector<PathChange> const& changes, ListingOptions const& listing) {
    const auto most = std::min(listing.limit, IsTerminal() && !listing.json ? mostOnTerminal : listing.limit);
    const auto shown = std::min(most, changes.size());
    std::cout << (listing.json ? "[" : "");
    for (std::size_t i = 0; i < shown; ++i) {
        auto const& change = changes[i];
        if (listing.json)
            std::cout << (i == 0 ? "\n" : ",\n") << "{\"change\":\"" << WordFor(change.kind)
                      << "\",\"path\":" << JsonText(change.path) << ",\"old\":\"" << DigitsOf(change.oldId)
                      << "\",\"new\":\"" << DigitsOf(change.newId) << "\"}";
        else
            std::cout << ColouredWord(change.kind) << ' ' << PrintableName(change.path) << '\n';
    }
    if (listing.json)
        std::cout << "\n]\n";
    if (shown == changes.size())
        return 0;
    Warn(std::to_string(changes.size() - shown) + " more paths differ");
    return cutOffExitStatus;
}

int Log(VaultPlace const& place, std::string const& target, ListingOptions const& listing) {
    Vault vault(place);
    const auto colon = target.find(':');
    KivArchive::CommitListOptions options;
    std::string revision = target.substr(0, colon);
    if (colon != std::string::npos)
        options.changing = KivVcs::FromUtf8(StoredPath(std::string_view(target).substr(colon + 1)));
    CommitRecord head;
    try {
        head = vault.Find(revision);
    } catch (Problem const& problem) {
        // Not a revision: a path, then.
        if (colon != std::string::npos || revision.empty() || problem.ExitStatus() == findingsExitStatus)
            throw;
        head = vault.Find("");
        TreeReader reader(vault.Archive());
        const auto path = StoredPath(revision);
        options.changing = KivVcs::FromUtf8(path);
        if (!reader.Find(head.tree, path) && revision.find('/') == std::string::npos)
            throw Problem("no such revision, and no such path in the current version: " +
                          Printable(StoredName(revision)));
    }
    std::size_t shown = 0;
    bool isCutOff = false;
    if (listing.json)
        std::cout << '[';
    // Along parents and what was merged: nothing that somebody did is left out.
    options.follow = KivArchive::Follow::Reachable;
    if (listing.limit < std::numeric_limits<std::size_t>::max())
        options.atMost = listing.limit + 1;
    KivArchive::ListCommits(
        vault.Archive(), std::span(&head.id, 1), options,
        [&](CommitRecord const& commit) {
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
        },
        nullptr);
    if (listing.json)
        std::cout << "\n]\n";
    return 0;
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
    const Side before(vault, archive, options.before, {});
    const Side after(vault, archive, options.after, before.Tree());
    auto changes = FindChanges(archive, before.Tree(), after.Tree());
    if (!options.path.empty()) {
        const auto path = StoredPath(options.path);
        std::erase_if(changes, [&](PathChange const& change) {
            return change.path != path && !change.path.starts_with(path + '/');
        });
    }
    if (!options.text)
        return ListChanges(changes, options.listing);
    WriteTextDifferences(changes, before, after);
    return 0;
}

int Graph(VaultPlace const& place, bool isText) {
    Vault vault(place);
    const auto current = vault.CurrentBranch();
    const auto branches = vault.Archive().ReadBranches();
    std::unordered_map<Id, std::string> names;
    std::vector<Id> heads;
    if (!isText)
        std::cout << "digraph vault {\n  rankdir=BT;\n  node [shape=box, style=rounded, fontname=\"sans-serif\"];\n";
    for (auto const& [name, head] : branches) {
        heads.push_back(head);
        auto& shown = names[head];
        shown += (shown.empty() ? "" : ", ") + Printable(name) + (name == current ? "*" : "");
        if (isText)
            continue;
        const auto node = Quoted("branch " + Printable(name));
        std::cout << "  " << node << " [label=" << Quoted(Printable(name))
                  << ", shape=ellipse, style=" << (name == current ? "bold" : "solid") << "];\n";
        std::cout << "  " << node << " -> \"" << DigitsOf(head) << "\" [style=dotted];\n";
    }
    TextGraph graph;
    KivArchive::CommitListOptions options;
    options.follow = KivArchive::Follow::Reachable;
    KivArchive::ListCommits(
        vault.Archive(), heads, options,
        [&](CommitRecord const& commit) {
            const auto name = names.find(commit.id);
            if (isText)
                graph.Draw(commit, name == names.end() ? "" : name->second);
            else
                DrawDotCommit(commit);
            return static_cast<bool>(std::cout);
        },
        nullptr);
    if (!isText)
        std::cout << "}\n";
    return 0;
}

} // namespace vault
