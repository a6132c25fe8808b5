#include "HostStream.h"
#include "RecordingRepository.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <set>

namespace {

/// What this program's operators `new` and `delete` do. The tests run on one thread.
struct Allocations {
    long living = 0;
    /// The allocation that fails, counted from 1; none for 0.
    long failing = 0;
    bool laterOnesFailToo = false;
    long made = 0;
    bool hasFailed = false;
};
Allocations allocations;

bool Fails() {
    if (allocations.failing == 0)
        return false;
    ++allocations.made;
    return allocations.made == allocations.failing ||
           (allocations.laterOnesFailToo && allocations.made > allocations.failing);
}

} // namespace

// Inlined, they would look mismatched to the compiler.
[[gnu::noinline]] void* operator new(std::size_t size) {
    if (Fails()) {
        allocations.hasFailed = true;
        throw std::bad_alloc();
    }
    void* const memory = std::malloc(size == 0 ? 1 : size);
    if (memory == nullptr)
        throw std::bad_alloc();
    ++allocations.living;
    return memory;
}

[[gnu::noinline]] void operator delete(void* memory) noexcept {
    allocations.living -= memory == nullptr ? 0 : 1;
    std::free(memory);
}

[[gnu::noinline]] void operator delete(void* memory, std::size_t) noexcept {
    operator delete(memory);
}

namespace KivVcs {
namespace {

/// A repository with every kind of history and object, and places for what the operations give.
struct World {
    World() : repository(std::make_unique<MemObjectsStorage>()) {
        Grow("r", "", "f1=1 f2=2 f3=3 d/x=1 d/e/y=1 d/e/z=1 s/t/u=1 s/v=1");
        Grow("a", "r", "d/x=2 n=1");
        Grow("b", "a", "m=1");
        Grow("c", "b", "d/e/y=3 k/l=4 f1=9");
        Grow("t", "a", "d/x=9 d/e/z=2 f2=7");
        Grow("v", "t", "d/e/y=7 s/q/w=1 k=5 f1=8");
        Grow("i", "", "d/x=1 o=1");
        Grow("j", "i", "p=1");
        Grow("g", "c", "garbage/g=1");
        repository.MoveBranchTo(u"master", commits["c"]);
        for (auto const& [branch, head] : {std::pair(u"topic", "v"), {u"side", "b"}, {u"twin", "c"}, {u"island", "j"}})
            repository.CreateBranch(branch, commits[head]);
        draft = Commit(commits["c"], false);
        draft.SetDescription(u"draft");
        edited = *commits["c"]->GetCommitTree()->GetRoot();
        // Large enough for a table of several nodes.
        Tree many;
        for (int index = 100; index < 140; ++index)
            many.AddBlob(&repository, Wide(std::to_string(index)), blob);
        edited.AddTree(&repository, u"many", many);
        sole.AddBlob(&repository, u"d/x", blob);
    }

    /// A world of its own that shares all objects with another one.
    World(World const& other)
        : repository(other.repository.GetStorage()->Clone()), commits(other.commits), draft(other.draft),
          edited(other.edited), sole(other.sole) {}

    void Grow(std::string const& name, std::string const& parent, std::string const& files) {
        Commit grown(commits[parent], false);
        grown.SetDescription(Wide(name));
        grown.SetAuthorName(u"J\u00f8rn");
        std::istringstream words(files);
        for (std::string word; words >> word;) {
            const auto equals = word.find('=');
            grown.AddBlob(&repository, Wide(word.substr(0, equals)), MakeBlob(word.substr(equals + 1)));
        }
        commits[name] = repository.SyncWithStorage(immu::make<Commit>(grown));
    }

    /// Branches, histories and what the caller edits. Nothing of it may change while an operation fails.
    std::string State() const {
        std::map<std::string, std::string> lines;
        for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
            std::string& line = lines[Narrow(name)];
            for (Commit const* each = head.get(); each != nullptr; each = each->GetParent().get())
                line += "/" + Narrow(each->GetDescription()) + "{" + Files(each->GetCommitTree()) + "}";
        }
        std::string state = Narrow(repository.GetCurentBranch());
        for (auto const& [name, line] : lines)
            state += "\n" + name + "=" + line;
        return state + "\n" + Narrow(draft.GetDescription()) + Narrow(draft.GetAuthorName()) + " on " +
               NameOf(draft.GetParent()) + "{" + Files(draft.GetCommitTree()) + "}\n" +
               KivVcs::Files(immu::make<Tree>(edited)) + "\n" + KivVcs::Files(immu::make<Tree>(sole)) + "\n" +
               Narrow(text) + "\n" + Helpers::StringAFromBuffer(data).GetString() + "\n" +
               Helpers::StringAFromBuffer(blob.GetData()).GetString();
    }

    /// The state and what the last operation gave.
    std::string Outcome() {
        std::string outcome = State() + "\n" + std::to_string(done) + " " + narrow.GetString() + " " +
                              KivVcs::Files(tree) + " " + NameOf(commit) + " " + Files(holder);
        for (auto const& path : paths)
            outcome += " " + Narrow(path);
        commits.clear();
        commit.reset();
        repository.UpdateStorage();
        for (Repository* each : {&repository, &mirror})
            outcome += " " + std::to_string(each->GetCommitCount()) + " " + std::to_string(each->GetTreeCount()) + " " +
                       std::to_string(each->GetBlobCount());
        return outcome;
    }

    static std::string Files(cow_ptr<CommitTree> const& tree) { return tree ? KivVcs::Files(tree->GetRoot()) : "-"; }

    Repository repository;
    Repository mirror{std::make_unique<MemObjectsStorage>()};
    std::map<std::string, cow_ptr<Commit>> commits;
    PackedFormsOf packedForms{repository};
    Commit draft;
    Tree edited, sole;
    Blob blob = MakeBlob("blob");
    Buffer data;
    KivStringT<char16_t> text;
    KivStringT<char> narrow;
    bool done = false;
    cow_ptr<Tree> tree;
    cow_ptr<Commit> commit;
    cow_ptr<CommitTree> holder;
    PathList paths;
};

/// The identifier of a tree by its listing, of everything else by a copy without caches.
Id Recomputed(Tree const& tree) {
    std::map<std::string, Object const*> entries;
    for (auto const& name : tree.GetLocalObjectPaths())
        entries[Narrow(name)] = tree.GetLocalObject(name).get();
    std::string data;
    for (auto const& [name, child] : entries)
        data += std::string(child->GetStoragePrefix()) + " " + child->GetHeader().GetString() + " " + name + '\0' +
                Narrow(child->GetId().GetText());
    return MakeBlob("tree " + std::to_string(data.size()) + '\0' + data).GetData();
}

template <class T>
Id Recomputed(T copy) {
    copy.ResetState();
    return copy.GetPackedData();
}

class SoundnessCheck {
public:
    explicit SoundnessCheck(World& world) {
        for (Repository* repository : {&world.repository, &world.mirror}) {
            CheckTable(repository->GetStorage()->GetCommits());
            CheckTable(repository->GetStorage()->GetTrees());
            CheckTable(repository->GetStorage()->GetBlobs());
            for (auto const& [name, head] : repository->GetStorage()->GetRefs())
                Check(head.get());
        }
        Check(&world.draft);
        Check(&world.edited);
        Check(&world.sole);
        Check(&world.blob);
    }

private:
    template <class Table>
    void CheckTable(Table const& table) {
        for (auto const& [id, object] : table) {
            EXPECT_EQ(id, object->GetId());
            Check(object.get());
        }
    }

    bool IsNew(Object const* object) { return object != nullptr && checked_.insert(object).second; }

    template <class T>
    static void Compare(T const& object) {
        EXPECT_EQ(object.GetId(), Recomputed(object));
        EXPECT_EQ(Id(object.GetPackedData()), object.GetId());
    }

    void Check(Blob const* blob) {
        if (IsNew(blob))
            Compare(*blob);
    }
    void Check(Tree const* tree) {
        if (!IsNew(tree))
            return;
        Compare(*tree);
        for (auto const& name : tree->GetLocalSubtreePaths())
            Check(tree->GetLocalTree(name).get());
        for (auto const& name : tree->GetLocalBlobPaths())
            Check(tree->GetLocalBlob(name).get());
    }
    void Check(Commit const* commit) {
        if (!IsNew(commit))
            return;
        Compare(*commit);
        Check(commit->GetParent().get());
        Check(commit->GetCommitTree() ? commit->GetCommitTree()->GetRoot().get() : nullptr);
    }

    std::set<Object const*> checked_;
};

struct Operation {
    const char* name;
    void (*run)(World&);
};

cow_ptr<Tree> RootOf(World& world, const char* commit) {
    return world.commits[commit]->GetCommitTree()->GetRoot();
}

Resolvers AskTimesThenRight() {
    const auto getTime = [](cow_ptr<Blob> const& blob) { return optional<Time>(Time(blob->GetData().GetSize())); };
    const TreeConflictResolver undecided = [](auto const&, auto const&) { return TreeConflictChoice::Undecided; };
    return {ChainResolvers(TimeBasedConflictResolver({u"absent", u"f1"}, getTime), AlwaysChooseRight()),
            ChainResolvers(undecided, [](auto const&, auto const&) { return TreeConflictChoice::Merge; })};
}

// clang-format off
const Operation operations[] = {
    {"Tree::AddBlob", [](World& w) { w.done = !!w.edited.AddBlob(&w.repository, u"d/e/new/deep", w.blob); }},
    {"Tree::AddBlob many", [](World& w) { w.edited.AddBlob(&w.repository, u"many/110a", w.blob); }},
    {"Tree::AddBlob replacing", [](World& w) { w.sole.AddBlob(&w.repository, u"d/x", MakeBlob("other")); }},
    {"Tree::AddTree", [](World& w) { w.tree = w.edited.AddTree(&w.repository, u"d/copy", w.sole); }},
    {"Tree::AddObject", [](World& w) { w.sole.AddObject(&w.repository, u"q/r", RootOf(w, "t")->GetId()); }},
    {"Tree::RemoveObject", [](World& w) { w.done = w.edited.RemoveObject(&w.repository, u"s/t/u"); }},
    {"Tree::RemoveObject many", [](World& w) { w.done = w.edited.RemoveObject(&w.repository, u"many/101"); }},
    {"a wide tree", [](World& w) {
         Tree wide;
         for (char16_t name[] = u"aa"; name[0] < u'l'; name[1] == u'z' ? (++name[0], name[1] = u'a') : ++name[1])
             wide.AddBlob(&w.repository, name, w.blob);
         w.done = !wide.GetId().IsEmpty();
         w.tree = immu::make<Tree>(wide);
     }},
    {"emptying a tree", [](World& w) {
         Tree shrinking(w.edited);
         for (char16_t name[] = u"many/100"; name[6] < u'4'; name[7] == u'9' ? (++name[6], name[7] = u'0') : ++name[7])
             shrinking.RemoveObject(&w.repository, name);
         w.tree = immu::make<Tree>(shrinking);
     }},
    {"a deep path", [](World& w) {
         KivStringT<char16_t> path;
         for (int level = 0; level < 160; ++level)
             path += u"n/";
         w.tree = immu::make<Tree>(w.sole);
         w.done = !!w.tree.write()->AddTree(&w.repository, path, w.edited);
         w.paths = w.tree->GetDeepBlobDiffs(RootOf(w, "r"));
         w.done = w.done && w.tree.write()->RemoveObject(&w.repository, path);
     }},
    {"histories", [](World& w) {
         w.commit = w.repository.MergelessRebase(w.commits["v"], nullptr, w.commits["j"]);
         w.done = w.repository.Merge3Way(w.commit, AskTimesThenRight());
     }},
    {"a line of commits", [](World& w) {
         cow_ptr<Commit> tip = w.commits["c"];
         for (char16_t name[] = u"A"; name[0] < u'f'; ++name[0]) {
             Commit next(tip, false);
             next.SetDescription(name);
             next.AddBlob(&w.repository, name, w.blob);
             tip = w.repository.SyncWithStorage(immu::make<Commit>(next));
         }
         w.commit = w.repository.GetCommonBase(tip, w.commits["v"]);
     }},
    {"Tree listings", [](World& w) {
         w.paths = w.edited.GetDeepBlobPaths();
         w.done = w.edited.GetLocalObjectPaths().size() == w.edited.GetLocalObjectCount();
     }},
    {"Tree differences", [](World& w) {
         w.paths = w.edited.GetDeepBlobDiffs(RootOf(w, "v"));
         w.done = w.edited.GetLocalBlobDiffs(RootOf(w, "v")).size() + w.edited.GetLocalTreeDiffs(RootOf(w, "r")).size() == 2;
     }},
    {"Tree lookups", [](World& w) {
         w.done = w.edited.GetDeepObject(u"d/e/y") && w.edited.GetDeepTree(u"d/e") && w.edited.GetDeepBlob(u"d/x") &&
                  w.edited.GetIdByPath(u"d/e") && w.edited.GetDeepBlobCount() > 40;
     }},
    {"packed forms", [](World& w) {
         w.edited.ResetState();
         w.draft.ResetState();
         w.done = !w.edited.GetId().GetText().IsEmpty() && w.draft.GetId() == Id(w.draft.GetPackedData());
         w.narrow = Helpers::StringAFromBuffer(w.edited.GetData());
     }},
    {"assigning a blob", [](World& w) {
         const Blob other = MakeBlob("other");
         w.done = other.GetPackedData().GetSize() > w.blob.GetPackedData().GetSize();
         w.blob = other;
     }},
    {"assigning a tree", [](World& w) {
         w.done = w.sole.GetData().GetSize() < RootOf(w, "v")->GetPackedData().GetSize();
         w.sole = *RootOf(w, "v");
     }},
    {"assigning a commit", [](World& w) {
         w.done = w.draft.GetData().GetSize() < w.commits["v"]->GetPackedData().GetSize();
         w.draft = *w.commits["v"];
     }},
    {"ToString", [](World& w) { w.done = w.edited.ToString().GetLength() > w.blob.ToString().GetLength(); }},
    {"Commit::AddBlob", [](World& w) { w.draft.AddBlob(&w.repository, u"d/e/fresh", MakeBlob("fresh")); }},
    {"Commit::AddTree", [](World& w) { w.tree = w.draft.AddTree(&w.repository, u"trees/one", w.edited); }},
    {"Commit::AddObject", [](World& w) { w.draft.AddObject(&w.repository, u"z", RootOf(w, "v")->GetId()); }},
    {"Commit::RemoveObject", [](World& w) { w.done = w.draft.RemoveObject(&w.repository, u"d/e/y"); }},
    {"Commit::ReplaceRoot", [](World& w) {
         w.draft.ReplaceRoot(&w.repository, immu::make<Tree>(w.edited));
         w.draft.ResetState();
     }},
    {"Commit::SetDescription", [](World& w) { w.draft.SetDescription(u"another description"); }},
    {"CommitTree", [](World& w) {
         cow_ptr<CommitTree> holder = w.draft.GetCommitTree();
         holder.write()->AddBlob(&w.repository, u"only/here", w.blob);
         w.paths = holder->GetBlobDiffs(w.draft.GetCommitTree());
         w.holder = w.draft.GetTree(u"d");
         w.done = holder->GetIdByPath(u"d/e") && holder->GetBlob(u"f1") == w.draft.GetBlob(u"f1");
     }},
    {"CommitTree without root", [](World& w) {
         CommitTree holder;
         holder.AddTree(&w.repository, u"d", w.edited);
         w.holder = dll_wrapped_shared(std::make_unique<CommitTree>(holder));
         w.paths = w.holder->GetAllBlobPaths();
         w.done = w.holder->GetBlobCount() == w.paths.size();
     }},
    {"author lines", [](World& w) {
         int position = 0;
         const auto line = Commit::GetAuthorInfo(u"author", u"J\u00f8rn", u"j@x", Time(), TimeDelta(-1));
         const KivStringT<char> utf8 = DataEncoding::Utf8Encode(line) + "\n";
         w.text = String::ToStringW(*Commit::ParseCommitInfo(utf8, "author ", position));
     }},
    {"DoCommit", [](World& w) { w.commit = w.repository.DoCommit(w.draft); }},
    {"amending", [](World& w) {
         Commit amended(&w.repository, true);
         amended.AddBlob(&w.repository, u"amended/file", w.blob);
         w.commit = w.repository.DoCommit(amended);
     }},
    {"Commit::MakeCommitLinksInOrder", [](World& w) {
         std::vector<cow_ptr<Commit>> line{w.commits["j"], w.commits["b"], w.commits["v"]};
         w.done = Commit::MakeCommitLinksInOrder(line, &w.repository);
         w.commit = line.front();
     }},
    {"Commit::Deserialize", [](World& w) {
         w.commit.reset();
         for (const char* name : {"r", "a", "t", "v"}) {
             Id parent;
             auto read = Commit::Deserialize(w.commits[name]->GetId(), parent, &w.mirror, w.packedForms.Loader());
             w.done = read && parent == (w.commit ? w.commit->GetId() : Id());
             read.write()->SetParent(w.commit);
             w.commit = w.mirror.SyncWithStorage(read);
         }
     }},
    {"Tree::Deserialize", [](World& w) {
         w.repository.SyncWithStorage(immu::make<Tree>(w.edited));
         w.tree = Tree::Deserialize(w.edited.GetId(), &w.mirror, w.packedForms.Loader());
     }},
    {"Blob::Deserialize", [](World& w) {
         Buffer large(0);
         large.Append("blob 1", 7);
         large.Append("0123456789", 10, 1'000);
         StreamIO stream(MemStream::CreateOnRef(large));
         w.done = Blob::Deserialize(stream)->GetData().GetSize() == 10'000;
         StreamIO host = ReaderOf(std::string("blob 1\0", 7) + std::string(200'000, 'h'));
         w.done = w.done && Blob::Deserialize(host)->GetData().GetSize() == 200'000;
     }},
    {"a repository", [](World& w) {
         Repository other(std::make_unique<MemObjectsStorage>(std::initializer_list<KivStringViewT<char16_t>>{u"a", u"b"}));
         w.done = other.MoveBranchTo(u"a", w.commits["v"]) && other.GetStorage()->GetCommitBranches(w.commits["v"]).size() == 1;
     }},
    {"Helpers", [](World& w) {
         Buffer data(w.data);
         Helpers::AppendToBuffer(data, KivStringViewT<char16_t>(u"wide"));
         Helpers::AppendToBuffer(data, w.blob.GetData());
         StreamIO host = ReaderOf(std::string(70'000, 'h'));
         w.narrow = Helpers::StreamToStringA(host).Left(5);
         w.done = Helpers::SplitVcsPath(u"a/b/c").size() == 3 && Id(KivStringT<char16_t>(u"no digest")) != Id(data);
         w.text = Helpers::ComputeEncodedSHA256Hash(data) + Helpers::ComputeEncodedSHA256Hash("abc", 3);
     }},
    {"CreateBranch", [](World& w) { w.done = w.repository.CreateBranch(u"new", nullptr); }},
    {"RemoveBranch", [](World& w) { w.done = w.repository.RemoveBranch(u"twin"); }},
    {"Checkout", [](World& w) { w.done = w.repository.Checkout(u"island"); }},
    {"MoveBranchTo", [](World& w) { w.done = w.repository.MoveBranchTo(u"side", w.commits["v"]); }},
    {"fast forward", [](World& w) { w.done = w.repository.Merge(w.commits["g"], {}); }},
    {"three-way merge", [](World& w) { w.done = w.repository.Merge(w.commits["v"], AskTimesThenRight()); }},
    {"unrelated merge", [](World& w) { w.done = w.repository.Merge3Way(w.commits["j"], AskTimesThenRight()); }},
    {"ThreeWayMerge", [](World& w) {
         w.tree = ThreeWayMerge(&w.repository, {RootOf(w, "v"), RootOf(w, "a"), RootOf(w, "c")}, AskTimesThenRight());
     }},
    {"GetCommonBase", [](World& w) { w.commit = w.repository.GetCommonBase(w.commits["c"], w.commits["v"]); }},
    {"DeleteCommits", [](World& w) { w.done = w.repository.DeleteCommits(w.commits["c"]); }},
    {"SimplifyCommitGraph", [](World& w) { w.done = w.repository.SimplifyCommitGraph(true); }},
    {"SimplifyCommitGraph without purge", [](World& w) { w.done = w.repository.SimplifyCommitGraph(false); }},
    {"MergelessRebase", [](World& w) { w.commit = w.repository.MergelessRebase(u"topic", u"master"); }},
    {"rooting at a branch", [](World& w) { w.done = w.repository.EnsureCommonRootFor(u"topic", u"island", u"side"); }},
    {"EnsureCommonRootFor", [](World& w) { w.done = w.repository.EnsureCommonRootFor(u"topic", u"island", u"root"); }},
    {"purge", [](World& w) { w.commits.clear(); w.repository.UpdateStorage(); }},
    {"clone", [](World& w) { w.done = w.repository.GetStorage()->Clone()->GetRefs().size() == 5; }},
    {"strings", [](World& w) {
         auto text = KivStringT<char16_t>(u"one") + u" two three four five";
         text = text.Mid(1) + KivStringT<char16_t>(u"six").Left(2);
         w.narrow.FormatInternal("%s %05d", "made", 42);
         w.text = text + DataEncoding::HexEncode("abc", 3) + KivStringT<char16_t>(w.narrow);
     }},
    {"string +=", [](World& w) { w.text += u"appended once"; }},
    {"Buffer", [](World& w) {
         Buffer large(70'000);
         large.Append(large);
         Buffer all(large);
         all.Append(large, 5, 100'000);
         StreamIO stream(MemStream::CreateOnRef(all));
         Buffer copy(0);
         Stream destination = MemStream::CreateOnRef(copy);
         w.done = stream.CopyTo(destination, nullptr) && copy.GetSize() == 240'000;
         w.data.Append("appended four times.", 20, 4);
     }},
};
// clang-format on

/// Runs @p operation with its allocation @p failing; false if it completed, with or without a fault.
bool IsEndedByFault(Operation const& operation, World& world, long failing, bool laterOnesFailToo) {
    allocations = {.living = allocations.living, .failing = failing, .laterOnesFailToo = laterOnesFailToo};
    bool isEnded = false;
    try {
        operation.run(world);
    } catch (std::bad_alloc const&) {
        isEnded = true;
    }
    allocations.failing = 0;
    return isEnded;
}

/// Fails the allocations of an operation, every @p stride-th of them, in worlds that are made alike.
template <class Make>
long RunWithFaults(Operation const& operation, Make make, long stride, bool laterOnesFailToo) {
    std::string before;
    std::string undisturbed;
    {
        const auto world = make();
        before = world->State();
        SoundnessCheck{*world};
        operation.run(*world);
        SoundnessCheck{*world};
        undisturbed = world->Outcome();
    }
    long faults = 0;
    for (allocations.hasFailed = true; allocations.hasFailed && !testing::Test::HasFailure(); ++faults) {
        SCOPED_TRACE(operation.name + std::string(", fault ") + std::to_string(faults));
        const long living = allocations.living;
        {
            const auto world = make();
            if (IsEndedByFault(operation, *world, 1 + faults * stride, laterOnesFailToo)) {
                EXPECT_EQ(world->State(), before);
                SoundnessCheck{*world};
                operation.run(*world);
            }
            EXPECT_EQ(world->Outcome(), undisturbed);
        }
        EXPECT_EQ(allocations.living, living) << "leaked";
    }
    return faults - 1;
}

/// Under a sanitizer only some allocations fail, which keeps the test's time in proportion.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr const char* usualStride = "13";
#else
constexpr const char* usualStride = "1";
#endif

TEST(AllocationFaults, LeaveEverythingAsItWasAndLeakNothing) {
#if defined(_WIN32)
    GTEST_SKIP() << "the library has allocation functions of its own there";
#endif
    const char* const wanted = std::getenv("KIVVCS_FAULT_STRIDE");
    const long stride = std::stol(wanted == nullptr ? usualStride : wanted);
    long faults = 0;
    for (Operation const& operation : operations) {
        const World prototype;
        const std::string before = prototype.State();
        for (bool laterOnesFailToo : {false, true}) {
            faults += RunWithFaults(
                operation, [] { return std::make_unique<World>(); }, stride, laterOnesFailToo);
            const auto share = [&prototype] { return std::make_unique<World>(prototype); };
            faults += RunWithFaults(operation, share, stride, laterOnesFailToo);
        }
        EXPECT_EQ(prototype.State(), before);
    }
    RecordProperty("faults", std::to_string(faults));
    EXPECT_GE(faults * stride, 20'000);
}

} // namespace
} // namespace KivVcs
