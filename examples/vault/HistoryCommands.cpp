#include "Commands.h"
#include "Problem.h"
#include "Revision.h"
#include "Vault.h"

#include <algorithm>
#include <iostream>
#include <set>

namespace vault {

using Access = VaultFile::Access;
using KivVcs::Id;

namespace {

constexpr char16_t const* forgetMark = u":forget";
constexpr std::string_view otherPrefix = "other/";

CommitHandle RequireBranch(KivVcs::Repository const& repository, std::string const& name) {
    const auto branch = RequireUtf8(name, "a branch name");
    if (!repository.GetStorage()->BranchExist(branch))
        throw Problem("no such branch: " + Printable(name));
    return repository.GetHead(branch);
}

/// The branches whose history leads from above down to @p commit.
std::map<std::string, CommitHandle> BranchesAbove(KivVcs::Repository const& repository, CommitHandle const& commit) {
    std::map<std::string, CommitHandle> above;
    for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
        if (head && head != commit && repository.GetCommonBase(head, commit) == commit)
            above.emplace(ToUtf8(name), head);
    }
    return above;
}

/// Deleting takes commits out of the storage that branches still need, and stores some anew that equal them. Those would
/// be purged, since no branch holds them: the storage is to have the very objects that the branches hold.
void StoreReachableCommits(KivVcs::Repository& repository) {
    std::unordered_set<Id> visited;
    std::vector<CommitHandle> reachable;
    for (auto const& [name, head] : repository.GetStorage()->GetRefs()) {
        for (auto commit = head; commit && visited.insert(commit->GetId()).second; commit = commit->GetParent())
            reachable.push_back(commit);
    }
    for (auto const& commit : reachable) {
        repository.GetStorage()->DeleteCommit(commit);
        repository.AddCommitToStorage(commit);
    }
}

/// The library deletes a history with its top; a branch at the top makes it survive, and what lies above is put on top
/// again.
void ForgetBelow(KivVcs::Repository& repository, CommitHandle const& commit) {
    const auto above = BranchesAbove(repository, commit);
    repository.CreateBranch(forgetMark, commit);
    repository.DeleteCommits(commit);
    const auto kept = repository.GetHead(forgetMark);
    for (auto const& [name, head] : above)
        repository.MoveBranchTo(RequireUtf8(name, "a branch name"), repository.MergelessRebase(head, commit, kept));
    repository.RemoveBranch(forgetMark);
    StoreReachableCommits(repository);
}

/// Graphviz takes what looks like an entity of HTML for one, in plain labels too.
std::string Quoted(std::string const& text) {
    std::string quoted = "\"";
    for (const char c : text) {
        if (c == '"' || c == '\\')
            quoted += '\\';
        quoted += c;
        if (c == '&')
            quoted += "amp;";
    }
    return quoted + '"';
}

void DrawHistory(CommitHandle commit, std::set<std::string>& drawn) {
    for (; commit; commit = commit->GetParent()) {
        const auto id = ToUtf8(commit->GetId());
        if (!drawn.insert(id).second)
            return;
        std::cout << "  \"" << id
                  << "\" [label=" << Quoted(Shortened(commit->GetId()) + "  " + Printable(commit->GetDescription()))
                  << "];\n";
        if (const auto parent = commit->GetParent())
            std::cout << "  \"" << id << "\" -> \"" << ToUtf8(parent->GetId()) << "\";\n";
    }
}

} // namespace

void DeleteBranch(Path const& file, std::string const& name) {
    Vault vault(file, Access::Write);
    const auto head = RequireBranch(vault.Repository(), name);
    if (ToUtf8(vault.Repository().GetCurentBranch()) == name)
        throw Problem("the current branch cannot be deleted");
    vault.Repository().RemoveBranch(RequireUtf8(name, "a branch name"));
    vault.Write();
}

void Rebase(Path const& file, std::string const& branch, std::string const& onto) {
    Vault vault(file, Access::Write);
    auto& repository = vault.Repository();
    const auto head = RequireBranch(repository, branch);
    const auto ontoHead = RequireBranch(repository, onto);
    const auto base = repository.GetCommonBase(head, ontoHead);
    if (!head || !ontoHead || base == head || base == ontoHead) {
        std::cout << "nothing to rebase\n";
        return;
    }
    const auto tip = repository.MergelessRebase(head, base, ontoHead);
    repository.MoveBranchTo(RequireUtf8(branch, "a branch name"), tip);
    vault.Write();
    std::cout << Printable(branch) << " is now " << ToUtf8(tip->GetId()) << '\n';
}

void Join(Path const& file, std::string const& first, std::string const& second, std::string const& root) {
    const auto rootBranch = RequireBranchName(root);
    Vault vault(file, Access::Write);
    auto& repository = vault.Repository();
    RequireBranch(repository, first);
    RequireBranch(repository, second);
    if (!repository.EnsureCommonRootFor(RequireUtf8(first, "a branch name"), RequireUtf8(second, "a branch name"),
                                        rootBranch))
        throw Problem("these branches cannot be joined");
    vault.Write();
    std::cout << Printable(first) << " and " << Printable(second) << " have a common root\n";
}

void Forget(Path const& file, std::string const& revision) {
    Vault vault(file, Access::Write);
    auto commit = FindRevision(vault.Repository(), revision);
    if (!commit->GetParent()) {
        std::cout << "there is nothing below " << Printable(revision) << '\n';
        return;
    }
    ForgetBelow(vault.Repository(), commit);
    // Whatever is still held stays in the storage, and so in the file.
    commit.reset();
    vault.WriteAndPrune();
}

void Compact(Path const& file) {
    Vault vault(file, Access::Write);
    const auto before = std::filesystem::file_size(file);
    vault.Repository().SimplifyCommitGraph(true);
    vault.WriteAndPrune();
    try {
        vault.File().Shrink();
    } catch (Problem const& problem) {
        throw Problem(std::string("the history was compacted, but the file was not made smaller: ") + problem.what(),
                      problem.ExitStatus());
    }
    const auto after = std::filesystem::file_size(file);
    std::cout << before - std::min(before, after) << " bytes reclaimed, " << after << " left\n";
}

void Graph(Path const& file) {
    Vault vault(file, Access::Read);
    const auto current = ToUtf8(vault.Repository().GetCurentBranch());
    std::set<std::string> drawn;
    std::cout << "digraph vault {\n  rankdir=BT;\n  node [shape=box, style=rounded, fontname=\"sans-serif\"];\n";
    for (auto const& [name, id] : vault.File().ReadBranches()) {
        const auto node = Quoted("branch " + Printable(name));
        std::cout << "  " << node << " [label=" << Quoted(Printable(name))
                  << ", shape=ellipse, style=" << (name == current ? "bold" : "solid") << "];\n";
        if (id.empty())
            continue;
        std::cout << "  " << node << " -> \"" << id << "\" [style=dashed];\n";
        DrawHistory(vault.Repository().GetHead(RequireUtf8(name, "a branch name")), drawn);
    }
    std::cout << "}\n";
}

void Sync(Path const& file, Path const& other) {
    if (std::error_code error; std::filesystem::equivalent(file, other, error))
        throw Problem("a vault cannot be synced with itself");
    Vault vault(file, Access::Write);
    std::map<std::string, CommitHandle> heads;
    {
        VaultFile theirs(other, Access::Read);
        for (auto const& [name, head] : theirs.ReadBranches()) {
            // What they have from others is not theirs to hand on.
            if (!name.starts_with(otherPrefix) && !head.empty())
                heads.emplace(name, vault.Import(theirs, head));
        }
    }
    for (auto const& [name, head] : heads) {
        const auto branch = RequireBranchName(std::string(otherPrefix) + name);
        if (!vault.Repository().CreateBranch(branch, head))
            vault.Repository().MoveBranchTo(branch, head);
    }
    const auto written = vault.Write();
    for (auto const& [name, head] : heads)
        std::cout << otherPrefix << Printable(name) << "  " << ToUtf8(head->GetId()) << '\n';
    std::cout << written << " objects brought in\n";
}

} // namespace vault
