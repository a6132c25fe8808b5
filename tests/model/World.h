#pragma once

#include "support/Builders.h"
#include "support/InterruptingHost.h"
#include "support/PlainMerge.h"

#include <array>
#include <random>
#include <sstream>

/// A repository and a plain model of it, on which the same operations are run, and what an operation draws at random.

namespace KivVcs::Model {

inline void Expect(std::string const& what, auto const& actual, auto const& expected) {
    if (actual == expected)
        return;
    std::ostringstream message;
    message << what << " is\n  " << actual << "\ninstead of\n  " << expected;
    throw std::runtime_error(message.str());
}

template <class T>
std::string IdText(cow_ptr<T> const& object) {
    return object ? IdText(*object) : "none";
}
inline std::string IdText(PlainCommit::Pointer const& commit) {
    return commit ? commit->id : "none";
}
inline std::string IdText(optional<PlainTree> const& tree) {
    return tree ? IdOf(*tree) : "none";
}

/// What is at a path, a blob before a tree of the same name.
inline std::string IdAt(PlainTree const& tree, std::span<std::string const> path) {
    if (path.size() < 2)
        return path.empty() ? "" : VisibleId(tree, path[0]);
    auto const below = tree.trees.find(path[0]);
    return below == tree.trees.end() ? "" : IdAt(below->second, path.subspan(1));
}

inline std::size_t CountBlobs(PlainTree const& tree) {
    std::size_t count = tree.blobs.size();
    for (auto const& [name, below] : tree.trees)
        count += CountBlobs(below);
    return count;
}

inline cow_ptr<Tree> RootOf(cow_ptr<Commit> const& commit) {
    return commit && commit->GetCommitTree() ? commit->GetCommitTree()->GetRoot() : nullptr;
}

inline void TakeTime(PlainCommit& plain, Commit const& commit) {
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

    Resolvers AsResolvers(HostCalls& calls) {
        using Path = array_view<KivStringViewT<char16_t> const>;
        const auto ask = [this, &calls](Path path, bool isTree) {
            calls.Count();
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

    /// An object as it is, or one of a host's class that stands for it.
    cow_ptr<Blob> PickClass(std::string const& content) {
        return Below(3) == 0 ? cow_ptr<Blob>(immu::make<FetchedBlob>(content, calls))
                             : immu::make<Blob>(MakeBlob(content));
    }
    template <class T>
    cow_ptr<T> PickClass(T const& object) {
        return Below(3) == 0 ? cow_ptr<T>(immu::make<HostsOwn<T>>(object, calls)) : immu::make<T>(object);
    }

    /// Lets @p begun, which was begun on @p on, fetch parent and root when they are asked for.
    void Defer(Commit& begun, Version const& on) {
        kept.push_back(on);
        if (const auto parent = begun.GetParent())
            begun.DeferParent(parent->GetId(), [this, parent](Id const&) { return calls.Count(), parent; });
        if (const auto root = begun.GetCommitTree()->GetRoot())
            begun.DeferRoot(root->GetId(), [this, root](Id const&) { return calls.Count(), root; });
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
            return {PickClass(tree), plainTree};
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
        const auto merged = ThreeWayMerge(&repository, {left.tree, root.tree, right.tree}, answers.AsResolvers(calls));
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
        const bool done = alwaysByTrees ? repository.Merge3Way(version.commit, answers.AsResolvers(calls))
                                        : repository.Merge(version.commit, answers.AsResolvers(calls));
        NeedHost();
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
        for (auto const* versions : {&held, &kept})
            for (Version const& version : *versions)
                commits.push_back(version.plain);
        plain.Purge(std::move(commits), {&plainTree});
    }

    /// Runs an action as @p number decides: now and then a call to the host fails in its midst, and must leave everything as
    /// it was, but for what may have been stored already.
    void Run(auto action, unsigned number) {
        random.seed(number);
        calls.PermitContent(false);
        if (number % 4 != 0) {
            action(*this);
        } else {
            auto former = std::tuple(plain, plainDraft, plainTree);
            calls.InterruptAt(1 + number / 4 % 24);
            try {
                action(*this);
            } catch (Interruption const&) {
                log += "\ninterrupted, and once more";
                std::tie(plain, plainDraft, plainTree) = std::move(former);
                Recover();
                random.seed(number);
                calls.PermitContent(false);
                action(*this);
            }
        }
        NeedHost();
    }

    /// Nothing fails from now on, and content may be asked for.
    void NeedHost() {
        calls.InterruptAt(0);
        calls.PermitContent(true);
    }

    /// Purges what was stored before an interruption, and expects everything else as it was.
    void Recover() {
        NeedHost();
        TakeTime(plainDraft, draft);
        repository.UpdateStorage();
        Purge();
        CheckAll();
    }

    /// Runs an operation that may stop halfway in a clone, and expects that each head has the content that it had.
    void InterruptInClone(auto operation) {
        InterruptingRepository clone(repository.GetStorage()->Clone(), calls);
        calls.InterruptAt(1 + static_cast<unsigned>(Below(60)));
        try {
            operation(clone);
        } catch (Interruption const&) {
        }
        NeedHost();
        for (auto const& [name, head] : plain.branches) {
            if (!head)
                continue;
            const auto found = clone.GetHead(Wide(name));
            Expect("the content of " + name, Files(RootOf(found)), head->root ? Files(*head->root) : "-");
            Commit fresh(*found);
            fresh.ResetState();
            Expect("its identifier", IdText(found), IdText(fresh));
        }
        operation(clone);
        clone.UpdateStorage();
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

    HostCalls calls;
    InterruptingRepository repository{std::make_unique<InterruptingStorage>(calls), calls};
    PlainRepository plain;
    Commit draft{cow_ptr<Commit>(), false};
    PlainCommit plainDraft;
    Tree tree;
    PlainTree plainTree;
    std::vector<Version> held;
    /// What functions that fetch have to keep alive.
    std::vector<Version> kept;
    std::minstd_rand random;
    std::string log;
};

/// Something to do to both, and how often among others.
struct Action {
    const char* name;
    int weight;
    void (*run)(World&);
};

std::span<Action const> Editing();
std::span<Action const> Branches();
std::span<Action const> Pruning();
std::span<Action const> Merging();

} // namespace KivVcs::Model
