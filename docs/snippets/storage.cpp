// Keeps versions as packed forms and makes a repository of them again: what docs/storage.md and docs/formats.md show.

#include <KivVcs/KivVcs.h>

#include <map>
#include <string>
#include <unordered_map>

using namespace KivVcs;

namespace {

/// Stands for files, a database or a server: packed forms by identifier, and the heads of branches by name.
struct Vault {
    std::unordered_map<Id, Buffer> objects;
    std::map<std::string, Id> heads;
};

void Save(Vault& vault, Repository const& repository) {
    IObjectsStorage const& storage = *repository.GetStorage();
    const auto keep = [&vault](Id const& id, Object const& object) {
        vault.objects.try_emplace(id, object.GetPackedData());
    };
    for (auto const& [id, blob] : storage.GetBlobs())
        keep(id, *blob);
    for (auto const& [id, tree] : storage.GetTrees())
        keep(id, *tree);
    for (auto const& [id, commit] : storage.GetCommits())
        keep(id, *commit);
    vault.heads["master"] = repository.GetHead(u"master")->GetId();
}

StreamIO Open(Vault& vault, Id const& id) {
    const auto found = vault.objects.find(id);
    return found == vault.objects.end() ? StreamIO() : StreamIO(MemStream::CreateOnRef(found->second));
}

cow_ptr<Commit> LoadOne(Repository& repository, Id const& id,
                        PortableVersion::Delegate<StreamIO(Id const&)> const& loader) {
    Id parentId;
    cow_ptr<Commit> commit = Commit::Deserialize(id, parentId, &repository, loader);
    commit.write()->SetParent(repository.GetCommitFromStorage(parentId));
    commit = repository.SyncWithStorage(commit);
    return commit;
}

cow_ptr<Commit> Load(Repository& repository, Vault& vault, Id const& head) {
    const auto loader = [&vault](Id const& id) { return Open(vault, id); };

    std::vector<cow_ptr<Commit>> line;
    for (Id id = head, parentId; !id.IsEmpty(); id = std::exchange(parentId, Id()))
        line.push_back(Commit::Deserialize(id, parentId, &repository, loader));

    cow_ptr<Commit> parent;
    for (; !line.empty(); line.pop_back()) {
        line.back().write()->SetParent(parent);
        parent = repository.SyncWithStorage(line.back());
    }
    return parent;
}

void Edit(Repository& repository, KivStringViewT<char16_t> path, char content) {
    Buffer data;
    data.Append(&content, 1);
    Commit commit(&repository, false);
    commit.AddBlob(&repository, path, Blob(data));
    repository.DoCommit(commit);
}

} // namespace

int main() {
    Vault vault;
    {
        Repository repository(std::make_unique<MemObjectsStorage>());
        Edit(repository, u"a", '1');
        Edit(repository, u"b/c", '2');
        Save(vault, repository);
    }
    Repository again(std::make_unique<MemObjectsStorage>());
    const cow_ptr<Commit> head = Load(again, vault, vault.heads["master"]);
    const bool sound = head->GetId() == vault.heads["master"];
    again.MoveBranchTo(u"master", head);

    Repository oneOnly(std::make_unique<MemObjectsStorage>());
    const cow_ptr<Commit> root =
        LoadOne(oneOnly, head->GetParent()->GetId(), [&vault](Id const& id) { return Open(vault, id); });

    // Bytes that somebody changed are read all the same; the identifier shows it.
    vault.objects[head->GetId()] = vault.objects[root->GetId()];
    Repository deceived(std::make_unique<MemObjectsStorage>());
    Id parentId;
    const auto forged =
        Commit::Deserialize(head->GetId(), parentId, &deceived, [&vault](Id const& id) { return Open(vault, id); });

    return sound && again.GetHead()->GetParent()->GetId() == root->GetId() && again.GetBlobCount() == 2 &&
                   forged->GetId() != head->GetId()
               ? 0
               : 1;
}
