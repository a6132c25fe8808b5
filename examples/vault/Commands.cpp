#include "Commands.h"

#include "Author.h"
#include "Problem.h"
#include "Revision.h"
#include "Vault.h"
#include "Verify.h"
#include "Workspace.h"

#include <iostream>

namespace vault {

using Access = VaultFile::Access;
using KivVcs::cow_ptr;
using KivVcs::Tree;

namespace {

void ListEntries(cow_ptr<Tree> const& tree) {
    if (!tree)
        return;
    for (auto const& name : tree->GetLocalSubtreePaths())
        std::cout << "tree " << ToUtf8(tree->GetLocalTree(name)->GetId()) << ' ' << Printable(name) << '\n';
    for (auto const& name : tree->GetLocalBlobPaths())
        std::cout << "blob " << ToUtf8(tree->GetLocalBlob(name)->GetId()) << ' ' << Printable(name) << '\n';
}

void ShowCommit(CommitHandle const& commit) {
    std::cout << "commit  " << ToUtf8(commit->GetId()) << '\n';
    if (const auto parent = commit->GetParent())
        std::cout << "parent  " << ToUtf8(parent->GetId()) << '\n';
    std::cout << "author  " << DescribeAuthor(*commit) << '\n'
              << "time    " << DescribeTime(*commit) << '\n'
              << "message " << Printable(commit->GetDescription()) << '\n';
    if (const auto root = RootOf(commit))
        std::cout << "root    " << ToUtf8(root->GetId()) << '\n';
    ListEntries(RootOf(commit));
}

void ShowPath(CommitHandle const& commit, std::string const& path) {
    const auto text = RequireUtf8(path, "the path");
    if (const auto blob = commit->GetBlob(text)) {
        for (auto const& chunk : blob->GetData().LockForRead())
            std::cout.write(reinterpret_cast<char const*>(chunk.data()), static_cast<std::streamsize>(chunk.size()));
        return;
    }
    const auto holder = commit->GetTree(text);
    if (!holder)
        throw Problem("no such file or directory in this revision: " + Printable(path));
    ListEntries(holder->GetRoot());
}

} // namespace

void Save(Path const& file, SaveOptions const& options) {
    const auto author = ParseAuthor(options.author.empty() ? DefaultAuthor() : options.author);
    const auto message = RequireLine(options.message, "a message");
    if (!std::filesystem::is_directory(options.directory))
        throw Problem("not a directory: " + Printable(options.directory.native()));
    Vault vault(file, Access::Create);
    auto& repository = vault.Repository();

    ScanOptions scan{file, nullptr, std::nullopt};
    if (const auto head = repository.GetHead())
        scan.previous = RootOf(head);
    if (options.stamp)
        scan.stamp = KivVcs::Time::Now();
    cow_ptr<Tree> root;
    {
        Progress progress("saving");
        root = ScanDirectory(options.directory, scan, repository, progress);
    }

    KivVcs::Commit commit(&repository, false);
    commit.ReplaceRoot(&repository, root);
    commit.SetAuthorName(author.name);
    commit.SetAuthorEmail(author.email);
    commit.SetDescription(message);
    const auto saved = repository.DoCommit(commit);
    const auto written = vault.Write();
    std::cout << ToUtf8(saved->GetId()) << ' ' << root->GetDeepBlobCount() << " files, " << written << " new objects\n";
}

void Log(Path const& file, std::string const& revision) {
    Vault vault(file, Access::Read);
    auto& repository = vault.Repository();
    auto commit = revision.empty() ? repository.GetHead() : FindRevision(repository, revision);
    for (; commit; commit = commit->GetParent())
        std::cout << ToUtf8(commit->GetId()) << "  " << DescribeTime(*commit) << "  " << DescribeAuthor(*commit) << "  "
                  << Printable(commit->GetDescription()) << '\n';
}

void Show(Path const& file, std::string const& target) {
    Vault vault(file, Access::Read);
    const auto colon = target.find(':');
    const auto commit = FindRevision(vault.Repository(), target.substr(0, colon));
    if (colon == std::string::npos)
        ShowCommit(commit);
    else if (colon + 1 == target.size())
        ListEntries(RootOf(commit));
    else
        ShowPath(commit, target.substr(colon + 1));
}

void Diff(Path const& file, std::string const& before, std::string const& after) {
    Vault vault(file, Access::Read);
    const auto left = FindRevision(vault.Repository(), before);
    const auto right = FindRevision(vault.Repository(), after);
    const KivVcs::CommitTree leftTree(RootOf(left));
    for (auto const& path : leftTree.GetBlobDiffs(KivVcs::immu::make<KivVcs::CommitTree>(RootOf(right)))) {
        const bool wasThere = static_cast<bool>(left->GetBlob(path));
        const bool isThere = static_cast<bool>(right->GetBlob(path));
        std::cout << (!wasThere ? "added   " : isThere ? "changed " : "removed ") << Printable(path) << '\n';
    }
}

void ListBranches(Path const& file) {
    Vault vault(file, Access::Read);
    const auto current = ToUtf8(vault.Repository().GetCurentBranch());
    for (auto const& [name, head] : vault.File().ReadBranches())
        std::cout << (name == current ? "* " : "  ") << Printable(name) << "  " << head << '\n';
}

void MakeBranch(Path const& file, std::string const& name) {
    const auto branch = RequireBranchName(name);
    Vault vault(file, Access::Write);
    if (!vault.Repository().CreateBranch(branch, nullptr))
        throw Problem("there is a branch " + Printable(name) + " already");
    vault.Write();
}

void Checkout(Path const& file, std::string const& name) {
    const auto branch = RequireUtf8(name, "a branch name");
    Vault vault(file, Access::Write);
    if (!vault.Repository().Checkout(branch))
        throw Problem("no such branch: " + Printable(name));
    vault.Write();
}

void Restore(Path const& file, std::string const& revision, Path const& directory, bool force) {
    Vault vault(file, Access::Read);
    const auto commit = FindRevision(vault.Repository(), revision);
    Progress progress("restoring");
    RestoreDirectory(RootOf(commit), directory, force, progress);
}

void Verify(Path const& file) {
    std::size_t objects = 0;
    {
        VaultFile vaultFile(file, Access::Read);
        Progress progress("verifying");
        const auto findings = FindDamage(vaultFile, progress);
        for (auto const& finding : findings)
            progress.Say(finding);
        if (!findings.empty())
            throw Problem(Printable(file.native()) + " is damaged", findingsExitStatus);
        objects = vaultFile.ListObjects().size();
    }
    // Every history must also read back and link to the same identifiers.
    const Vault vault(file, Access::Read);
    std::cout << "verified " << objects << " objects\n";
}

} // namespace vault
