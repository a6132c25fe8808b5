#pragma once

#include "support/PlainTree.h"

#include <cstdio>

namespace KivVcs {

/// What a commit should hold. As in the library, commits are compared as objects and looked up by identifier.
struct PlainCommit {
    using Pointer = std::shared_ptr<const PlainCommit>;

    Pointer parent{};
    optional<PlainTree> root{};
    std::string description{}, author{};
    std::int64_t seconds = 0;
    int biasMinutes = 0;
    std::string id{};

    [[nodiscard]] std::string Text() const {
        char moment[40];
        std::snprintf(moment, sizeof moment, " %lld %c%02d%02d\n", static_cast<long long>(seconds),
                      biasMinutes <= -60 ? '-' : '+', std::abs(biasMinutes) / 60, std::abs(biasMinutes) % 60);
        const std::string signature = " " + author + " <" + author + (author.empty() ? "" : "@x") + ">" + moment;
        return "tree " + (root ? IdOf(*root) : "") + "\n" + (parent ? "parent " + parent->id + "\n" : "") + "author" +
               signature + "committer" + signature + "\n" + description + "\n";
    }
};

/// What a repository should do, with the plainest tables. A tree is stored with the subtrees that its blobs hide, which
/// its identifier does not cover: of trees with one identifier, the first takes the place of all others.
class PlainRepository {
public:
    using Pointer = PlainCommit::Pointer;

    std::map<std::string, Pointer> commits;
    std::map<std::string, PlainTree> trees;
    std::set<std::string> contents;
    std::map<std::string, Pointer> branches{{"master", nullptr}};
    std::string current = "master";

    PlainTree Intern(PlainTree const& tree) { return trees.try_emplace(IdOf(tree), tree).first->second; }
    auto Interning() {
        return [this](PlainTree const& tree) { return Intern(tree); };
    }
    void AddTo(PlainTree& tree, Names const& path, std::string const& content) {
        contents.insert(content);
        Add(tree, path, content, Interning());
    }
    void AddTo(PlainTree& tree, Names const& path, PlainTree const& added) { Add(tree, path, added, Interning()); }

    Pointer Store(PlainCommit commit) {
        commit.id = Identifier("commit", commit.Text());
        return commits.try_emplace(commit.id, std::make_shared<PlainCommit>(commit)).first->second;
    }
    [[nodiscard]] Pointer Head(std::string const& branch) const {
        auto const found = branches.find(branch);
        return found == branches.end() ? nullptr : found->second;
    }
    [[nodiscard]] Pointer Head() const { return Head(current); }
    bool Create(std::string const& branch, Pointer const& head) {
        return !branch.empty() && branches.try_emplace(branch, head ? head : Head()).second;
    }
    bool Move(std::string const& branch, Pointer const& head) {
        if (!head || !branches.contains(branch))
            return false;
        branches[branch] = head;
        return true;
    }

    static Pointer CommonBase(Pointer first, Pointer second) {
        std::set<std::string> seen;
        for (bool areBoth = first && second; areBoth && (first || second);) {
            for (Pointer* each : {&first, &second})
                if (*each && !seen.insert((*each)->id).second)
                    return *each;
            first = first ? first->parent : nullptr;
            second = second ? second->parent : nullptr;
        }
        return nullptr;
    }

    bool FastForward(Pointer const& target) {
        return target && CommonBase(Head(), target) == Head() && Move(current, target);
    }

    Pointer Rebase(Pointer const& commit, Pointer const& base, Pointer parent) {
        if (!commit || !parent)
            return nullptr;
        std::vector<Pointer> line{commit};
        while (commit != base && line.back()->parent && line.back()->parent != base)
            line.push_back(line.back()->parent);
        for (; !line.empty(); line.pop_back()) {
            if (line.back()->parent == parent)
                return commit;
            PlainCommit moved = *line.back();
            moved.parent = parent;
            parent = Store(moved);
        }
        return parent;
    }

    bool EnsureCommonRoot(std::string const& first, std::string const& second, std::string const& rootBranch) {
        if (CommonBase(Head(first), Head(second)))
            return true;
        if (!Head(rootBranch) && !Create(rootBranch, Store({.description = "Root commit"})))
            return false;
        const Pointer root = Head(rootBranch);
        for (auto const& branch : {first, second}) {
            const Pointer head = Head(branch);
            if (!head ? !Create(branch, root) && !Move(branch, root)
                      : !CommonBase(head, root) && !Move(branch, Rebase(head, nullptr, root)))
                return false;
        }
        return true;
    }

    void LinkInOrder(std::vector<Pointer>& line) {
        line.back() = Store(line.back() ? *line.back() : PlainCommit());
        for (std::size_t index = line.size() - 1; index-- > 0;) {
            if (!line[index] || !line[index + 1])
                continue;
            PlainCommit linked = *line[index];
            linked.parent = line[index + 1];
            line[index] = Store(linked);
        }
    }

    /// @return whether unused objects are to be purged
    bool DeleteCommits(Pointer const& newest) {
        std::vector<Pointer> kept;
        std::map<std::string, std::size_t> moves;
        for (Pointer each = newest; each && newest->parent; each = each->parent) {
            PlainCommit detached = *each;
            detached.parent = nullptr;
            for (auto const& [name, head] : branches)
                if (head == each)
                    moves[name] = kept.size();
            if (std::any_of(moves.begin(), moves.end(),
                            [&kept](auto const& move) { return move.second == kept.size(); }))
                kept.push_back(std::make_shared<PlainCommit>(detached));
            commits.erase(each->id);
        }
        if (!kept.empty())
            LinkInOrder(kept);
        for (auto const& [name, index] : moves)
            branches[name] = kept[index];
        return !kept.empty();
    }

    /// @return false if the outcome depends on the order in which commits are visited, which is not specified: a commit
    /// that is kept but not stored stops the rebuild above it, unless a rebuilt one takes its place first
    bool Simplify() {
        const auto former = branches;
        std::set<std::string> kept;
        for (auto const& [name, head] : former)
            for (auto const& [other, otherHead] : former)
                if (const auto base = CommonBase(head, otherHead))
                    kept.insert(base->id);
        auto missing = kept;
        std::erase_if(missing, [this](auto const& id) { return commits.contains(id); });
        std::map<std::string, std::string> parents;
        for (auto const& [name, head] : former) {
            if (!head || !commits.contains(head->id))
                continue;
            std::string child = head->id;
            for (Pointer each = head->parent; each; each = each->parent)
                if (kept.contains(each->id))
                    child = parents[child] = each->id;
        }
        const std::function<void(std::string const&, Pointer const&)> rebuild = [&](auto const& id,
                                                                                    auto const& parent) {
            auto const found = commits.find(id);
            if (found == commits.end())
                return;
            PlainCommit copy = *found->second;
            copy.parent = parent;
            const Pointer rebuilt = Store(copy);
            for (auto const& [name, head] : former)
                if (head && head->id == id)
                    branches[name] = rebuilt;
            for (auto const& [child, below] : parents)
                if (below == id)
                    rebuild(child, rebuilt);
        };
        for (auto const& id : kept)
            if (!parents.contains(id))
                rebuild(id, nullptr);
        return std::none_of(missing.begin(), missing.end(), [this](auto const& id) { return commits.contains(id); });
    }

    /// @param open the commits that the host holds
    /// @param held the trees that it holds, which are not stored themselves
    void Purge(std::vector<Pointer> open, std::vector<PlainTree const*> held) {
        for (auto const& [name, head] : branches)
            open.push_back(head);
        std::set<std::string> usedTrees;
        std::set<std::string> usedContents;
        std::set<PlainCommit const*> seen;
        for (std::size_t index = 0; index < open.size(); ++index) {
            if (!open[index] || !seen.insert(open[index].get()).second)
                continue;
            if (open[index]->root) {
                held.push_back(&*open[index]->root);
                usedTrees.insert(IdOf(*held.back()));
            }
            open.push_back(open[index]->parent);
        }
        for (std::size_t index = 0; index < held.size(); ++index) {
            for (auto const& [name, content] : held[index]->blobs)
                usedContents.insert(content);
            for (auto const& [name, below] : held[index]->trees) {
                held.push_back(&below);
                usedTrees.insert(IdOf(below));
            }
        }
        std::erase_if(commits, [&](auto const& entry) { return !seen.contains(entry.second.get()); });
        std::erase_if(trees, [&](auto const& entry) { return !usedTrees.contains(entry.first); });
        std::erase_if(contents, [&](auto const& content) { return !usedContents.contains(content); });
    }
};

} // namespace KivVcs
