#pragma once

// Commits, walks along their histories, and drafts of new ones.

#include "Values.h"

namespace KivVcs::JavaScript {

/// A commit that JavaScript holds.
class CommitHandle {
public:
    explicit CommitHandle(cow_ptr<Commit> commit) : commit_(std::move(commit)) {}

    static val Of(cow_ptr<Commit> commit) { return commit ? val(CommitHandle(std::move(commit))) : val::null(); }
    static cow_ptr<Commit> From(CommitHandle const* handle) { return handle == nullptr ? nullptr : handle->commit_; }

    [[nodiscard]] cow_ptr<Commit> const& Get() const { return commit_; }

    [[nodiscard]] std::u16string GetId() const { return ToJavaScript(commit_->GetId()); }
    [[nodiscard]] val GetParent() const { return Of(commit_->GetParent()); }
    [[nodiscard]] std::u16string GetAuthorName() const { return ToJavaScript(commit_->GetAuthorName()); }
    [[nodiscard]] std::u16string GetAuthorEmail() const { return ToJavaScript(commit_->GetAuthorEmail()); }
    [[nodiscard]] std::u16string GetDescription() const { return ToJavaScript(commit_->GetDescription()); }
    [[nodiscard]] double GetSeconds() const {
        return static_cast<double>(commit_->GetCommitTime().ToTimeT(TimeZone::Utc));
    }
    [[nodiscard]] double GetOffsetMinutes() const {
        return static_cast<double>(commit_->GetCommitTimezoneBias().GetTicks()) / static_cast<double>(ticksPerMinute);
    }
    [[nodiscard]] std::u16string GetTreeId() const {
        return commit_->GetCommitTree() ? ToJavaScript(commit_->GetCommitTree()->GetRootId()) : std::u16string();
    }
    [[nodiscard]] val GetPaths() const { return ToArray(Root().GetDeepBlobPaths()); }

    [[nodiscard]] val Find(std::u16string const& path) const {
        return Describe(Root().GetDeepObject(FromJavaScript(path)));
    }

    [[nodiscard]] val Read(std::u16string const& path) const {
        const auto blob = Root().GetDeepBlob(FromJavaScript(path));
        return blob ? ToUint8Array(blob->GetData()) : val::null();
    }

    /// The names in a directory, subdirectories first; null if there is no such directory.
    [[nodiscard]] val List(std::u16string const& directory) const {
        const auto tree =
            directory.empty() ? cow_ptr<Tree>::share(&Root()) : Root().GetDeepTree(FromJavaScript(directory));
        if (!tree)
            return val::null();
        val lists = val::array();
        lists.call<void>("push", ToArray(tree->GetLocalSubtreePaths()));
        lists.call<void>("push", ToArray(tree->GetLocalBlobPaths()));
        return lists;
    }

    [[nodiscard]] val GetDifferences(CommitHandle const* older, bool findRenames) const {
        val list = val::array();
        for (auto const& difference : Differences(RootOf(From(older)), RootOf(commit_), {.findRenames = findRenames})) {
            val item = val::object();
            item.set("kind", static_cast<int>(difference.kind));
            item.set("path", ToJavaScript(difference.path));
            item.set("oldPath", ToJavaScript(difference.oldPath));
            item.set("oldId", ToJavaScript(difference.oldId));
            item.set("newId", ToJavaScript(difference.newId));
            list.call<void>("push", item);
        }
        return list;
    }

private:
    [[nodiscard]] Tree const& Root() const {
        static cow_ptr<Tree> const empty = immu::make<Tree>();
        const auto root = RootOf(commit_);
        return root ? *root : *empty;
    }

    cow_ptr<Commit> commit_;
};

/// Where a walk along a history is.
class Walk {
public:
    explicit Walk(History const& history) : next_(history.begin()) {}

    /// The commit here, and one step on; null at the end.
    val Next() {
        if (next_ == History::Iterator())
            return val::null();
        val commit = CommitHandle::Of(*next_);
        ++next_;
        return commit;
    }

private:
    History::Iterator next_;
};

inline Walk WalkHistory(CommitHandle const& head, val const& path) {
    const History history(head.Get());
    return Walk(path.isNull() ? history : history.Changing(FromJavaScript(path.as<std::u16string>())));
}

/// A version while it is being put together; used up by `Commit` or `Store`. The repository outlives it.
class Draft {
public:
    Draft(Repository& repository, cow_ptr<Commit> parent, bool amend)
        : repository_(&repository), commit_(std::move(parent), amend) {}

    bool Add(std::u16string const& path, val const& bytes) {
        return static_cast<bool>(commit_.AddBlob(repository_, FromJavaScript(path), Blob(ToBuffer(bytes))));
    }
    bool AddObject(std::u16string const& path, std::u16string const& id) {
        return static_cast<bool>(commit_.AddObject(repository_, FromJavaScript(path), IdOf(id)));
    }
    bool Remove(std::u16string const& path) { return commit_.RemoveObject(repository_, FromJavaScript(path)); }

    /// An empty identifier means no directory at all.
    bool UseTree(std::u16string const& id) {
        auto root = repository_->GetTreeFromStorage(IdOf(id));
        if (!root && !id.empty())
            return false;
        commit_.ReplaceRoot(repository_, std::move(root));
        commit_.ResetState();
        return true;
    }

    [[nodiscard]] val Find(std::u16string const& path) const {
        const auto root = RootOf(commit_);
        return root ? Describe(root->GetDeepObject(FromJavaScript(path))) : val::null();
    }

    void SetAuthor(std::u16string const& name, std::u16string const& email) {
        commit_.SetAuthorName(FromJavaScript(name));
        commit_.SetAuthorEmail(FromJavaScript(email));
    }
    void SetDescription(std::u16string const& description) { commit_.SetDescription(FromJavaScript(description)); }

    /// Commits on the current branch, now.
    val DoCommit() { return CommitHandle::Of(repository_->DoCommit(commit_)); }

    /// Stores a version of another time, on no branch, if it has that identifier; any does if @p id is empty.
    val Store(double seconds, double offsetMinutes, std::u16string const& id) {
        commit_.SetCommitTime(Time::FromTimeT(static_cast<std::int64_t>(seconds), TimeZone::Utc));
        commit_.SetCommitTimezoneBias(TimeDelta(static_cast<std::int64_t>(offsetMinutes) * ticksPerMinute));
        if (!id.empty() && commit_.GetId() != IdOf(id))
            return val::null();
        return CommitHandle::Of(repository_->SyncWithStorage(immu::make<Commit>(commit_)));
    }

private:
    Repository* repository_;
    Commit commit_;
};

} // namespace KivVcs::JavaScript
