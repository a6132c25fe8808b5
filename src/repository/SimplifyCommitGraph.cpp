#include "KivVcs/Repository.h"

#include "commit/Ancestors.h"
#include "repository/CommitSet.h"
#include "repository/CommonBaseIndex.h"

#include <cstring>
#include <typeinfo>
#include <unordered_map>
#include <unordered_set>

namespace KivVcs {

namespace {

struct Branch {
    KivStringT<char16_t> name;
    cow_ptr<Commit> head;
};

/// A commit of the simplified graph.
struct KeptCommit {
    /// The branches whose head it is.
    std::vector<Branch const*> branches;
    /// The kept commits whose nearest kept ancestor it is.
    std::vector<Id> children;
    bool hasParent = false;
    /// Whether its own nearest kept ancestor has been looked for.
    bool isLinked = false;
};

/// Hashes an identifier by the beginning of its digest, which is random enough as it is.
struct HashByDigest {
    std::size_t operator()(Id const& id) const noexcept {
        Id::Digest const* const digest = id.GetDigest();
        if (digest == nullptr)
            return id.Hash();
        std::size_t hash = 0;
        std::memcpy(&hash, digest->data(), sizeof hash);
        return hash;
    }
};

using KeptCommits = std::unordered_map<Id, KeptCommit, HashByDigest>;

} // namespace

/// Rewrites the history of a repository's branches. Nothing of it may be alive when the storage is purged.
class Repository::GraphSimplification {
public:
    GraphSimplification(Repository& repository, IObjectsStorage& storage) : repository_(repository), storage_(storage) {
        for (auto const& [name, head] : storage.GetRefs())
            branches_.push_back({name, head});
        for (auto const& branch : branches_) {
            if (branch.head)
                kept_[branch.head->GetId()].branches.push_back(&branch);
        }
    }

    [[nodiscard]] std::vector<cow_ptr<Commit>> Heads() const {
        std::vector<cow_ptr<Commit>> heads;
        for (auto const& branch : branches_)
            heads.push_back(branch.head);
        return heads;
    }

    /// Keeps every commit at which the histories of two heads meet. These are the common bases of every two heads as
    /// long as commits with equal identifiers have equal ancestors, so that histories that have met stay together.
    /// @return false, keeping none, if they do not, as may be with the identifiers of hosts' classes
    bool KeepMeetings() {
        if (kept_.size() < 2)
            return true;
        CommitSet visited;
        std::unordered_set<Commit const*> compared;
        std::vector<Id> meetings;
        for (auto const& branch : branches_) {
            for (Commit const& commit : Ancestors(branch.head.get())) {
                Commit const* const met = visited.Insert(commit);
                if (met == nullptr)
                    continue;
                if (!HaveEqualAncestors(*met, commit, compared))
                    return false;
                meetings.push_back(commit.GetId());
                break;
            }
        }
        for (auto& id : meetings)
            kept_.try_emplace(std::move(id));
        return true;
    }

    /// Keeps the common base of every two heads, as `GetCommonBase` returns it.
    void KeepCommonBases() {
        for (auto first = branches_.begin(); first != branches_.end(); ++first) {
            for (auto second = std::next(first); second != branches_.end(); ++second) {
                if (const auto base = repository_.GetCommonBase(first->head, second->head))
                    kept_.try_emplace(base->GetId());
            }
        }
    }

    /// Links every kept commit in the history of a stored head to its nearest kept ancestor.
    void Link() {
        for (auto kept = kept_.begin(); kept != kept_.end(); ++kept) {
            if (kept->second.branches.empty())
                continue;
            if (const auto head = storage_.GetCommit(kept->first))
                LinkChain(kept, *head);
        }
    }

    /// Stores the kept commits anew, each with the nearest kept ancestor as parent, and moves the branches.
    void Rebuild() const {
        for (auto const& [id, kept] : kept_) {
            if (!kept.hasParent)
                RebuildFrom(id);
        }
    }

private:
    /// @param compared the other objects of visited commits that have been found to have equal ancestors
    static bool HaveEqualAncestors(Commit const& visited, Commit const& other,
                                   std::unordered_set<Commit const*>& compared) {
        AncestorIterator left(&visited);
        AncestorIterator right(&other);
        while (left != right && compared.insert(right.Get()).second) {
            ++left;
            ++right;
            if (left == right)
                return true;
            if (!left || !right || !left->HasSameId(*right))
                return false;
        }
        return true;
    }

    void LinkChain(KeptCommits::iterator child, Commit const& head) {
        for (AncestorIterator commit(&head); ++commit && !child->second.isLinked;) {
            const auto kept = kept_.find(commit->GetId());
            if (kept == kept_.end())
                continue;
            kept->second.children.push_back(child->first);
            child->second.hasParent = true;
            child->second.isLinked = true;
            child = kept;
        }
        child->second.isLinked = true;
    }

    /// Depth-first, on a stack of its own since a history may keep any number of commits.
    void RebuildFrom(Id const& root) const {
        struct Level {
            KeptCommit const* kept;
            cow_ptr<Commit> rebuilt;
            std::size_t nextChild = 0;
        };
        std::vector<Level> levels;
        const auto open = [&](Id const& id, cow_ptr<Commit> const& parent) {
            if (auto commit = storage_.GetCommit(id)) {
                auto const& kept = kept_.at(id);
                levels.push_back({&kept, RebuildCommit(std::move(commit), parent, kept)});
            }
        };
        open(root, nullptr);
        while (!levels.empty()) {
            Level& level = levels.back();
            if (level.nextChild == level.kept->children.size())
                levels.pop_back();
            else
                open(level.kept->children[level.nextChild++], level.rebuilt);
        }
    }

    cow_ptr<Commit> RebuildCommit(cow_ptr<Commit> commit, cow_ptr<Commit> const& parent, KeptCommit const& kept) const {
        const cow_ptr<Commit> old = commit;
        commit.write()->SetParent(parent);
        auto rebuilt = repository_.SyncWithStorage(std::move(commit));
        repository_.AnnounceRewrite(old, rebuilt);
        for (Branch const* const branch : kept.branches) {
            if (repository_.BranchExist(branch->name))
                repository_.MoveBranchTo(branch->name, rebuilt);
            else
                repository_.CreateBranch(branch->name, rebuilt);
        }
        return rebuilt;
    }

    Repository& repository_;
    IObjectsStorage& storage_;
    std::vector<Branch> branches_;
    KeptCommits kept_;
};

namespace {

/// Lets a repository look common bases up in an index as long as this object lives.
class CommonBaseLease {
public:
    CommonBaseLease(CommonBaseIndex const*& current, CommonBaseIndex const& index) noexcept
        : current_(current), former_(std::exchange(current, &index)) {}
    CommonBaseLease(CommonBaseLease const&) = delete;
    CommonBaseLease& operator=(CommonBaseLease const&) = delete;
    ~CommonBaseLease() { current_ = former_; }

private:
    CommonBaseIndex const*& current_;
    CommonBaseIndex const* former_;
};

} // namespace

bool Repository::SimplifyCommitGraph(bool purge) {
    if (storage_ == nullptr)
        return false;
    {
        GraphSimplification simplification(*this, *storage_);
        if (typeid(*this) != typeid(Repository) || !simplification.KeepMeetings()) {
            // A host's `GetCommonBase` is called for every pair, and may call that of this class. Without an index,
            // each call would follow both histories; and the only place from which that call can get the index is the
            // repository.
            const CommonBaseIndex index(simplification.Heads());
            const CommonBaseLease lease(commonBases_, index);
            simplification.KeepCommonBases();
        }
        simplification.Link();
        simplification.Rebuild();
    }
    if (purge)
        UpdateStorage();
    return true;
}

} // namespace KivVcs
