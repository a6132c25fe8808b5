#include "PlainRepository.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <random>

/// Random sequences of operations on a repository and on a plain model of it, which must agree after every step.

namespace KivVcs {
namespace {

void Expect(std::string const& what, auto const& actual, auto const& expected) {
    if (actual == expected)
        return;
    std::ostringstream message;
    message << what << " is\n  " << actual << "\ninstead of\n  " << expected;
    throw std::runtime_error(message.str());
}

std::string IdText(auto const& object) {
    return object ? Narrow(object->GetId().GetText()) : "none";
}
std::string IdText(PlainCommit::Pointer const& commit) {
    return commit ? commit->id : "none";
}
std::string IdText(optional<PlainTree> const& tree) {
    return tree ? IdOf(*tree) : "none";
}

/// What is at a path, a blob before a tree of the same name.
std::string IdAt(PlainTree const& tree, std::span<std::string const> path) {
    if (path.size() < 2)
        return path.empty() ? "" : VisibleId(tree, path[0]);
    auto const below = tree.trees.find(path[0]);
    return below == tree.trees.end() ? "" : IdAt(below->second, path.subspan(1));
}

std::size_t CountBlobs(PlainTree const& tree) {
    std::size_t count = tree.blobs.size();
    for (auto const& [name, below] : tree.trees)
        count += CountBlobs(below);
    return count;
}

cow_ptr<Tree> RootOf(cow_ptr<Commit> const& commit) {
    return commit && commit->GetCommitTree() ? commit->GetCommitTree()->GetRoot() : nullptr;
}

void TakeTime(PlainCommit& plain, Commit const& commit) {
    plain.seconds = commit.GetCommitTime().ToTimeT(TimeZone::Utc);
    plain.biasMinutes = static_cast<int>(commit.GetCommitTimezoneBias().GetTicks() / 600'000'000);
}

/// Settles conflicts by their path, now and then not at all; always by merging and for the left side if the salt is 0.
/// Mirrored, it says right for left.
struct Answers {
    unsigned salt;
    bool isMirrored = false;
    std::string asked{};

    int operator()(std::string const& path, bool isTree) {
        asked += path + (isTree ? "? " : " ");
        unsigned hash = salt;
        for (char letter : path)
            hash = (hash ^ static_cast<unsigned char>(letter)) * 0x01000193U;
        hash = salt == 0 ? 0 : (hash ^ hash >> 15U) % 40;
        const int decided = static_cast<int>(hash % 3) + (isTree ? 1 : 0);
        if (isTree && (path.empty() || hash > 12 || hash == 0))
            return 0;
        if (hash == 7)
            return isTree ? 4 : 3;
        const int root = isTree ? 3 : 2;
        return isMirrored && decided != root ? (isTree ? 3 : 1) - decided : decided;
    }

    Resolvers AsResolvers() {
        using Path = array_view<KivStringViewT<char16_t> const>;
        const auto ask = [this](Path path, bool isTree) {
            std::string text;
            for (auto name : path)
                text += Narrow(name) + "/";
            return (*this)(isTree ? text : text.substr(0, text.size() - 1), isTree);
        };
        return {[ask](Path path, MergeTrees const&) { return static_cast<ConflictChoice>(ask(path, false)); },
                [ask](Path path, MergeTrees const&) { return static_cast<TreeConflictChoice>(ask(path, true)); }};
    }
};

/// A commit and what it should be; likewise a tree.
struct Version {
    cow_ptr<Commit> commit{};
    PlainCommit::Pointer plain{};
    std::string files = "-";
};
struct Side {
    cow_ptr<Tree> tree{};
    optional<PlainTree> plain{};
};

struct World {
    int Below(int limit) { return static_cast<int>(random() % static_cast<unsigned>(limit)); }
    std::string Note(std::string const& text) {
        log += " " + (text.empty() ? "''" : text);
        return text;
    }

    std::string PickContent() { return Note(std::to_string(Below(3))); }
    std::string PickBranch() {
        return Note(std::array<const char*, 12>{"master", "master", "master", "b", "b", "c", "c", "d", "d", "e", "e",
                                                ""}[static_cast<std::size_t>(Below(12))]);
    }
    std::pair<KivStringT<char16_t>, Names> PickPath() {
        Names names;
        std::string text = Below(8) == 0 ? "/" : "";
        for (int left = Below(20) == 0 ? 0 : Below(3) + 1; left > 0; --left) {
            names.push_back(std::string(1, static_cast<char>('a' + Below(3))));
            text += names.back() + (left > 1 ? "/" : "") + (Below(12) == 0 ? "/" : "");
        }
        return {Wide(Note(text)), names};
    }
    Version PickVersion() {
        Version version;
        for (int attempt = Below(4); attempt < 4 && !version.plain; ++attempt) {
            if (!held.empty() && Below(2) == 0)
                version = held[static_cast<std::size_t>(Below(static_cast<int>(held.size())))];
            else if (const auto branch = PickBranch(); plain.Head(branch))
                version = {repository.GetHead(Wide(branch)), plain.Head(branch)};
        }
        for (int up = Below(3); up > 0 && version.plain && (version.plain->parent || Below(9) == 0); --up)
            version = {version.commit->GetParent(), version.plain->parent};
        version.files = version.plain && version.plain->root ? Files(*version.plain->root) : "-";
        Note(IdText(version.plain).substr(0, 6));
        return version;
    }
    /// The host's tree, or the root of a commit unless that has grown large.
    Side PickSide() {
        if (Below(6) == 0 && Files(plainTree).size() < 300)
            return {immu::make<Tree>(tree), plainTree};
        const Version version = PickVersion();
        const bool isSmall = version.plain && version.files.size() < 300;
        return isSmall ? Side{RootOf(version.commit), version.plain->root} : Side();
    }

    /// Edits the draft or the host's tree, whose operations have the same names.
    void Edit(auto edit, auto editPlain) {
        const bool isDraft = Below(3) != 0;
        Note(isDraft ? "in the draft" : "in the tree");
        PlainTree edited = isDraft ? plainDraft.root.value_or(PlainTree()) : plainTree;
        const bool isEdited = editPlain(edited);
        Expect("the result", isDraft ? edit(draft) : edit(tree), isEdited);
        if (isEdited && isDraft)
            plainDraft.root = plain.Intern(edited);
        else if (isEdited)
            plainTree = edited;
    }
    void EditPath(auto edit, auto const& added) {
        const auto path = PickPath();
        Edit([&](auto& target) { return edit(target, path.first); },
             [&](PlainTree& target) {
                 if (!path.second.empty())
                     plain.AddTo(target, path.second, added);
                 return !path.second.empty();
             });
    }

    /// Merges here and there. @return the identifier of the result
    std::string Merge(Side const& left, Side const& root, Side const& right, Answers answers) {
        Answers plainAnswers = answers;
        const auto merged = ThreeWayMerge(&repository, {left.tree, root.tree, right.tree}, answers.AsResolvers());
        const auto expected = MergePlainly(left.plain, root.plain, right.plain, plainAnswers);
        Expect("the merged tree", IdText(merged), IdText(expected));
        Expect("what is asked", answers.asked, plainAnswers.asked);
        return IdText(merged);
    }
    optional<PlainTree> MergePlainly(optional<PlainTree> const& left, optional<PlainTree> const& root,
                                     optional<PlainTree> const& right, Answers& answers) {
        return PlainMerge(plain, std::ref(answers)).Run(left, root, right);
    }

    void MergeCommit(bool alwaysByTrees) {
        const Version version = PickVersion();
        Answers answers{static_cast<unsigned>(random())};
        Answers plainAnswers = answers;
        const PlainCommit::Pointer head = plain.Head();
        bool expected = false;
        const bool done = alwaysByTrees ? repository.Merge3Way(version.commit, answers.AsResolvers())
                                        : repository.Merge(version.commit, answers.AsResolvers());
        if (version.plain && !alwaysByTrees)
            expected = head ? plain.FastForward(version.plain) : plain.Move(plain.current, version.plain);
        if (version.plain && head && !expected) {
            const auto base = plain.CommonBase(head, version.plain);
            const auto merged =
                MergePlainly(head->root, base ? base->root : std::nullopt, version.plain->root, plainAnswers);
            expected = merged.has_value();
            if (merged) {
                PlainCommit commit{.parent = head, .root = plain.Intern(*merged)};
                TakeTime(commit, *repository.GetHead());
                plain.branches[plain.current] = plain.Store(commit);
            }
        }
        Expect("the result", done, expected);
        Expect("what is asked", answers.asked, plainAnswers.asked);
    }

    void Purge() {
        std::vector<PlainCommit::Pointer> commits{std::make_shared<PlainCommit>(plainDraft)};
        for (Version const& version : held)
            commits.push_back(version.plain);
        plain.Purge(std::move(commits), {&plainTree});
    }

    void Check() {
        Expect("the number of commits", repository.GetCommitCount(), plain.commits.size());
        Expect("the number of trees", repository.GetTreeCount(), plain.trees.size());
        Expect("the number of blobs", repository.GetBlobCount(), plain.contents.size());
        Expect("the number of branches", repository.GetStorage()->GetRefs().size(), plain.branches.size());
        Expect("the current branch", Narrow(repository.GetCurentBranch()), plain.current);
        for (auto const& [name, head] : plain.branches)
            Expect("the head of " + name, IdText(repository.GetHead(Wide(name))), IdText(head));
    }

    /// The content of everything that is stored or held.
    void CheckAll() {
        for (auto const& [id, commit] : plain.commits) {
            const auto stored = repository.GetCommitFromStorage(Id(Wide(id)));
            Expect("a stored commit", stored ? Bytes(stored->GetData()) : "missing", commit->Text());
        }
        for (auto const& [id, each] : plain.trees) {
            const auto stored = repository.GetTreeFromStorage(Id(Wide(id)));
            Expect("a stored tree", Files(stored), Files(each));
            Expect("its data", Bytes(stored->GetData()), Data(each));
        }
        for (auto const& content : plain.contents)
            Expect("stored", !!repository.GetBlobFromStorage(MakeBlob(content).GetId()), true);
        for (Version const& version : held) {
            Expect("an old version", Files(RootOf(version.commit)), version.files);
            Expect("its identifier", IdText(version.commit), IdText(version.plain));
        }
        Expect("the draft", Bytes(draft.GetData()), plainDraft.Text());
        Expect("the tree", Files(immu::make<Tree>(tree)), Files(plainTree));
        Expect("its data", Bytes(tree.GetData()), Data(plainTree));
        Expect("its blobs", tree.GetDeepBlobCount(), CountBlobs(plainTree));
        const auto path = PickPath();
        const auto found = tree.GetDeepObject(path.first);
        Expect("what is found", found ? IdText(found) : "", IdAt(plainTree, path.second));
        const Side other = PickSide();
        const auto differing = DeepDiffs(plainTree, other.plain.value_or(PlainTree()));
        Expect("the differences", Joined(ToNames(tree.GetDeepBlobDiffs(other.tree))), Joined(Sorted(differing)));
    }

    Repository repository{std::make_unique<MemObjectsStorage>()};
    PlainRepository plain;
    Commit draft{cow_ptr<Commit>(), false};
    PlainCommit plainDraft;
    Tree tree;
    PlainTree plainTree;
    std::vector<Version> held;
    std::minstd_rand random;
    std::string log;
};

struct Action {
    const char* name;
    int weight;
    void (*run)(World&);
};

// clang-format off
const Action actions[] = {
    {"AddBlob", 24, [](World& w) {
         const std::string content = w.PickContent();
         const Blob blob = MakeBlob(content);
         w.EditPath([&](auto& to, auto const& path) { return !!to.AddBlob(&w.repository, path, blob); }, content);
     }},
    {"AddTree", 6, [](World& w) {
         const Side side = w.PickSide();
         const Tree added = side.tree ? *side.tree : Tree();
         w.EditPath([&](auto& to, auto const& path) { return !!to.AddTree(&w.repository, path, added); },
                    side.plain.value_or(PlainTree()));
     }},
    {"AddObject", 6, [](World& w) {
         const std::string content = w.PickContent();
         const Side side = w.PickSide();
         const std::string id = w.Below(2) == 0 ? Identifier("blob", content) : IdText(side.plain);
         const auto add = [&](auto& to, auto const& path) { return !!to.AddObject(&w.repository, path, Id(Wide(id))); };
         if (id != IdText(side.plain) && w.plain.contents.contains(content))
             w.EditPath(add, content);
         else if (w.plain.trees.contains(id))
             w.EditPath(add, PlainTree(w.plain.trees[id]));
         else
             w.Edit([&](auto& to) { return add(to, u"a"); }, [](PlainTree&) { return false; });
     }},
    {"RemoveObject", 14, [](World& w) {
         const auto path = w.PickPath();
         w.Edit([&](auto& from) { return from.RemoveObject(&w.repository, path.first); },
                [&](PlainTree& from) {
                    return !path.second.empty() && Remove(from, path.second, w.plain.Interning());
                });
     }},
    {"take the root", 4, [](World& w) {
         const Side side = w.PickSide();
         w.tree = side.tree ? *side.tree : Tree();
         w.plainTree = side.plain.value_or(PlainTree());
     }},
    {"ReplaceRoot", 2, [](World& w) {
         w.draft.ReplaceRoot(&w.repository, immu::make<Tree>(w.tree));
         w.draft.ResetState();
         w.plainDraft.root = w.plain.Intern(w.plainTree);
     }},
    {"describe", 4, [](World& w) {
         w.plainDraft.description = w.PickContent() + "\n" + w.PickContent();
         w.plainDraft.author = "author" + w.PickContent();
         w.plainDraft.seconds = w.Below(3) - 1;
         w.plainDraft.biasMinutes = std::array{0, 60, -330, -30, 345}[static_cast<std::size_t>(w.Below(5))];
         w.draft.SetDescription(Wide(w.plainDraft.description));
         w.draft.SetAuthorName(Wide(w.plainDraft.author));
         w.draft.SetAuthorEmail(Wide(w.plainDraft.author + "@x"));
         w.draft.SetCommitTime(Time::FromTimeT(w.plainDraft.seconds, TimeZone::Utc));
         w.draft.SetCommitTimezoneBias(TimeDelta(w.plainDraft.biasMinutes * std::int64_t{600'000'000}));
     }},
    {"begin a commit", 16, [](World& w) {
         const bool isAmend = w.Below(4) == 0;
         const Version on = w.Below(2) == 0 ? Version{w.repository.GetHead(), w.plain.Head()} : w.PickVersion();
         w.draft = Commit(on.commit, isAmend);
         w.plainDraft = on.plain ? *on.plain : PlainCommit();
         if (!isAmend)
             w.plainDraft = {.parent = on.plain, .root = w.plainDraft.root};
         w.plainDraft.seconds = w.plainDraft.biasMinutes = 0;
     }},
    {"DoCommit", 14, [](World& w) {
         const auto done = w.repository.DoCommit(w.draft);
         Expect("whether it is committed", !!done, !w.draft.IsAmend() || w.plain.Head());
         if (!done)
             return;
         TakeTime(w.plainDraft, *done);
         const auto stored = w.plain.Store(w.plainDraft);
         w.plain.Move(w.plain.current, stored);
         Expect("the commit", IdText(done), IdText(stored));
     }},
    {"store the commit", 6, [](World& w) {
         const auto branch = w.PickBranch();
         const auto stored = w.repository.SyncWithStorage(immu::make<Commit>(w.draft));
         const bool done = w.plain.Move(branch, w.plain.Store(w.plainDraft));
         Expect("done", w.repository.MoveBranchTo(Wide(branch), stored), done);
     }},
    {"MakeCommitLinksInOrder", 2, [](World& w) {
         std::vector<cow_ptr<Commit>> line;
         std::vector<PlainCommit::Pointer> plain;
         for (int left = w.Below(3) + 1; left > 0; --left) {
             const Version version = w.PickVersion();
             line.push_back(version.commit);
             plain.push_back(version.plain);
         }
         Commit::MakeCommitLinksInOrder(line, &w.repository);
         w.plain.LinkInOrder(plain);
         for (std::size_t index = 0; index < line.size(); ++index)
             Expect("a linked commit", IdText(line[index]), IdText(plain[index]));
     }},
    {"CreateBranch", 8, [](World& w) {
         const auto [branch, version] = std::pair{w.PickBranch(), w.PickVersion()};
         const bool done = w.plain.Create(branch, version.plain);
         Expect("done", w.repository.CreateBranch(Wide(branch), version.commit), done);
     }},
    {"MoveBranchTo", 4, [](World& w) {
         const auto [branch, version] = std::pair{w.PickBranch(), w.PickVersion()};
         const bool done = w.plain.Move(branch, version.plain);
         Expect("done", w.repository.MoveBranchTo(Wide(branch), version.commit), done);
     }},
    {"RemoveBranch", 2, [](World& w) {
         const auto branch = w.PickBranch();
         Expect("done", w.repository.RemoveBranch(Wide(branch)), w.plain.branches.erase(branch) > 0);
     }},
    {"Checkout", 5, [](World& w) {
         const auto branch = w.PickBranch();
         Expect("done", w.repository.Checkout(Wide(branch)), w.plain.branches.contains(branch));
         w.plain.current = w.plain.branches.contains(branch) ? branch : w.plain.current;
     }},
    {"Merge", 8, [](World& w) { w.MergeCommit(false); }},
    {"Merge3Way", 4, [](World& w) { w.MergeCommit(true); }},
    {"FastForwardMerge", 4, [](World& w) {
         const Version version = w.PickVersion();
         const auto base = w.plain.CommonBase(w.plain.Head(), version.plain);
         Expect("the base", IdText(w.repository.GetCommonBase(w.repository.GetHead(), version.commit)), IdText(base));
         Expect("done", w.repository.FastForwardMerge(version.commit), w.plain.FastForward(version.plain));
     }},
    {"MergelessRebase", 4, [](World& w) {
         const auto [commit, base, onto] = std::tuple{w.PickVersion(), w.PickVersion(), w.PickVersion()};
         const auto moved = w.repository.MergelessRebase(commit.commit, base.commit, onto.commit);
         const auto expected = w.plain.Rebase(commit.plain, base.plain, onto.plain);
         Expect("the new tip", IdText(moved), IdText(expected));
         w.repository.MoveBranchTo(u"b", moved);
         w.plain.Move("b", expected);
     }},
    {"MergelessRebase of a branch", 3, [](World& w) {
         const auto [branch, onto] = std::pair{w.PickBranch(), w.PickBranch()};
         const auto [head, target] = std::pair{w.plain.Head(branch), w.plain.Head(onto)};
         const auto expected = w.plain.Rebase(head, w.plain.CommonBase(head, target), target);
         Expect("the new tip", IdText(w.repository.MergelessRebase(Wide(branch), Wide(onto))), IdText(expected));
     }},
    {"Clone", 1, [](World& w) {
         Repository clone(w.repository.GetStorage()->Clone());
         Commit commit(&clone, false);
         clone.DoCommit(commit);
         clone.RemoveBranch(w.PickBranch() == "b" ? u"b" : u"c");
         clone.UpdateStorage();
         Expect("the clone's trees", clone.GetTreeCount(), w.repository.GetTreeCount());
     }},
    {"EnsureCommonRootFor", 2, [](World& w) {
         const auto [one, other, root] = std::tuple{w.PickBranch(), w.PickBranch(), w.PickBranch()};
         const bool done = w.plain.EnsureCommonRoot(one, other, root);
         Expect("done", w.repository.EnsureCommonRootFor(Wide(one), Wide(other), Wide(root)), done);
     }},
    {"DeleteCommits", 1, [](World& w) {
         Version version = w.PickVersion();
         Expect("deleted", w.repository.DeleteCommits(std::move(version.commit)), true);
         const bool isPurged = w.plain.DeleteCommits(version.plain);
         version = {};
         if (isPurged)
             w.Purge();
     }},
    {"SimplifyCommitGraph", 1, [](World& w) {
         PlainRepository simplified = w.plain;
         if (!simplified.Simplify())
             return;
         w.plain = std::move(simplified);
         const bool isPurged = w.Below(2) == 0;
         Expect("simplified", w.repository.SimplifyCommitGraph(isPurged), true);
         if (isPurged)
             w.Purge();
     }},
    {"UpdateStorage", 2, [](World& w) {
         w.repository.UpdateStorage();
         w.Purge();
     }},
    {"hold", 5, [](World& w) {
         Version version = w.PickVersion();
         if (w.held.size() > 4)
             w.held.erase(w.held.begin() + w.Below(4));
         w.held.push_back(version);
     }},
    {"read back", 4, [](World& w) {
         const Version version = w.PickVersion();
         // An empty directory has no data and is not read back.
         const bool hasEmpty = version.files.empty() || (version.files + " ").find("/ ") != std::string::npos;
         if (hasEmpty || !version.plain || !w.plain.commits.contains(version.plain->id))
             return;
         PackedFormsOf forms(w.repository);
         Repository mirror(std::make_unique<MemObjectsStorage>());
         Id parent;
         auto read = Commit::Deserialize(version.commit->GetId(), parent, &mirror, forms.Loader());
         read.write()->SetParent(version.commit->GetParent());
         read.write()->SetDescription(version.commit->GetDescription());
         Expect("the commit", IdText(read), IdText(version.plain));
         Expect("the tree", IdText(RootOf(read)), IdText(version.plain->root));
         Expect("its parent", Narrow(parent.GetText()), version.plain->parent ? version.plain->parent->id : "");
     }},
    {"laws of merging", 6, [](World& w) {
         const Side left = w.PickSide();
         const Side root = w.PickSide();
         const Side right = w.PickSide();
         const unsigned salt = static_cast<unsigned>(w.Below(4)) * 7919;
         Expect("mirrored", w.Merge(left, root, right, {salt}), w.Merge(right, root, left, {salt, true}));
         if (!left.tree)
             return;
         const Side equal{immu::make<Tree>(*left.tree), left.plain};
         Expect("merge(a, r, a)", w.Merge(left, root, equal, {1}), IdText(left.plain));
         // A tree with a name of both kinds differs from itself there, so that its side counts as changed.
         const auto isDoubled = [&root](auto const& below) { return root.plain->blobs.contains(below.first); };
         if (root.plain && std::none_of(root.plain->trees.begin(), root.plain->trees.end(), isDoubled))
             Expect("merge(a, r, r)", w.Merge(left, root, root, {0}), IdText(left.plain));
     }},
    {"order of edits", 4, [](World& w) {
         const Side base = w.PickSide();
         std::map<Names, std::pair<KivStringT<char16_t>, std::string>> edits;
         for (int left = 4; left > 0; --left) {
             const auto path = w.PickPath();
             edits[path.second] = {path.first, w.PickContent()};
         }
         edits.erase(Names());
         const auto edited = [&](auto const& ordered) {
             Tree tree = base.tree ? *base.tree : Tree();
             PlainTree plain = base.plain.value_or(PlainTree());
             for (auto const& [names, edit] : ordered) {
                 tree.AddBlob(&w.repository, edit.first, MakeBlob(edit.second));
                 w.plain.AddTo(plain, names, edit.second);
             }
             Expect("the tree", Narrow(tree.GetId().GetText()), IdOf(plain));
             return IdOf(plain);
         };
         Expect("in the other order", edited(std::vector(edits.rbegin(), edits.rend())), edited(edits));
     }},
};
// clang-format on

/// One action and the number from which it draws what it needs, so that any others can be left out.
struct Step {
    Action const* action;
    unsigned number;
};

/// What goes wrong, with all steps up to there; empty if nothing does.
std::string Failure(std::vector<Step> const& steps) {
    World world;
    try {
        for (Step const& step : steps) {
            world.log += std::string("\n") + step.action->name;
            world.random.seed(step.number);
            step.action->run(world);
            world.Check();
            if (step.number % 32 == 0 || &step == &steps.back())
                world.CheckAll();
        }
        return "";
    } catch (std::exception const& failure) {
        return world.log + "\n" + failure.what();
    }
}

/// Leaves out what the failure does not need, in ever smaller pieces.
std::vector<Step> Shrunk(std::vector<Step> steps) {
    for (std::size_t size = steps.size(); size > 0;) {
        const std::size_t before = steps.size();
        for (std::size_t from = 0; from < steps.size();) {
            auto fewer = steps;
            const auto first = fewer.begin() + static_cast<std::ptrdiff_t>(from);
            fewer.erase(first, first + static_cast<std::ptrdiff_t>(std::min(size, steps.size() - from)));
            if (Failure(fewer).empty())
                from += size;
            else
                steps = fewer;
        }
        size = size == 1 && steps.size() < before ? 1 : size / 2;
    }
    return steps;
}

int FromEnvironment(const char* name, int usual) {
    const char* const value = std::getenv(name);
    return value == nullptr ? usual : std::atoi(value);
}

class RandomOperations : public testing::TestWithParam<int> {};

TEST_P(RandomOperations, DoWhatThePlainModelDoes) {
    std::vector<Action const*> lots;
    for (Action const& action : actions)
        lots.insert(lots.end(), static_cast<std::size_t>(action.weight), &action);
    std::mt19937 random(static_cast<unsigned>(GetParam()));
    for (int left = FromEnvironment("KIVVCS_MODEL_STEPS", 4000); left > 0;) {
        std::vector<Step> steps(static_cast<std::size_t>(std::min(left, 300)));
        for (Step& step : steps)
            step = {lots[random() % lots.size()], static_cast<unsigned>(random())};
        left -= static_cast<int>(steps.size());
        if (!Failure(steps).empty()) {
            steps = Shrunk(steps);
            FAIL() << "seed " << GetParam() << ", shrunk to " << steps.size() << " steps:" << Failure(steps);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomOperations, testing::Range(1, FromEnvironment("KIVVCS_MODEL_SEEDS", 20) + 1));

} // namespace
} // namespace KivVcs
