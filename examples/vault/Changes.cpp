#include "Changes.h"

#include "Names.h"
#include "Problem.h"

#include <algorithm>
#include <deque>
#include <map>

namespace vault {

using Kind = PathChange::Kind;

namespace {

constexpr std::size_t mostAtOnce = 500;

/// Compares two versions directory by directory, the upper ones first. Two directories that stand against each other again
/// are not entered again.
class Comparison {
public:
    Comparison(IArchive& archive, std::string_view path) : reader_(archive), wanted_(path) {}

    std::vector<PathChange> Run(Id const& before, Id const& after) {
        Enter("", before, after);
        while (!waiting_.empty()) {
            std::vector<Pair> pairs;
            std::vector<Id> trees;
            for (; !waiting_.empty() && pairs.size() < mostAtOnce; waiting_.pop_front()) {
                pairs.push_back(std::move(waiting_.front()));
                trees.insert(trees.end(), {pairs.back().before, pairs.back().after});
            }
            const auto read = reader_.Read(trees);
            const auto directoryOf = [&read](Id const& tree) -> Directory const& {
                const auto found = read.find(tree);
                if (found == read.end())
                    throw Problem("a directory is damaged or missing: " + DigitsOf(tree), findingsExitStatus);
                return found->second;
            };
            for (auto const& pair : pairs)
                Compare(pair, directoryOf(pair.before), directoryOf(pair.after));
        }
        std::sort(changes_.begin(), changes_.end(),
                  [](PathChange const& left, PathChange const& right) { return ComesBefore(left.path, right.path); });
        return std::move(changes_);
    }

private:
    /// Two directories at one path, which ends with "/" unless it is empty; null for none.
    struct Pair {
        std::string path;
        Id before;
        Id after;
    };

    void Enter(std::string path, Id const& before, Id const& after) {
        if (before == after || !(IsWanted(path) || wanted_.starts_with(path)))
            return;
        const auto [first, isNew] = seen_.try_emplace({before, after}, path);
        if (isNew)
            waiting_.push_back({std::move(path), before, after});
        else
            Add({KindOf(before, after), std::move(path), {}, {}, first->second});
    }

    void Compare(Pair const& pair, Directory const& before, Directory const& after) {
        const bool isEmpty = (pair.before.IsEmpty() ? after : before).entries.empty();
        if (isEmpty && (pair.before.IsEmpty() || pair.after.IsEmpty()) && !pair.path.empty())
            Add({KindOf(pair.before, pair.after), pair.path, {}, {}, {}});
        if (before.own && after.own && !before.own->IsLike(*after.own))
            Add({Kind::Mode, pair.path.empty() ? "." : pair.path.substr(0, pair.path.size() - 1), {}, {}, {}});
        auto old = before.entries.begin();
        auto now = after.entries.begin();
        while (old != before.entries.end() || now != after.entries.end()) {
            const bool isGone =
                now == after.entries.end() || (old != before.entries.end() && ComesBefore(old->name, now->name));
            const bool isNew = !isGone && (old == before.entries.end() || ComesBefore(now->name, old->name));
            CompareEntries(pair.path, isNew ? nullptr : &*old, isGone ? nullptr : &*now);
            old += isNew ? 0 : 1;
            now += isGone ? 0 : 1;
        }
    }

    void CompareEntries(std::string const& directory, Entry const* old, Entry const* now) {
        auto path = directory + (old != nullptr ? old : now)->name;
        const bool wasDirectory = old != nullptr && old->isDirectory;
        const bool isDirectory = now != nullptr && now->isDirectory;
        if (old != nullptr && now != nullptr && wasDirectory != isDirectory)
            Add({isDirectory ? Kind::FileBecameDirectory : Kind::DirectoryBecameFile, path, old->id, now->id, {}});
        else if (!wasDirectory && !isDirectory)
            CompareFiles(path, old, now);
        if (wasDirectory || isDirectory)
            Enter(path + '/', wasDirectory ? old->id : Id(), isDirectory ? now->id : Id());
    }

    void CompareFiles(std::string const& path, Entry const* old, Entry const* now) {
        const auto oldId = old == nullptr ? Id() : old->id;
        const auto newId = now == nullptr ? Id() : now->id;
        if (oldId != newId)
            Add({KindOf(oldId, newId), path, oldId, newId, {}});
        else if (old->attributes && now->attributes && !old->attributes->IsLike(*now->attributes))
            Add({Kind::Mode, path, {}, {}, {}});
    }

    static Kind KindOf(Id const& before, Id const& after) noexcept {
        return before.IsEmpty() ? Kind::Added : after.IsEmpty() ? Kind::Removed : Kind::Changed;
    }

    void Add(PathChange change) {
        if (IsWanted(change.path))
            changes_.push_back(std::move(change));
    }

    [[nodiscard]] bool IsWanted(std::string_view path) const noexcept {
        return wanted_.empty() ||
               (path.starts_with(wanted_) && (path.size() == wanted_.size() || path[wanted_.size()] == '/'));
    }

    TreeReader reader_;
    std::string_view wanted_;
    std::deque<Pair> waiting_;
    /// Where two directories stood against each other first.
    std::map<std::pair<Id, Id>, std::string> seen_;
    std::vector<PathChange> changes_;
};

} // namespace

std::string_view WordFor(Kind kind) noexcept {
    switch (kind) {
    case Kind::Added:
        return "added";
    case Kind::Removed:
        return "removed";
    case Kind::Changed:
        return "changed";
    case Kind::Mode:
        return "mode";
    case Kind::DirectoryBecameFile:
        return "directory became file";
    case Kind::FileBecameDirectory:
        return "file became directory";
    }
    return "";
}

std::vector<PathChange> FindChanges(IArchive& archive, Id const& before, Id const& after, std::string_view path) {
    return Comparison(archive, path).Run(before, after);
}

} // namespace vault
