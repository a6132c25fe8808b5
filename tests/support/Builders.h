#pragma once

#include "support/Text.h"

#include <algorithm>
#include <map>
#include <random>
#include <sstream>

/// Makes objects from short descriptions, and describes objects.

namespace KivVcs {

inline Buffer BufferOf(std::string const& content) {
    Buffer data(0);
    data.Append(content.data(), content.size(), 1);
    return data;
}

inline Blob MakeBlob(std::string const& content) {
    return Blob(BufferOf(content));
}

/// Adds files written as "name=content directory/name=content" to a tree or a commit.
template <class Holder>
void AddFiles(Holder& holder, IRepository& repo, std::string const& files) {
    std::istringstream words(files);
    for (std::string word; words >> word;) {
        const auto equals = word.find('=');
        holder.AddBlob(&repo, Wide(word.substr(0, equals)), MakeBlob(word.substr(equals + 1)));
    }
}

/// A tree with such files; null for "-".
inline cow_ptr<Tree> MakeTree(IRepository& repo, std::string const& files) {
    cow_ptr<Tree> tree;
    if (files != "-")
        AddFiles(*tree.write(), repo, files);
    return tree;
}

/// Edits a tree at random, with few names and contents, so that every kind of conflict comes up.
inline cow_ptr<Tree> EditAtRandom(std::mt19937& random, IRepository& repo, cow_ptr<Tree> tree) {
    const auto below = [&random](unsigned limit) { return static_cast<unsigned>(random() % limit); };
    for (unsigned edits = below(6); edits-- > 0;) {
        std::string path(1, "abc"[below(3)]);
        for (unsigned depth = below(3); depth-- > 0;)
            path += std::string("/") + "abc"[below(3)];
        if (below(3) == 0)
            tree.write()->RemoveObject(&repo, Wide(path));
        else
            tree.write()->AddBlob(&repo, Wide(path), MakeBlob(std::string(1, "123"[below(3)])));
    }
    return tree;
}

inline void ListFiles(Tree const& tree, std::string const& prefix, std::vector<std::string>& files) {
    for (auto const& name : tree.GetLocalBlobPaths()) {
        const KivStringT<char> content = Helpers::StringAFromBuffer(tree.GetLocalBlob(name)->GetData());
        files.push_back(prefix + Narrow(name) + "=" + content.GetString());
    }
    for (auto const& name : tree.GetLocalSubtreePaths()) {
        auto const subtree = tree.GetLocalTree(name);
        if (subtree->IsEmpty())
            files.push_back(prefix + Narrow(name) + "/");
        ListFiles(*subtree, prefix + Narrow(name) + "/", files);
    }
}

/// The inverse of `MakeTree`, sorted; an empty directory is written as "name/".
inline std::string Files(cow_ptr<Tree> const& tree) {
    if (!tree)
        return "-";
    std::vector<std::string> files;
    ListFiles(*tree, "", files);
    std::sort(files.begin(), files.end());
    return Joined(files);
}

/// The description of a commit, which is its name in tests.
inline std::string NameOf(cow_ptr<Commit> const& commit) {
    return commit ? Narrow(commit->GetDescription()) : "-";
}

/// Makes commits with their names as descriptions, each with its parent's files and a file of its own name.
class GrownHistory {
public:
    explicit GrownHistory(Repository& repo) : repo_(repo) {}

    /// Stores commits written as "root child:root other:root".
    void Grow(std::string const& graph) {
        std::istringstream words(graph);
        for (std::string word; words >> word;) {
            const auto colon = word.find(':');
            const std::string name = word.substr(0, colon);
            Commit commit(colon == std::string::npos ? nullptr : commits_.at(word.substr(colon + 1)), false);
            commit.SetDescription(Wide(name));
            commit.AddBlob(&repo_, Wide(name), MakeBlob(name));
            commits_[name] = repo_.SyncWithStorage(immu::make<Commit>(commit));
        }
    }

    /// Points branches, written as "master=child topic=other", at commits; makes those that do not exist.
    void Point(std::string const& branches) {
        std::istringstream words(branches);
        for (std::string word; words >> word;) {
            const auto equals = word.find('=');
            const auto branch = Wide(word.substr(0, equals));
            auto const& commit = commits_.at(word.substr(equals + 1));
            if (!repo_.MoveBranchTo(branch, commit))
                repo_.CreateBranch(branch, commit);
        }
    }

    cow_ptr<Commit> const& operator[](std::string const& name) const { return commits_.at(name); }

    /// Releases all commits.
    void Forget() { commits_.clear(); }

    /// Every branch with the line of commits below it, newest first: "master=c/b/a topic=d/a".
    [[nodiscard]] std::string Branches() const {
        std::map<std::string, std::string> lines;
        for (auto const& [name, head] : std::as_const(repo_).GetStorage()->GetRefs()) {
            std::string& line = lines[Narrow(name)];
            for (Commit const* commit = head.get(); commit != nullptr; commit = commit->GetParent().get())
                line += "/" + Narrow(commit->GetDescription());
        }
        std::vector<std::string> words;
        for (auto const& [name, line] : lines)
            words.push_back(name + "=" + line.substr(line.empty() ? 0 : 1));
        return Joined(words);
    }

    /// The numbers of stored commits, trees and blobs.
    [[nodiscard]] std::string Counts() const {
        return std::to_string(repo_.GetCommitCount()) + " " + std::to_string(repo_.GetTreeCount()) + " " +
               std::to_string(repo_.GetBlobCount());
    }

private:
    Repository& repo_;
    std::map<std::string, cow_ptr<Commit>> commits_;
};

} // namespace KivVcs
