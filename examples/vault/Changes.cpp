#include "Changes.h"

#include "Names.h"

#include <KivArchive/Listings.h>
#include <algorithm>
#include <set>

namespace vault {

using KivVcs::ChangeKind;
using KivVcs::Difference;
using Kind = PathChange::Kind;

namespace {

/// Attributes that differ, of what lies in one directory.
struct AttributeChange {
    std::string directory;
    Id before;
    Id after;
};

Kind KindOf(ChangeKind kind) noexcept {
    switch (kind) {
    case ChangeKind::Added:
        return Kind::Added;
    case ChangeKind::Removed:
        return Kind::Removed;
    case ChangeKind::DirectoryBecameFile:
        return Kind::DirectoryBecameFile;
    case ChangeKind::FileBecameDirectory:
        return Kind::FileBecameDirectory;
    case ChangeKind::Unchanged:
    case ChangeKind::Changed:
    case ChangeKind::Renamed:
        break;
    }
    return Kind::Changed;
}

/// Whether one of the paths lies below @p directory, which ends with "/".
bool HasBelow(std::set<std::string> const& paths, std::string const& directory) {
    const auto next = paths.lower_bound(directory);
    return next != paths.end() && next->starts_with(directory);
}

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

std::vector<PathChange> FindChanges(IArchive& archive, Id const& before, Id const& after) {
    std::vector<PathChange> changes;
    std::vector<AttributeChange> attributes;
    std::vector<Id> contents;
    std::set<std::string> paths;
    for (auto const& difference : KivArchive::ListDifferences(archive, before, after, {}, nullptr).differences) {
        auto path = KivVcs::ToUtf8(difference.path);
        const auto nameAt = path.find_last_of('/') + 1;
        if (IsOwn(std::string_view(path).substr(nameAt))) {
            attributes.push_back({path.substr(0, nameAt), difference.oldId, difference.newId});
            for (auto const& id : {difference.oldId, difference.newId}) {
                if (!id.IsEmpty())
                    contents.push_back(id);
            }
        } else {
            paths.insert(path);
            changes.push_back({KindOf(difference.kind), std::move(path), difference.oldId, difference.newId});
        }
    }
    std::unordered_map<Id, AttributeMap> read;
    archive.Read(contents, [&read](KivArchive::ArchivedObject const& object) {
        read[object.id] = ReadAttributes({reinterpret_cast<char const*>(object.data.data()), object.data.size()});
    });
    for (auto const& [directory, oldId, newId] : attributes) {
        if (oldId.IsEmpty() || newId.IsEmpty()) {
            // An older release knew no attributes; a directory that has files comes and goes with them.
            if (!directory.empty() && read[oldId.IsEmpty() ? newId : oldId].size() == 1 && !HasBelow(paths, directory))
                changes.push_back({oldId.IsEmpty() ? Kind::Added : Kind::Removed, directory, {}, {}});
            continue;
        }
        auto const& then = read[oldId];
        for (auto const& [name, now] : read[newId]) {
            const auto earlier = then.find(name);
            auto path = directory + name;
            if (earlier == then.end() || earlier->second.IsLike(now) || paths.contains(path))
                continue;
            if (name.empty())
                path = directory.empty() ? "." : directory.substr(0, directory.size() - 1);
            changes.push_back({Kind::Mode, std::move(path), {}, {}});
        }
    }
    std::sort(changes.begin(), changes.end(),
              [](PathChange const& left, PathChange const& right) { return ComesBefore(left.path, right.path); });
    return changes;
}

} // namespace vault
