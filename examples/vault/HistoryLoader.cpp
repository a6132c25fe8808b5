#include "HistoryLoader.h"

#include "Text.h"

#include <algorithm>
#include <unordered_set>
#include <vector>

namespace vault {

using KivVcs::Buffer;
using KivVcs::Commit;
using KivVcs::cow_ptr;
using KivVcs::Id;

namespace {

struct UnlinkedCommit {
    Id id;
    cow_ptr<Commit> commit;
};

// The library finds a parent line wherever its key comes next in a commit's text, in the description too. A root commit
// gets an empty parent line before it is read, so that nothing else can be taken for one.
Buffer WithParentLine(Buffer packed) {
    constexpr std::string_view commitHeader = "commit ";
    constexpr std::string_view parentKey = "parent ";
    std::string start(std::min<std::uint64_t>(packed.GetSize(), 256), '\0');
    if (!packed.Read(0, start.data(), start.size()) || !start.starts_with(commitHeader))
        return packed;
    const auto treeLineEnd = start.find('\n');
    if (treeLineEnd == std::string::npos || start.compare(treeLineEnd + 1, parentKey.size(), parentKey) == 0)
        return packed;
    Buffer result;
    result.Append(packed, 0, treeLineEnd + 1);
    result.Append("parent \n", 8);
    result.Append(packed, treeLineEnd + 1, packed.GetSize());
    return result;
}

} // namespace

HistoryLoader::HistoryLoader(VaultFile& file, KivVcs::Repository& repository, Progress& progress, Visit visit)
    : file_(file), repository_(repository), progress_(progress), visit_(std::move(visit)) {
    // An empty tree has no data, and a tree without data does not load. One that the repository holds need not be
    // loaded.
    const auto emptyTree = KivVcs::immu::make<KivVcs::Tree>();
    repository_.AddTreeToStorage(emptyTree);
    if (file_.ReadObject(ToUtf8(emptyTree->GetId())))
        visit_(emptyTree->GetId());
}

cow_ptr<Commit> HistoryLoader::Load(Id const& head) {
    std::vector<UnlinkedCommit> commits;
    std::unordered_set<Id> seen;
    cow_ptr<Commit> parent;
    for (Id next = head; !next.IsEmpty();) {
        parent = repository_.GetCommitFromStorage(next);
        if (parent)
            break;
        Id parentId;
        auto commit =
            Commit::Deserialize(next, parentId, &repository_, [this](Id const& id) { return OpenObject(id); });
        // Blobs share the bytes of what was opened for them; nothing else is needed any more.
        opened_.clear();
        // Identifiers of a damaged file can lead in a circle.
        if (!commit || !seen.insert(next).second)
            return nullptr;
        commits.push_back({next, std::move(commit)});
        // The empty parent line of a root commit reads as an identifier without text.
        next = parentId.GetText().IsEmpty() ? Id() : parentId;
    }
    std::reverse(commits.begin(), commits.end());
    for (auto& unlinked : commits) {
        unlinked.commit.write()->SetParent(parent);
        if (unlinked.commit->GetId() != unlinked.id)
            return nullptr;
        repository_.AddCommitToStorage(unlinked.commit);
        parent = unlinked.commit;
    }
    return parent;
}

KivVcs::StreamIO HistoryLoader::OpenObject(Id const& id) {
    auto packed = file_.ReadObject(ToUtf8(id));
    if (!packed)
        return {};
    visit_(id);
    progress_.Step(packed->GetSize());
    opened_.push_back(WithParentLine(*std::move(packed)));
    return KivVcs::StreamIO(KivVcs::MemStream::CreateOnRef(opened_.back()));
}

} // namespace vault
