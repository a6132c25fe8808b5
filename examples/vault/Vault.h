#pragma once

#include "Text.h"
#include "Trees.h"

#include <KivArchive/ArchivedRepository.h>
#include <KivArchive/Listings.h>
#include <atomic>
#include <chrono>
#include <memory>
#include <optional>

namespace vault {

using KivArchive::Branch;
using KivArchive::CommitRecord;

/// Which vault to work with, and how.
struct VaultPlace {
    /// A file, or the address of a database.
    std::string file = "vault.db";
    /// How long to wait while somebody else writes.
    std::chrono::seconds wait{30};
};

/// What a revision and a path lead to.
struct Target {
    CommitRecord commit;
    /// As trees have it; empty for the whole version.
    std::string path;
    Entry entry;
};

/// An archive in one file, or in a database, with a branch that is the current one.
class Vault {
public:
    enum class Access { Read, Write, Create };

    /// Opens the database, or the file, bringing one of an earlier release up to date first; or makes it. Whoever has to
    /// wait later for somebody else who writes is told.
    /// @throws Problem, KivArchive::ArchiveError
    explicit Vault(VaultPlace const& place, Access access = Access::Read);
    Vault(Vault const&) = delete;
    Vault& operator=(Vault const&) = delete;
    /// Takes a file away that was made here and has got no version.
    ~Vault();

    [[nodiscard]] std::string const& File() const noexcept { return file_; }
    [[nodiscard]] IArchive& Archive() const noexcept { return *archive_; }
    /// The same without the cache that a database has in front of it.
    [[nodiscard]] IArchive& Stored() const noexcept { return *stored_; }
    [[nodiscard]] std::shared_ptr<IArchive> SharedArchive() const noexcept { return archive_; }

    [[nodiscard]] Text CurrentBranch() const;
    /// What makes @p name the current branch of a file.
    [[nodiscard]] static KivArchive::RecordChange MakeCurrent(Text const& name);
    /// Makes @p name the current branch; in a database, which is others' too, for this user on this machine only.
    void Checkout(Text const& name);
    /// The head of a branch; null if there is none.
    [[nodiscard]] Id HeadOf(Text const& branch) const;
    /// @throws Problem if there is no such branch
    [[nodiscard]] Id RequireBranch(std::string const& name) const;

    /// The commit that is the head of a branch of that name, or whose identifier it is, or begins with at least four
    /// digits; or with "~N" behind that, the one N versions before; the head of the current branch if @p revision is empty.
    /// @throws Problem if there is none, more than one, or it is damaged
    [[nodiscard]] CommitRecord Find(std::string const& revision) const;
    /// The same, but nothing if there is none.
    [[nodiscard]] std::optional<CommitRecord> TryFind(std::string const& revision) const;
    /// What REVISION or REVISION:PATH leads to. @throws Problem
    [[nodiscard]] Target FindTarget(std::string const& target) const;

private:
    /// What is that many versions before another one.
    struct Earlier {
        std::string revision;
        std::size_t steps = 1;
    };

    /// Splits "master~3", which is three versions before "master"; "master~" is one before.
    [[nodiscard]] static std::optional<Earlier> ReadEarlier(std::string const& revision);
    /// The same as `TryFind`, for what does not end with "~N".
    [[nodiscard]] std::optional<CommitRecord> TryFindNamed(std::string const& revision) const;
    /// @throws Problem if there are not so many
    [[nodiscard]] CommitRecord FindEarlier(Id const& later, std::size_t steps) const;

    std::string file_;
    /// Whether it has been said whom this one waits for.
    std::atomic_flag hasTold_;
    std::shared_ptr<IArchive> archive_;
    std::shared_ptr<IArchive> stored_;
    bool isMadeHere_ = false;
};

/// @p name as text. @throws Problem if it cannot name a branch: such a branch could not be given as a revision
[[nodiscard]] Text RequireBranchName(std::string const& name);

/// A path that a user gave as trees have it, without empty and "." components.
[[nodiscard]] std::string StoredPath(std::string_view filePath);

/// The current branch's new head, and what else is to change with it. @return false if somebody else has moved it
[[nodiscard]] bool MoveHead(Vault& vault, KivArchive::Change change, Text const& branch, Id const& expected,
                            Id const& head);

/// Stores what has become of branches in memory. @throws Problem if somebody else has changed them meanwhile
void Publish(KivArchive::ArchivedRepository& repository);

} // namespace vault
