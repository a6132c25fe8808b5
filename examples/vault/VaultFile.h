#pragma once

#include <KivVcs/KivVcs.h>

#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

struct sqlite3;
struct sqlite3_stmt;

namespace vault {

/// The file that keeps packed forms by identifier, the branches and the name of the current branch: an SQLite database.
///
/// An open file is one transaction. Nothing of what was written is in the file before `Commit`, and everything is after
/// it, whenever the process dies. Readers see one state; one process at a time can have the file open for writing.
/// @throws Problem from every operation
class VaultFile {
public:
    enum class Access { Read, Write, Create };

    /// The head of each branch by name; an empty head is a branch without commits.
    using Branches = std::map<std::string, std::string>;

    /// The longest packed form that fits into the file.
    static constexpr std::uint64_t largestObject = 999'000'000;

    /// Opens an existing file, or with `Create` one that is made by the first `Commit`.
    VaultFile(std::filesystem::path path, Access access);
    VaultFile(VaultFile const&) = delete;
    VaultFile& operator=(VaultFile const&) = delete;
    ~VaultFile();

    [[nodiscard]] std::filesystem::path const& Path() const noexcept { return path_; }
    /// Whether nothing was ever committed to it.
    [[nodiscard]] bool IsNew() const noexcept { return isNew_; }

    /// The packed form of that identifier, or nothing. It is not checked.
    [[nodiscard]] std::optional<KivVcs::Buffer> ReadObject(std::string_view id);
    [[nodiscard]] std::vector<std::string> ListObjects();
    void ForEachObject(std::function<void(std::string_view id, std::string_view packed)> const& visit);
    void WriteObject(std::string_view id, KivVcs::Buffer const& packed);
    void DeleteObject(std::string_view id);

    [[nodiscard]] Branches ReadBranches();
    [[nodiscard]] std::string ReadCurrentBranch();
    /// Replaces what was there.
    void WriteBranches(Branches const& branches, std::string_view current);

    /// What the database finds wrong with its own structure; empty if nothing.
    [[nodiscard]] std::string FindStructuralDamage();

    /// Ends the transaction; afterwards only `Shrink` can be called.
    void Commit();
    /// Gives the room of deleted objects back to the file system.
    void Shrink();

private:
    struct CloseDatabase {
        void operator()(sqlite3* database) const noexcept;
    };
    struct CloseStatement {
        void operator()(sqlite3_stmt* statement) const noexcept;
    };
    using Statement = std::unique_ptr<sqlite3_stmt, CloseStatement>;

    void Open(Access access);
    void CheckFormat();
    void Execute(char const* sql);
    [[nodiscard]] Statement Prepare(char const* sql);
    [[nodiscard]] bool Step(Statement const& statement);
    void Run(Statement const& statement);
    [[nodiscard]] std::int64_t ReadNumber(char const* sql);
    void Check(int result);

    std::filesystem::path path_;
    bool isNew_ = false;
    bool isMadeHere_ = false;
    std::unique_ptr<sqlite3, CloseDatabase> database_;
    Statement readObject_;
    Statement writeObject_;
    Statement deleteObject_;
};

} // namespace vault
