#pragma once

#include <KivVcs/Id.h>

#include <algorithm>
#include <map>
#include <set>
#include <string>
#include <vector>

/// A plain model of merging again and again, which never forgets a version.

namespace KivArchive {

using FilesByPath = std::map<std::string, std::string>;
using Paths = std::set<std::string>;

/// Whether one of the paths is the other one or lies below it.
inline bool AreRelated(std::string const& one, std::string const& other) {
    std::string const& longer = one.size() < other.size() ? other : one;
    std::string const& shorter = one.size() < other.size() ? one : other;
    return (longer + "/").compare(0, shorter.size() + 1, shorter + "/") == 0;
}

inline bool AnyRelated(Paths const& paths, std::string const& path) {
    return std::any_of(paths.begin(), paths.end(), [&](auto const& one) { return AreRelated(one, path); });
}

/// A version, whichever parties know it.
struct ModelVersion {
    FilesByPath files;
    /// The files with contents that no version had before.
    Paths written;
    /// What was edited or asked about, and what else differed between the sides that it merged.
    Paths decided;
    Paths merged;
};

using ModelVersions = std::map<KivVcs::Id, ModelVersion>;

inline std::string ContentOf(FilesByPath const& files, std::string const& path) {
    auto const found = files.find(path);
    return found == files.end() ? "" : found->second;
}

inline Paths DifferingPaths(FilesByPath const& left, FilesByPath const& right) {
    Paths paths;
    for (auto const* files : {&left, &right})
        for (auto const& [path, content] : *files)
            if (ContentOf(left, path) != ContentOf(right, path))
                paths.insert(path);
    return paths;
}

/// What versions contain, as far as one party knows.
class Knowledge {
public:
    using Id = KivVcs::Id;

    void Learn(Id const& version, Id const& contained) {
        if (!(version == contained) && !contained.IsEmpty())
            contained_[version].insert(contained);
    }
    void Learn(Knowledge const& other) {
        for (auto const& [version, contained] : other.contained_)
            contained_[version].insert(contained.begin(), contained.end());
    }

    [[nodiscard]] std::set<Id> AllIn(Id const& version) const {
        std::set<Id> all{version};
        for (std::vector<Id> open{version}; !open.empty();) {
            Id const id = open.back();
            open.pop_back();
            if (auto const known = contained_.find(id); known != contained_.end())
                for (Id const& other : known->second)
                    if (all.insert(other).second)
                        open.push_back(other);
        }
        return all;
    }
    [[nodiscard]] bool Contains(Id const& one, Id const& other) const { return AllIn(one).count(other) != 0; }

private:
    std::map<Id, std::set<Id>> contained_;
};

/// Two versions that a party is about to merge, with what it knows of them.
class ModelMerge {
public:
    using Id = KivVcs::Id;

    ModelMerge(ModelVersions const& versions, Knowledge const& knowledge, Id const& left, Id const& right)
        : versions_(versions), knowledge_(knowledge), left_(left), right_(right), inLeft_(knowledge.AllIn(left)),
          inRight_(knowledge.AllIn(right)) {}

    [[nodiscard]] bool LeftContainsRight() const { return inLeft_.count(right_) != 0; }
    [[nodiscard]] bool RightContainsLeft() const { return inRight_.count(left_) != 0; }
    [[nodiscard]] FilesByPath const& LeftFiles() const { return versions_.at(left_).files; }
    [[nodiscard]] FilesByPath const& RightFiles() const { return versions_.at(right_).files; }
    [[nodiscard]] Paths AllPaths() const {
        Paths paths;
        for (auto const* files : {&LeftFiles(), &RightFiles()})
            for (auto const& [path, content] : *files)
                paths.insert(path);
        return paths;
    }

    /// Whether each side has decided about a path where the other side does not contain the decision; with @p orMerged,
    /// also whether it has merged versions that differ there.
    [[nodiscard]] bool BothChanged(std::string const& path, bool orMerged) const {
        return HasChanged(inLeft_, inRight_, path, orMerged) && HasChanged(inRight_, inLeft_, path, orMerged);
    }
    /// Whether versions that contain each other differ there, so that neither is the older one.
    [[nodiscard]] bool IsInDoubt(std::string const& path) const {
        for (Id const& one : inLeft_) {
            if (inRight_.count(one) == 0 || versions_.count(one) == 0)
                continue;
            auto const below = knowledge_.AllIn(one);
            for (Id const& other : below)
                if (!(one == other) && versions_.count(other) != 0 && FilesAt(one, path) != FilesAt(other, path) &&
                    knowledge_.Contains(other, one))
                    return true;
        }
        return false;
    }
    /// What is wrong with taking one side's entry for the result; empty if nothing is.
    [[nodiscard]] std::string FaultOfTaking(std::string const& path, std::string const& taken) const {
        std::string const one = ContentOf(LeftFiles(), path);
        std::string const other = ContentOf(RightFiles(), path);
        if (taken != one && taken != other)
            return "what no side had";
        if (one == other)
            return {};
        auto const& winner = taken == one ? inLeft_ : inRight_;
        auto const& loser = taken == one ? inRight_ : inLeft_;
        std::string const lost = taken == one ? other : one;
        if (!lost.empty() && !HasSeen(winner, lost))
            return "a lost edit";
        return HasChanged(winner, loser, path, true) ? "" : "brought back";
    }

private:
    [[nodiscard]] FilesByPath FilesAt(Id const& version, std::string const& path) const {
        FilesByPath files = versions_.at(version).files;
        for (auto file = files.begin(); file != files.end();)
            file = AreRelated(file->first, path) ? std::next(file) : files.erase(file);
        return files;
    }
    [[nodiscard]] bool HasSeen(std::set<Id> const& all, std::string const& content) const {
        return std::any_of(all.begin(), all.end(), [&](Id const& id) {
            auto const version = versions_.find(id);
            return version != versions_.end() && version->second.written.count(content) != 0;
        });
    }
    [[nodiscard]] bool HasChanged(std::set<Id> const& all, std::set<Id> const& since, std::string const& path,
                                  bool orMerged) const {
        return std::any_of(all.begin(), all.end(), [&](Id const& id) {
            auto const version = versions_.find(id);
            return version != versions_.end() && since.count(id) == 0 &&
                   (AnyRelated(version->second.decided, path) ||
                    (orMerged && AnyRelated(version->second.merged, path)));
        });
    }

    ModelVersions const& versions_;
    Knowledge const& knowledge_;
    Id const left_;
    Id const right_;
    std::set<Id> const inLeft_;
    std::set<Id> const inRight_;
};

} // namespace KivArchive
