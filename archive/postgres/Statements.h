#pragma once

/// @file
/// All that is said to the server, in SQL that engines with this protocol have in common.

#include <array>
#include <cstdint>
#include <string>

namespace KivArchive::Postgres {

enum class Statement : std::uint8_t {
    Begin,
    Commit,
    Rollback,

    ReadColumns,
    ReadFormat,
    MakeSchema,
    MakeAttempts,
    MakeBranches,
    MakeContained,
    MakeFormat,
    MakeMarks,
    MakeObjects,
    MakeIndexOfBases,
    MakeIndexOfFacts,
    MakeRecords,
    AddFormat,

    FindObjects,
    FindRows,
    ReadRows,
    ListObjects,
    ReadBranches,
    ReadHeads,
    ReadRecords,
    ListRecords,
    ListMarked,
    WalkParents,
    WalkReachable,
    WalkEverything,
    ListAncestry,
    CountObjects,
    CountRows,

    RememberAttempt,
    ForgetAttempts,
    AddObjects,
    AddNewObjects,
    AddToFacts,
    BringBack,
    CheckUsed,
    AddFacts,
    SetFacts,
    AddContained,
    DeleteMarks,
    CheckNoHead,
    MoveBranch,
    MoveBranchToNew,
    MoveBranchToNewIfBaseStands,
    MoveBranchToNewIfBasesStand,
    FindAttempt,
    MakeBranch,
    RemoveBranch,
    CheckRecord,
    CheckNoRecord,
    ChangeRecord,
    MakeRecord,
    AddRecord,
    RemoveRecord,

    LockRows,
    AddMarks,
    FindMarked,
    MarkForNow,
    FindBases,
    KeepAsBases,
    KeepFacts,
    RemoveRows,
    FindUnusedBases,
    ListPieces,
    ReadPieceLists,
};

inline constexpr std::size_t statementCount = static_cast<std::size_t>(Statement::ReadPieceLists) + 1;

/// Those that make the tables, in order.
inline constexpr std::array tableStatements{
    Statement::MakeSchema,       Statement::MakeAttempts, Statement::MakeBranches, Statement::MakeContained,
    Statement::MakeFormat,       Statement::MakeMarks,    Statement::MakeObjects,  Statement::MakeIndexOfBases,
    Statement::MakeIndexOfFacts, Statement::MakeRecords,  Statement::AddFormat};

/// The text of a statement. @param schema quoted
[[nodiscard]] std::string TextOf(Statement statement, std::string const& schema);

} // namespace KivArchive::Postgres
