#pragma once

#include "support/Builders.h"
#include "support/PackedForms.h"

#include <span>

namespace KivVcs::Faults {

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
        AddFiles(grown, repository, files);
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

    /// What the branches hold that have been there from the beginning, whatever their histories.
    std::string Contents() const {
        std::string contents;
        for (const char16_t* branch : {u"master", u"topic", u"side", u"twin", u"island"}) {
            const auto head = repository.GetHead(branch);
            contents += NameOf(head) + "{" + Files(head->GetCommitTree()) + "}";
        }
        return contents;
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

/// What is done to a world while allocations fail.
struct Operation {
    const char* name;
    void (*run)(World&);
    /// Branches that it has moved when it fails stay moved.
    bool movesBranches = false;

    friend std::ostream& operator<<(std::ostream& out, Operation const& operation) { return out << operation.name; }
};

std::span<Operation const> OnTrees();
std::span<Operation const> OnCommits();
std::span<Operation const> OnRepositories();
std::span<Operation const> OnFoundation();

inline cow_ptr<Tree> RootOf(World& world, const char* commit) {
    return world.commits[commit]->GetCommitTree()->GetRoot();
}

inline Resolvers AskTimesThenRight() {
    const auto getTime = [](cow_ptr<Blob> const& blob) { return optional<Time>(Time(blob->GetData().GetSize())); };
    const TreeConflictResolver undecided = [](auto const&, auto const&) { return TreeConflictChoice::Undecided; };
    return {ChainResolvers(TimeBasedConflictResolver({u"absent", u"f1"}, getTime), AlwaysChooseRight()),
            ChainResolvers(undecided, [](auto const&, auto const&) { return TreeConflictChoice::Merge; })};
}

} // namespace KivVcs::Faults
