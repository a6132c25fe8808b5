// The library's operations as kivvcs.js calls them: identifiers and texts are JavaScript strings, contents Uint8Arrays, and
// the library's "none" is null. Nothing here is checked or explained; kivvcs.js does both.

#include <KivVcs/KivVcs.h>

#include <emscripten/bind.h>
#include <emscripten/val.h>
#include <malloc.h>

#include <string>

namespace KivVcs::JavaScript {
namespace {

using emscripten::val;
using Path = array_view<KivStringViewT<char16_t> const>;

constexpr std::int64_t ticksPerMinute = 600'000'000;

KivStringT<char16_t> FromJavaScript(std::u16string const& text) {
    return {text.data(), static_cast<int>(text.size())};
}

std::u16string ToJavaScript(KivStringT<char16_t> const& text) {
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

std::u16string ToJavaScript(Id const& id) {
    return ToJavaScript(id.GetText());
}

Id IdOf(std::u16string const& text) {
    return Id(FromJavaScript(text));
}

Buffer ToBuffer(val const& bytes) {
    const auto size = bytes["length"].as<std::uint32_t>();
    return Buffer::Build(size, [&](std::byte* destination) {
        // Only now: a view of the memory is no longer one when the memory has grown.
        val(emscripten::typed_memory_view(size, reinterpret_cast<std::uint8_t*>(destination))).call<void>("set", bytes);
    });
}

val ToUint8Array(Buffer const& buffer) {
    val array = val::global("Uint8Array").new_(static_cast<double>(buffer.GetSize()));
    double offset = 0;
    for (auto const& chunk : buffer.LockForRead()) {
        array.call<void>(
            "set", emscripten::typed_memory_view(chunk.size(), reinterpret_cast<const std::uint8_t*>(chunk.data())),
            offset);
        offset += static_cast<double>(chunk.size());
    }
    return array;
}

template <class Texts>
val ToArray(Texts const& texts) {
    val array = val::array();
    for (auto const& text : texts)
        array.call<void>("push", ToJavaScript(text));
    return array;
}

val ToObject(MergeConflict const& conflict) {
    val object = val::object();
    object.set("path", ToJavaScript(conflict.path));
    object.set("isDirectory", conflict.isDirectory);
    object.set("leftChange", static_cast<int>(conflict.leftChange));
    object.set("rightChange", static_cast<int>(conflict.rightChange));
    object.set("rootId", ToJavaScript(conflict.rootId));
    object.set("leftId", ToJavaScript(conflict.leftId));
    object.set("rightId", ToJavaScript(conflict.rightId));
    object.set("settlement", static_cast<int>(conflict.settlement));
    return object;
}

/// The identifier of @p object and whether it is a directory; null if there is none.
val Describe(cow_ptr<Object> const& object) {
    if (!object)
        return val::null();
    val entry = val::object();
    entry.set("id", ToJavaScript(object->GetId()));
    entry.set("isDirectory", object->GetHeader() == KivStringT<char>("tree"));
    return entry;
}

cow_ptr<Tree> RootOf(Commit const& commit) {
    return commit.GetCommitTree() ? commit.GetCommitTree()->GetRoot() : nullptr;
}

cow_ptr<Tree> RootOf(cow_ptr<Commit> const& commit) {
    return commit ? RootOf(*commit) : nullptr;
}

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

Walk WalkHistory(CommitHandle const& head, val const& path) {
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

class RepositoryHandle {
public:
    [[nodiscard]] std::u16string GetBranch() const { return ToJavaScript(repository_.GetCurentBranch()); }
    [[nodiscard]] val GetBranches() const {
        val names = val::array();
        for (auto const& reference : repository_.GetStorage()->GetRefs())
            names.call<void>("push", ToJavaScript(reference.first));
        return names;
    }
    bool HasBranch(std::u16string const& name) { return repository_.BranchExist(FromJavaScript(name)); }
    bool Checkout(std::u16string const& name) { return repository_.Checkout(FromJavaScript(name)); }
    bool CreateBranch(std::u16string const& name, CommitHandle const* head) {
        return repository_.CreateBranch(FromJavaScript(name), CommitHandle::From(head));
    }
    bool MoveBranch(std::u16string const& name, CommitHandle const& head) {
        return repository_.MoveBranchTo(FromJavaScript(name), head.Get());
    }
    bool RemoveBranch(std::u16string const& name) { return repository_.RemoveBranch(FromJavaScript(name)); }

    [[nodiscard]] val GetHead(std::u16string const& branch) const {
        return CommitHandle::Of(repository_.GetHead(FromJavaScript(branch)));
    }
    [[nodiscard]] val Find(std::u16string const& id) const {
        return CommitHandle::Of(repository_.GetCommitFromStorage(IdOf(id)));
    }
    [[nodiscard]] val GetCommonBase(CommitHandle const& first, CommitHandle const& second) const {
        return CommitHandle::Of(repository_.GetCommonBase(first.Get(), second.Get()));
    }

    Draft Edit(CommitHandle const* parent, bool amend) { return {repository_, CommitHandle::From(parent), amend}; }

    /// @p file and @p directory are given a conflict and return the number of a choice.
    val Merge(CommitHandle const& commit, val const& file, val const& directory) {
        const MergeOutcome merged =
            MergeWithOutcome(repository_, commit.Get(),
                             {[&file](Path path, MergeTrees const& trees) {
                                  return static_cast<ConflictChoice>(Ask(file, path, trees, false));
                              },
                              [&directory](Path path, MergeTrees const& trees) {
                                  return static_cast<TreeConflictChoice>(Ask(directory, path, trees, true));
                              }});
        val conflicts = val::array();
        for (auto const& conflict : merged.conflicts)
            conflicts.call<void>("push", ToObject(conflict));
        val outcome = val::object();
        outcome.set("result", static_cast<int>(merged.result));
        outcome.set("conflicts", conflicts);
        return outcome;
    }

    val Rebase(CommitHandle const& commit, CommitHandle const* base, CommitHandle const& onto) {
        return CommitHandle::Of(repository_.MergelessRebase(commit.Get(), CommitHandle::From(base), onto.Get()));
    }
    bool Simplify(bool purge) { return repository_.SimplifyCommitGraph(purge); }
    bool EnsureCommonRoot(std::u16string const& first, std::u16string const& second, std::u16string const& root) {
        return repository_.EnsureCommonRootFor(FromJavaScript(first), FromJavaScript(second), FromJavaScript(root));
    }
    bool DeleteCommits(CommitHandle const& commit) { return repository_.DeleteCommits(commit.Get()); }
    void Purge() { repository_.UpdateStorage(); }

    [[nodiscard]] double CountCommits() const { return static_cast<double>(repository_.GetCommitCount()); }
    [[nodiscard]] double CountDirectories() const { return static_cast<double>(repository_.GetTreeCount()); }
    [[nodiscard]] double CountFiles() const { return static_cast<double>(repository_.GetBlobCount()); }

    [[nodiscard]] bool Holds(std::u16string const& id) const { return static_cast<bool>(FindObject(IdOf(id))); }
    [[nodiscard]] val Pack(std::u16string const& id) const {
        const auto object = FindObject(IdOf(id));
        return object ? ToUint8Array(object->GetPackedData()) : val::null();
    }
    /// The content of a file; null if no such file is stored.
    [[nodiscard]] val ReadFile(std::u16string const& id) const {
        const auto blob = repository_.GetBlobFromStorage(IdOf(id));
        return blob ? ToUint8Array(blob->GetData()) : val::null();
    }

    /// Stores the blob or tree of that packed form. Everything that a tree names must be stored already.
    /// @return whether its identifier is @p id.
    bool AddPacked(std::u16string const& id, val const& bytes) {
        Buffer packed = ToBuffer(bytes);
        Id const wanted = IdOf(id);
        if (Id(packed) != wanted)
            return false;
        StreamIO stream(MemStream::CreateOnRef(packed));
        if (auto blob = Blob::Deserialize(stream))
            return static_cast<bool>(repository_.SyncWithStorage(std::move(blob)));
        auto empty = immu::make<Tree>();
        if (empty->GetId() == wanted)
            return static_cast<bool>(repository_.SyncWithStorage(std::move(empty)));
        const auto tree = Tree::Deserialize(wanted, &repository_, [&](Id const& asked) {
            return asked == wanted ? StreamIO(MemStream::CreateOnRef(packed)) : StreamIO();
        });
        return tree && tree->GetId() == wanted && static_cast<bool>(repository_.SyncWithStorage(tree));
    }

private:
    static int Ask(val const& resolver, Path path, MergeTrees const& trees, bool isDirectory) {
        return resolver(ToObject(DescribeConflict(path, trees, isDirectory, ConflictSettlement::Undecided))).as<int>();
    }

    [[nodiscard]] cow_ptr<Object> FindObject(Id const& id) const {
        if (cow_ptr<Object> blob = repository_.GetBlobFromStorage(id))
            return blob;
        if (cow_ptr<Object> tree = repository_.GetTreeFromStorage(id))
            return tree;
        return repository_.GetCommitFromStorage(id);
    }

    Repository repository_{std::make_unique<MemObjectsStorage>()};
};

/// The identifier of a packed form.
std::u16string Identify(val const& packed) {
    return ToJavaScript(Id(ToBuffer(packed)));
}

/// Bytes that are allocated in the module's memory.
double CountAllocatedBytes() {
    return mallinfo().uordblks;
}

} // namespace

EMSCRIPTEN_BINDINGS(KivVcs) {
    using namespace emscripten;
    function("identify", &Identify);
    function("countAllocatedBytes", &CountAllocatedBytes);
    class_<CommitHandle>("Commit")
        .function("id", &CommitHandle::GetId)
        .function("parent", &CommitHandle::GetParent)
        .function("authorName", &CommitHandle::GetAuthorName)
        .function("authorEmail", &CommitHandle::GetAuthorEmail)
        .function("description", &CommitHandle::GetDescription)
        .function("seconds", &CommitHandle::GetSeconds)
        .function("offsetMinutes", &CommitHandle::GetOffsetMinutes)
        .function("treeId", &CommitHandle::GetTreeId)
        .function("paths", &CommitHandle::GetPaths)
        .function("find", &CommitHandle::Find)
        .function("read", &CommitHandle::Read)
        .function("list", &CommitHandle::List)
        .function("differences", &CommitHandle::GetDifferences, allow_raw_pointers());
    function("walkHistory", &WalkHistory);
    class_<Walk>("Walk").function("next", &Walk::Next);
    class_<Draft>("Draft")
        .function("add", &Draft::Add)
        .function("addObject", &Draft::AddObject)
        .function("remove", &Draft::Remove)
        .function("find", &Draft::Find)
        .function("useTree", &Draft::UseTree)
        .function("setAuthor", &Draft::SetAuthor)
        .function("setDescription", &Draft::SetDescription)
        .function("commit", &Draft::DoCommit)
        .function("store", &Draft::Store);
    class_<RepositoryHandle>("Repository")
        .constructor<>()
        .function("branch", &RepositoryHandle::GetBranch)
        .function("branches", &RepositoryHandle::GetBranches)
        .function("hasBranch", &RepositoryHandle::HasBranch)
        .function("checkout", &RepositoryHandle::Checkout)
        .function("createBranch", &RepositoryHandle::CreateBranch, allow_raw_pointers())
        .function("moveBranch", &RepositoryHandle::MoveBranch)
        .function("removeBranch", &RepositoryHandle::RemoveBranch)
        .function("head", &RepositoryHandle::GetHead)
        .function("find", &RepositoryHandle::Find)
        .function("commonBase", &RepositoryHandle::GetCommonBase)
        .function("edit", &RepositoryHandle::Edit, allow_raw_pointers())
        .function("merge", &RepositoryHandle::Merge)
        .function("rebase", &RepositoryHandle::Rebase, allow_raw_pointers())
        .function("simplify", &RepositoryHandle::Simplify)
        .function("ensureCommonRoot", &RepositoryHandle::EnsureCommonRoot)
        .function("deleteCommits", &RepositoryHandle::DeleteCommits)
        .function("purge", &RepositoryHandle::Purge)
        .function("countCommits", &RepositoryHandle::CountCommits)
        .function("countDirectories", &RepositoryHandle::CountDirectories)
        .function("countFiles", &RepositoryHandle::CountFiles)
        .function("holds", &RepositoryHandle::Holds)
        .function("pack", &RepositoryHandle::Pack)
        .function("readFile", &RepositoryHandle::ReadFile)
        .function("addPacked", &RepositoryHandle::AddPacked);
}

} // namespace KivVcs::JavaScript
