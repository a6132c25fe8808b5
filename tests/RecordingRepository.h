#pragma once

#include "KivVcs/KivVcs.h"

#include <algorithm>
#include <map>
#include <sstream>
#include <string>

namespace KivVcs {

inline std::string Narrow(KivStringViewT<char16_t> text) {
    return std::string(text.begin(), text.end());
}

inline KivStringT<char16_t> Wide(std::string const& text) {
    return KivStringT<char>(text.data(), static_cast<int>(text.size()));
}

inline Blob MakeBlob(std::string const& content) {
    Buffer data(0);
    data.Append(content.data(), content.size(), 1);
    return Blob(std::move(data));
}

/// A tree told as in "name=content directory/name=content"; null for "-".
inline cow_ptr<Tree> MakeTree(IRepository& repo, std::string const& files) {
    cow_ptr<Tree> tree;
    if (files == "-")
        return tree;
    Tree* const writable = tree.write();
    std::istringstream words(files);
    for (std::string word; words >> word;) {
        const auto equals = word.find('=');
        writable->AddBlob(&repo, Wide(word.substr(0, equals)), MakeBlob(word.substr(equals + 1)));
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

inline std::string Joined(std::vector<std::string> const& words) {
    std::string text;
    for (auto const& word : words)
        text += (text.empty() ? "" : " ") + word;
    return text;
}

/// The inverse of `MakeTree`, sorted; an empty directory shows as "name/".
inline std::string Files(cow_ptr<Tree> const& tree) {
    if (!tree)
        return "-";
    std::vector<std::string> files;
    ListFiles(*tree, "", files);
    std::sort(files.begin(), files.end());
    return Joined(files);
}

/// The description of a commit, by which the tests call it.
inline std::string NameOf(cow_ptr<Commit> const& commit) {
    return commit ? Narrow(commit->GetDescription()) : "-";
}

/// A host that hands out the packed forms of what a repository stores.
class PackedFormsOf {
public:
    explicit PackedFormsOf(Repository const& repo) : repo_(repo) {}

    PortableVersion::Delegate<StreamIO(Id const&)> Loader() {
        return [this](Id const& id) {
            for (cow_ptr<Object> const& stored :
                 {cow_ptr<Object>(repo_.GetTreeFromStorage(id)), cow_ptr<Object>(repo_.GetBlobFromStorage(id)),
                  cow_ptr<Object>(repo_.GetCommitFromStorage(id))}) {
                if (stored)
                    return StreamIO(MemStream::CreateOnRef(lent_[id] = stored->GetPackedData()));
            }
            return StreamIO();
        };
    }

private:
    Repository const& repo_;
    std::unordered_map<Id, Buffer> lent_;
};

/// Tells in order which overridable operations are called, and fails on request.
class RecordingRepository : public Repository {
public:
    using Repository::Repository;

    /// The calls since the last time.
    std::string TakeCalls() { return Joined(std::exchange(calls_, {})); }
    /// The operation of that name throws from now on; none for the empty text.
    void Break(std::string operation) { broken_ = std::move(operation); }

    using Repository::SyncWithStorage;
    cow_ptr<Commit> DoCommit(Commit& commit) override { return Recorded("DoCommit").Repository::DoCommit(commit); }
    cow_ptr<Commit> GetHead() const override { return Recorded("GetHead()").Repository::GetHead(); }
    cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const override {
        return Recorded("GetHead(" + Narrow(branch) + ")").Repository::GetHead(branch);
    }
    KivStringT<char16_t> GetCurentBranch() const override {
        return Recorded("GetCurentBranch").Repository::GetCurentBranch();
    }
    cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) override {
        return Recorded("Sync(" + NameOf(commit) + ")").Repository::SyncWithStorage(commit);
    }
    void UpdateStorage() override { Recorded("UpdateStorage").Repository::UpdateStorage(); }
    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return Recorded("GetCommonBase(" + NameOf(first) + "," + NameOf(second) + ")")
            .Repository::GetCommonBase(first, second);
    }
    bool CreateBranch(KivStringViewT<char16_t> branch, cow_ptr<Commit> head) override {
        return Recorded("CreateBranch(" + Narrow(branch) + "," + NameOf(head) + ")")
            .Repository::CreateBranch(branch, head);
    }
    bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) override {
        return Recorded("MoveBranchTo(" + Narrow(branch) + "," + NameOf(commit) + ")")
            .Repository::MoveBranchTo(branch, commit);
    }
    bool FastForwardMerge(cow_ptr<Commit> commit) override {
        return Recorded("FastForwardMerge").Repository::FastForwardMerge(commit);
    }
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override {
        return Recorded("Merge3Way").Repository::Merge3Way(commit, resolvers);
    }

private:
    RecordingRepository const& Recorded(std::string call) const {
        if (!broken_.empty() && call.starts_with(broken_))
            throw std::runtime_error(call);
        calls_.push_back(std::move(call));
        return *this;
    }
    RecordingRepository& Recorded(std::string call) {
        (void)std::as_const(*this).Recorded(std::move(call));
        return *this;
    }

    mutable std::vector<std::string> calls_;
    std::string broken_;
};

/// Grows commits with the given names as descriptions, each with a file of its name on top of its parent's files.
class History {
public:
    explicit History(Repository& repo) : repo_(repo) {}

    /// Commits told as in "root child:root other:root", each stored.
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

    /// Branches told as in "master=child topic=other", made if there are none of that name.
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

    /// Lets go of all commits.
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
