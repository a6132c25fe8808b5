// Keeps versions as packed forms and makes a repository of them again: what docs/storage.md shows.

#include "../../examples/load_history.h"

#include <map>
#include <string>
#include <string_view>
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

Buffer Open(Vault const& vault, Id const& id) {
    const auto found = vault.objects.find(id);
    return found == vault.objects.end() ? Buffer() : found->second;
}

cow_ptr<Commit> Load(Repository& repository, Vault const& vault) {
    return LoadHistory(repository, vault.heads.at("master"), [&vault](Id const& id) { return Open(vault, id); });
}

void Edit(Repository& repository, KivStringViewT<char16_t> path, std::string_view content) {
    Commit commit(&repository, false);
    commit.AddBlob(&repository, path, Blob::CopyText(content));
    repository.DoCommit(commit);
}

} // namespace

int main() {
    Vault vault;
    {
        Repository repository(std::make_unique<MemObjectsStorage>());
        Edit(repository, u"a", "1");
        Edit(repository, u"b/c", "2");
        Save(vault, repository);
    }
    Repository again(std::make_unique<MemObjectsStorage>());
    const cow_ptr<Commit> head = Load(again, vault);
    again.MoveBranchTo(u"master", head);
    const bool isWhole = head && head->GetId() == vault.heads["master"] && again.GetBlobCount() == 2;

    // Bytes that somebody changed are not taken in.
    vault.objects[head->GetId()] = vault.objects[head->GetParent()->GetId()];
    Repository deceived(std::make_unique<MemObjectsStorage>());
    return isWhole && !Load(deceived, vault) ? 0 : 1;
}
