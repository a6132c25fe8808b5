#include "repository/TreeFetch.h"

#include "KivArchive/ArchivedBlob.h"
#include "repository/ArchivedStorage.h"
#include "repository/Unreadable.h"

#include <KivVcs/Repository.h>

#include <algorithm>
#include <unordered_set>

namespace KivArchive {

/// Makes trees of the forms that were read, in a storage of its own.
class TreeFetch::Assembly {
public:
    explicit Assembly(TreeFetch& fetch) : fetch_(fetch), staging_(std::make_unique<KivVcs::MemObjectsStorage>()) {
        AddBlobs();
        for (auto const& [id, tree] : fetch.living_)
            staging_.AddTreeToStorage(tree);
    }

    cow_ptr<Tree> Make(Id const& root) {
        // On a stack of its own: nesting has no bound that a thread's stack would hold.
        std::vector<Id> open{root};
        while (!open.empty()) {
            Id const id = open.back();
            if (staging_.GetTreeFromStorage(id)) {
                open.pop_back();
                continue;
            }
            std::size_t const before = open.size();
            for (Link const& link : fetch_.forms_.at(id).links)
                if (link.type == ObjectType::Tree && !staging_.GetTreeFromStorage(link.id))
                    open.push_back(link.id);
            if (open.size() == before) {
                MakeOne(id, fetch_.forms_.at(id));
                open.pop_back();
            }
        }
        return staging_.GetTreeFromStorage(root);
    }

    /// Enters everything into the storages. @return false, entering nothing, if another thread was faster with some of it
    [[nodiscard]] bool Publish() const {
        ObjectSource& source = fetch_.source_;
        ObjectSource::Lock const lock(source.mutex_);
        for (auto const& tree : made_)
            if (source.FindTree(tree->GetId()))
                return false;
        for (auto const& blob : madeBlobs_)
            if (source.FindBlob(blob->GetId()))
                return false;
        for (auto const& blob : madeBlobs_)
            source.Enter(blob);
        for (auto const& tree : made_)
            source.Enter(tree);
        return true;
    }

private:
    void AddBlobs() {
        std::unordered_set<Id> ids;
        for (auto const& [id, form] : fetch_.forms_)
            for (Link const& link : form.links)
                if (link.type == ObjectType::Blob)
                    ids.insert(link.id);
        std::vector<Id> missing;
        {
            ObjectSource::Lock const lock(fetch_.source_.mutex_);
            for (Id const& id : ids) {
                if (cow_ptr<Blob> living = fetch_.source_.FindBlob(id))
                    staging_.AddBlobToStorage(std::move(living));
                else
                    missing.push_back(id);
            }
        }
        auto const group = std::make_shared<ContentGroup>(fetch_.source_.GetContents(), missing);
        for (Id const& id : missing) {
            madeBlobs_.push_back(KivVcs::immu::make<ArchivedBlob>(id, group));
            staging_.AddBlobToStorage(madeBlobs_.back());
        }
    }

    void MakeOne(Id const& id, Form const& form) {
        auto tree = KivVcs::immu::make<Tree>();
        Tree& made = *tree.write();
        for (Link const& link : form.links) {
            auto const name = KivVcs::FromUtf8(link.name);
            KivStringViewT<char16_t> const component = name;
            // A path could not lead there.
            if (component.IsEmpty() || component.Find(u"/") >= 0)
                ThrowUnreadable(Failure::Unrepresentable, "directory", id);
            if (link.type == ObjectType::Blob)
                made.AddObjectToTree<Blob>(&staging_, {&component, 1}, *staging_.GetBlobFromStorage(link.id));
            else
                made.AddObjectToTree<Tree>(&staging_, {&component, 1}, *staging_.GetTreeFromStorage(link.id));
        }
        // The last word on whether everything has been understood.
        if (!(made.GetId() == id))
            ThrowUnreadable(Failure::Unrepresentable, "directory", id);
        staging_.AddTreeToStorage(tree);
        made_.push_back(std::move(tree));
    }

    TreeFetch& fetch_;
    KivVcs::Repository staging_;
    std::vector<cow_ptr<Tree>> made_;
    std::vector<cow_ptr<Blob>> madeBlobs_;
};

cow_ptr<Tree> TreeFetch::Fetch(Id const& id) {
    std::vector<Id> level{id};
    for (std::size_t depth = 0; !level.empty(); ++depth) {
        if (depth > KivVcs::deepestLoadedNesting)
            ThrowUnreadable(Failure::Unrepresentable, "directory", id);
        FindLiving(level);
        ReadLevel(level);
        level = TakeSubtrees(level);
    }
    if (auto const found = living_.find(id); found != living_.end())
        return found->second;
    for (;;) {
        Assembly assembly(*this);
        cow_ptr<Tree> tree = assembly.Make(id);
        if (assembly.Publish())
            return tree;
        std::vector<Id> read;
        for (auto const& [treeId, form] : forms_)
            read.push_back(treeId);
        FindLiving(read);
        for (auto const& [treeId, living] : living_)
            forms_.erase(treeId);
        if (auto const found = living_.find(id); found != living_.end())
            return found->second;
    }
}

/// Takes those off @p level that are there.
void TreeFetch::FindLiving(std::vector<Id>& level) {
    ObjectSource::Lock const lock(source_.mutex_);
    std::erase_if(level, [this](Id const& id) {
        cow_ptr<Tree> tree = source_.FindTree(id);
        if (!tree)
            return false;
        source_.Enter(tree);
        living_.emplace(id, std::move(tree));
        return true;
    });
}

void TreeFetch::ReadLevel(std::vector<Id> const& level) {
    if (level.empty())
        return;
    ReadOutcome const outcome = source_.archive_->Read(level, [this](ArchivedObject const& object) {
        Form form;
        form.data.Append(object.data.data(), object.data.size());
        for (auto const& chunk : form.data.LockForRead())
            if (object.type != ObjectType::Tree || !ReadLinks(object.type, chunk, form.links))
                ThrowUnreadable(Failure::Unrepresentable, "directory", object.id);
        forms_.insert_or_assign(object.id, std::move(form));
    });
    if (!outcome.damaged.empty())
        ThrowUnreadable(Failure::Damaged, "directory", outcome.damaged.front());
    if (!outcome.missing.empty())
        ThrowUnreadable(Failure::Collected, "directory", outcome.missing.front());
}

/// The subtrees that @p level names and that have not been met yet.
std::vector<Id> TreeFetch::TakeSubtrees(std::vector<Id> const& level) const {
    std::unordered_set<Id> subtrees;
    for (Id const& id : level)
        for (Link const& link : forms_.at(id).links)
            if (link.type == ObjectType::Tree && !forms_.contains(link.id) && !living_.contains(link.id))
                subtrees.insert(link.id);
    return {subtrees.begin(), subtrees.end()};
}

} // namespace KivArchive
