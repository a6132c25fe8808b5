#include "repository/Publishing.h"

#include "Changes.h"
#include "KivArchive/ArchivedBlob.h"
#include "NamedFirst.h"
#include "PackedForms.h"

#include <algorithm>

namespace KivArchive {

namespace {

/// How many bytes one change stores, and of how many commits the trees are looked for together.
constexpr std::uint64_t changeSize = 8 * largestWholeContent;
constexpr std::size_t commitsTogether = 256;
/// An edit's commit, its file, and the directories above.
constexpr std::size_t usualObjects = 8;

constexpr const char* notItself = "is not what its identifier says";

} // namespace

Publishing::Publishing(IArchive& archive, KivVcs::IObjectsStorage const& storage, LocalFacts const& facts,
                       std::vector<BranchMove> const& moves, bool asksForAll, IProgress* progress)
    : archive_(archive), storage_(storage), facts_(facts), moves_(moves), asksForAll_(asksForAll), progress_(progress) {
    for (BranchMove const& move : moves)
        if (!move.expected.IsEmpty())
            expected_.Add(move.expected);
}

void Publishing::Store(std::vector<cow_ptr<Commit>> const& commits) {
    for (std::size_t begin = 0; begin < commits.size(); begin += commitsTogether)
        StoreTogether({commits.data() + begin, std::min(commitsTogether, commits.size() - begin)});
}

/// The root of a commit; null if it would have to be fetched.
cow_ptr<Tree> Publishing::HeldRootOf(Commit const& commit) const {
    auto const holder = commit.GetHeldCommitTree();
    return holder ? holder->GetRoot() : storage_.GetTree(commit.GetRootId());
}

void Publishing::StoreTogether(std::span<cow_ptr<Commit> const> commits) {
    MissingTrees trees(archive_);
    for (auto const& commit : commits) {
        cow_ptr<Commit> const parent = commit->GetHeldParent();
        if (cow_ptr<Tree> root = HeldRootOf(*commit))
            trees.Add(std::move(root), parent ? HeldRootOf(*parent) : nullptr);
    }
    // Commits of merges and rewritten ones mostly name what is there already.
    bool const areNew = !asksForAll_ && std::none_of(commits.begin(), commits.end(), [this](auto const& commit) {
        return facts_.Find(commit->GetId()) != nullptr;
    });
    trees.Find(areNew);
    isOnExpected_ = isOnExpected_ && AreOnExpectedHeads(commits);
    for (auto const& commit : commits) {
        if (cow_ptr<Tree> const root = HeldRootOf(*commit); root && trees.IsMissing(root->GetId()))
            StoreTree(trees, trees.NumberOf(root->GetId()));
        StoreCommit(*commit);
    }
}

/// Whether each commit is on top of an expected head, of one before it, or of one in this change.
bool Publishing::AreOnExpectedHeads(std::span<cow_ptr<Commit> const> commits) const {
    SmallSet<Id> met;
    return std::all_of(commits.begin(), commits.end(), [&](cow_ptr<Commit> const& commit) {
        Id const parent = commit->GetParentId();
        met.Add(commit->GetId());
        return expected_.Contains(parent) || met.Contains(parent) || IsInChange(parent);
    });
}

void Publishing::StoreTree(MissingTrees const& trees, std::size_t root) {
    VisitNamedFirst<std::size_t>(
        {&root, 1},
        [&](std::size_t number, std::vector<std::size_t>& named) {
            NewDirectory const& directory = trees.At(number);
            if (!trees.IsMissing(directory.id) || stored_.Contains(directory.id))
                return false;
            StoreFiles(trees, number);
            named.assign(directory.subdirectories.rbegin(), directory.subdirectories.rend());
            return true;
        },
        [&](std::size_t number) {
            NewDirectory const& directory = trees.At(number);
            if (!StoreDirectory(directory))
                trees.Refuse(directory.holder, directory.name, notItself);
        });
}

void Publishing::StoreFiles(MissingTrees const& trees, std::size_t directory) {
    for (NewDirectory::File const& file : trees.At(directory).files)
        if (trees.IsMissing(file.id) && !stored_.Contains(file.id) && !StoreFile(file))
            trees.Refuse(directory, file.name, notItself);
}

bool Publishing::StoreFile(NewDirectory::File const& file) {
    auto const* const archived =
        file.blob->IsOfHostClass() ? dynamic_cast<ArchivedBlob const*>(file.blob.get()) : nullptr;
    // It comes from another archive, since this one lacks it.
    if (archived != nullptr && archived->GetSize() > largestWholeContent)
        return StoreLarge(file, archived->OpenContent());
    Buffer const data = archived != nullptr ? archived->ReadContent() : file.blob->GetData();
    if (data.GetSize() > largestWholeContent)
        return StoreLarge(file, StreamIO(KivVcs::MemStream::CreateOnCopy(data)));
    if (archived == nullptr && file.blob->IsOfHostClass() && !(Identify(ObjectType::Blob, data) == file.id))
        return false;
    Add({file.id, ObjectType::Blob, data, file.earlier});
    return true;
}

bool Publishing::StoreLarge(NewDirectory::File const& file, StreamIO content) {
    if (!archive_.StoreContent(file.id, content, file.earlier, progress_))
        return false;
    stored_.Add(file.id, byItself);
    ++storedCount_;
    return true;
}

bool Publishing::StoreDirectory(NewDirectory const& directory) {
    bool const isHosts = directory.tree->IsOfHostClass();
    // The data of a copy, since a tree keeps its packed form for as long as it lives.
    Buffer const data = isHosts ? directory.tree->GetData() : Tree(*directory.tree).GetData();
    if (isHosts && !(Identify(ObjectType::Tree, data) == directory.id))
        return false;
    for (NewDirectory::File const& file : directory.files)
        RelyOn(file.id);
    for (auto const& name : directory.earlier ? directory.tree->GetLocalTreeDiffs(directory.earlier)
                                              : directory.tree->GetLocalSubtreePaths())
        if (cow_ptr<Tree> const subtree = directory.tree->GetLocalTree(name))
            RelyOn(subtree->GetId());
    for (NewDirectory::File const& file : directory.files)
        if (isOnExpected_ && !file.earlier.IsEmpty())
            earlierFiles_.push_back(file.earlier);
    if (directory.earlier)
        RelyOnEarlier(directory.earlier->GetId());
    Add({directory.id, ObjectType::Tree, data, directory.earlier ? directory.earlier->GetId() : Id()});
    return true;
}

void Publishing::StoreCommit(Commit const& commit) {
    Id const id = commit.GetId();
    Buffer const data = Joined(commit.GetData());
    bool const isItself =
        id.GetDigest() != nullptr && (!commit.IsOfHostClass() || Identify(ObjectType::Commit, data) == id);
    if (!isItself || !ReadPackedCommit(BytesOf(data)))
        throw ArchiveError(Failure::Unrepresentable, {},
                           "The version \"" + KivVcs::ToUtf8(commit.GetDescription()) + "\" cannot be read back.");
    Ancestry const* const known = facts_.Find(id);
    Ancestry facts{id, commit.GetParentId(), commit.GetRootId(), {}};
    if (known != nullptr)
        facts.contains = known->contains;
    if (!facts.parent.IsEmpty())
        RelyOn(facts.parent);
    if (!facts.tree.IsEmpty())
        RelyOn(facts.tree);
    for (auto const& merged : facts_.MergedBy(id))
        RelyOn(merged->GetId());
    change_.ancestry.push_back(std::move(facts));
    Add({id, ObjectType::Commit, data, {}});
}

bool Publishing::IsInChange(Id const& id) const {
    std::uint64_t const* const change = stored_.Find(id);
    return change != nullptr && *change == changeNumber_;
}

void Publishing::RelyOn(Id const& id) {
    if (!IsInChange(id) && relied_.Add(id))
        (expected_.Contains(id) ? change_.inherited : change_.relied).push_back(id);
}

void Publishing::RelyOnEarlier(Id const& id) {
    if (!isOnExpected_)
        RelyOn(id);
    else if (!IsInChange(id) && relied_.Add(id))
        change_.inherited.push_back(id);
}

void Publishing::Add(NewObject object) {
    size_ += object.data.GetSize();
    ++storedCount_;
    if (!stored_.Add(object.id, changeNumber_))
        *stored_.Find(object.id) = changeNumber_;
    if (change_.objects.empty())
        change_.objects.reserve(usualObjects);
    change_.objects.push_back(std::move(object));
    if (size_ >= changeSize)
        Flush();
}

void Publishing::Flush() {
    ReportProgress(progress_, {"publishing", storedCount_, 0}, {});
    // This change moves no branch, and so expects no head that would keep these.
    change_.relied.insert(change_.relied.end(), change_.inherited.begin(), change_.inherited.end());
    change_.inherited.clear();
    archive_.Apply(change_);
    change_ = {};
    isOnExpected_ = false;
    earlierFiles_.clear();
    size_ = 0;
    ++changeNumber_;
    relied_.Clear();
}

ChangeOutcome Publishing::Finish(std::vector<RecordChange> const& records) {
    ReportProgress(progress_, {"publishing", storedCount_, storedCount_}, {});
    for (Ancestry& facts : facts_.All())
        change_.ancestry.push_back(std::move(facts));
    change_.branches = moves_;
    change_.inherited.insert(change_.inherited.end(), earlierFiles_.begin(), earlierFiles_.end());
    change_.records = records;
    return archive_.Apply(change_);
}

} // namespace KivArchive
