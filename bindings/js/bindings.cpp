// The library's operations as module.js, commit.js and repository.js call them. Nothing here is checked or explained; those
// do both.

#include "Commits.h"

#include <emscripten/bind.h>
#include <malloc.h>

namespace KivVcs::JavaScript {
namespace {

using Path = array_view<KivStringViewT<char16_t> const>;

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

EMSCRIPTEN_BINDINGS(Commits) {
    using namespace emscripten;
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
}

EMSCRIPTEN_BINDINGS(Repositories) {
    using namespace emscripten;
    function("identify", &Identify);
    function("countAllocatedBytes", &CountAllocatedBytes);
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
