#include "repository/TreeFetch.h"

#include "Changes.h"
#include "KivArchive/ArchivedBlob.h"
#include "PackedForms.h"
#include "repository/ArchivedStorage.h"
#include "repository/Unreadable.h"

#include <KivVcs/Repository.h>

#include <algorithm>
#include <unordered_set>

namespace KivArchive {

/// Makes trees from the forms that were read, in a storage of its own.
class TreeFetch::Assembly {
public:
    explicit Assembly(TreeFetch const& fetch) : fetch_(fetch), staging_(std::make_unique<KivVcs::MemObjectsStorage>()) {
        AddBlobs();
        for (auto const& [id, tree] : fetch.living_)
            staging_.AddTreeToStorage(tree);
        // `Deserialize` makes no tree without entries.
        for (auto const& [id, form] : fetch.forms_)
            if (form.entries.empty())
                staging_.AddTreeToStorage(KivVcs::immu::make<Tree>());
    }

    [[nodiscard]] cow_ptr<Tree> Make(Id const& root) {
        cow_ptr<Tree> tree = Tree::Deserialize(root, &staging_, [this](Id const& id) { return OpenForm(id); });
        // Only an equal identifier proves that everything was understood.
        if (!tree || !(tree->GetId() == root))
            ThrowUnreadable(Failure::Unrepresentable, "directory", root);
        return tree;
    }

    /// Enters everything into the storages. @return false, entering nothing, if another thread has entered some of it
    [[nodiscard]] bool Publish() const {
        ObjectSource& source = fetch_.source_;
        auto const& trees = std::as_const(staging_).GetStorage()->GetTrees();
        ObjectSource::Lock const lock(source.mutex_);
        for (auto const& [id, tree] : trees)
            if (!fetch_.living_.contains(id) && source.FindTree(id))
                return false;
        for (auto const& blob : madeBlobs_)
            if (source.FindBlob(blob->GetId()))
                return false;
        for (auto const& blob : madeBlobs_)
            source.Enter(blob);
        for (auto const& [id, tree] : trees)
            source.Enter(tree);
        return true;
    }

private:
    void AddBlobs() {
        std::unordered_set<Id> ids;
        for (auto const& [id, form] : fetch_.forms_)
            for (Entry const& entry : form.entries)
                if (!entry.isTree)
                    ids.insert(entry.id);
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
            madeBlobs_.emplace_back(KivVcs::immu::make<ArchivedBlob>(DigestOf(id), group));
            staging_.AddBlobToStorage(madeBlobs_.back());
        }
    }

    [[nodiscard]] StreamIO OpenForm(Id const& id) const {
        auto const form = fetch_.forms_.find(id);
        if (form == fetch_.forms_.end())
            return {};
        std::string const header = "tree " + std::to_string(form->second.data.GetSize());
        Buffer packed;
        packed.Append(header.c_str(), header.size() + 1);
        packed.Append(form->second.data);
        return StreamIO(KivVcs::MemStream::CreateOnCopy(std::move(packed)));
    }

    TreeFetch const& fetch_;
    KivVcs::Repository staging_;
    std::vector<cow_ptr<Blob>> madeBlobs_;
};

std::vector<cow_ptr<Tree>> TreeFetch::Fetch(std::span<const Id> ids) {
    ReadForms({ids.begin(), ids.end()});
    for (;;) {
        Assembly assembly(*this);
        std::vector<cow_ptr<Tree>> trees;
        for (Id const& id : ids)
            trees.push_back(assembly.Make(id));
        if (assembly.Publish())
            return trees;
        std::vector<Id> read;
        for (auto const& [id, form] : forms_)
            read.push_back(id);
        FindLiving(read);
        for (auto const& [id, living] : living_)
            forms_.erase(id);
    }
}

void TreeFetch::ReadForms(std::vector<Id> level) {
    for (std::size_t depth = 0; !level.empty(); ++depth) {
        if (depth > KivVcs::deepestLoadedNesting)
            ThrowUnreadable(Failure::Unrepresentable, "directory", level.front());
        ReportProgress(progress_, {"loading directories", forms_.size(), 0}, {});
        FindLiving(level);
        ReadLevel(level);
        level = TakeSubtrees(level);
    }
}

/// Takes out of @p level what the storages have.
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

TreeFetch::Form TreeFetch::ReadForm(ArchivedObject const& object) {
    Form form;
    form.data.Append(object.data.data(), object.data.size());
    form.data = Joined(form.data);
    PackedEntries entries(BytesOf(form.data));
    while (entries.Next())
        form.entries.push_back({entries.Get().isTree, entries.Get().name, entries.Get().GetId()});
    if (object.type != ObjectType::Tree || !entries.AreSound())
        ThrowUnreadable(Failure::Unrepresentable, "directory", object.id);
    return form;
}

void TreeFetch::ReadLevel(std::vector<Id> const& level) {
    if (level.empty())
        return;
    ReadOutcome const outcome = source_.archive_->Read(
        level, [this](ArchivedObject const& object) { forms_.insert_or_assign(object.id, ReadForm(object)); });
    if (!outcome.damaged.empty())
        ThrowUnreadable(Failure::Damaged, "directory", outcome.damaged.front());
    if (!outcome.missing.empty())
        ThrowUnreadable(Failure::Collected, "directory", outcome.missing.front());
}

/// The subtrees that @p level names and that have not been met yet.
std::vector<Id> TreeFetch::TakeSubtrees(std::vector<Id> const& level) const {
    std::unordered_set<Id> subtrees;
    for (Id const& id : level)
        for (Entry const& entry : forms_.at(id).entries)
            if (entry.isTree && !forms_.contains(entry.id) && !living_.contains(entry.id))
                subtrees.insert(entry.id);
    return {subtrees.begin(), subtrees.end()};
}

} // namespace KivArchive
