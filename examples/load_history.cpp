#include "load_history.h"

#include <optional>
#include <string>
#include <vector>

using namespace KivVcs;

namespace {

/// The text of a commit; empty if the packed form is not the one of that identifier, or not one of a commit.
std::string CommitText(Buffer const& packed, Id const& id) {
    const std::string bytes = Blob(packed).CopyToString();
    const auto headerEnd = bytes.find('\0');
    const bool isSound = Id(packed) == id && bytes.starts_with("commit ") && headerEnd != std::string::npos;
    return isSound ? bytes.substr(headerEnd + 1) : "";
}

/// Takes the first line off a text if it begins with `key`, and gives the rest of that line.
std::optional<std::string> TakeLine(std::string& text, std::string_view key) {
    const auto end = text.find('\n');
    if (!text.starts_with(key) || end == std::string::npos)
        return {};
    std::string value = text.substr(key.size(), end - key.size());
    text.erase(0, end + 1);
    return value;
}

Id ParentIn(std::string text) {
    TakeLine(text, "tree ");
    return Id::Parse(TakeLine(text, "parent ").value_or("")).value_or(Id());
}

/// Sets author, time and zone from "NAME <EMAIL> SECONDS +HHMM"; false for any other text.
bool SetAuthor(Commit& commit, std::string const& line) {
    const auto email = line.rfind(" <");
    const auto seconds = line.rfind("> ");
    const auto zone = line.rfind(' ');
    if (email == std::string::npos || seconds == std::string::npos || email + 2 > seconds || zone < seconds + 2)
        return false;
    const auto numberAt = [&line](std::size_t begin) { return String::Int64FromString(FromUtf8(line.substr(begin))); };
    commit.SetAuthorName(FromUtf8(line.substr(0, email)));
    commit.SetAuthorEmail(FromUtf8(line.substr(email + 2, seconds - email - 2)));
    commit.SetCommitTime(Time::FromTimeT(numberAt(seconds + 2), TimeZone::Utc));
    const std::int64_t hoursAndMinutes = numberAt(zone + 1);
    commit.SetCommitTimezoneBias(TimeDelta((hoursAndMinutes / 100 * 60 + hoursAndMinutes % 100) * 600'000'000));
    return true;
}

/// The commit that a text describes, with all its files.
cow_ptr<Commit> ReadCommit(std::string text, cow_ptr<Commit> const& parent, Repository& repository,
                           Fetch const& fetch) {
    const auto tree = TakeLine(text, "tree ");
    TakeLine(text, "parent ");
    const auto author = TakeLine(text, "author ");
    TakeLine(text, "committer ");
    TakeLine(text, "");
    Commit commit(parent, false);
    if (!tree || !author || text.empty() || !SetAuthor(commit, *author))
        return nullptr;
    commit.SetDescription(FromUtf8(text.substr(0, text.size() - 1)));
    // The stream has bytes of its own; the library reads from it after this returns.
    const auto loader = [&fetch](Id const& id) { return StreamIO(MemStream::CreateOnCopy(fetch(id))); };
    const Id treeId = Id::Parse(*tree).value_or(Id());
    commit.ReplaceRoot(&repository, Tree::Deserialize(treeId, &repository, loader));
    commit.ResetState();
    return immu::make<Commit>(commit);
}

} // namespace

cow_ptr<Commit> LoadHistory(Repository& repository, Id const& head, Fetch const& fetch) {
    // An empty tree is not read back, but one that is held already need not be.
    const auto emptyTree = repository.SyncWithStorage(immu::make<Tree>());

    struct Unread {
        Id id;
        std::string text;
    };
    std::vector<Unread> unread;
    cow_ptr<Commit> parent;
    for (Id id = head; !id.IsEmpty(); id = ParentIn(unread.back().text)) {
        parent = repository.GetCommitFromStorage(id);
        if (parent)
            break;
        unread.push_back({id, CommitText(fetch(id), id)});
        if (unread.back().text.empty())
            return nullptr;
    }
    // The oldest first, so that every commit finds its parent stored.
    for (; !unread.empty(); unread.pop_back()) {
        const auto commit = ReadCommit(unread.back().text, parent, repository, fetch);
        if (!commit || commit->GetId() != unread.back().id)
            return nullptr;
        parent = repository.SyncWithStorage(commit);
    }
    return parent;
}
