#include "Revision.h"

#include "Problem.h"

#include <ctime>
#include <iomanip>
#include <sstream>

namespace vault {

namespace {

constexpr std::int64_t ticksPerMinute = 600'000'000;
constexpr std::size_t shortLength = 12;

} // namespace

CommitHandle FindRevision(KivVcs::Repository const& repository, std::string const& revision) {
    const auto name = RequireUtf8(revision, "the revision");
    auto const& storage = *repository.GetStorage();
    if (storage.BranchExist(name)) {
        if (auto head = storage.GetHead(name))
            return head;
        throw Problem("branch " + Printable(revision) + " has no versions yet");
    }
    CommitHandle found;
    std::size_t matches = 0;
    for (auto const& [id, commit] : storage.GetCommits()) {
        if (revision.empty() || !id.GetText().StartsWith(name))
            continue;
        found = commit;
        ++matches;
    }
    if (matches == 0)
        throw Problem("no such revision: " + Printable(revision));
    if (matches > 1)
        throw Problem("ambiguous revision: " + Printable(revision) + " begins " + std::to_string(matches) +
                      " identifiers");
    return found;
}

Text RequireBranchName(std::string const& name) {
    if (name.empty() || name.find(':') != std::string::npos || Printable(name) != name)
        throw Problem("a branch name is not empty and has neither ':' nor control characters: " + Printable(name));
    return RequireUtf8(name, "a branch name");
}

KivVcs::cow_ptr<KivVcs::Tree> RootOf(CommitHandle const& commit) {
    const auto tree = commit->GetCommitTree();
    return tree ? tree->GetRoot() : nullptr;
}

std::string DescribeTime(KivVcs::Commit const& commit) {
    const auto minutes = commit.GetCommitTimezoneBias().GetTicks() / ticksPerMinute;
    const std::time_t local = commit.GetCommitTime().ToTimeT(KivVcs::TimeZone::Utc) + minutes * 60;
    std::tm parts{};
    gmtime_r(&local, &parts);
    const auto distance = minutes < 0 ? -minutes : minutes;
    std::ostringstream text;
    text << std::put_time(&parts, "%Y-%m-%d %H:%M ") << (minutes < 0 ? '-' : '+') << std::setfill('0') << std::setw(2)
         << distance / 60 << std::setw(2) << distance % 60;
    return text.str();
}

std::string DescribeAuthor(KivVcs::Commit const& commit) {
    return Printable(commit.GetAuthorName()) + " <" + Printable(commit.GetAuthorEmail()) + '>';
}

std::string Shortened(KivVcs::Id const& id) {
    return ToUtf8(id).substr(0, shortLength);
}

} // namespace vault
