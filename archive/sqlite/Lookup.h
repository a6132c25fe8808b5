#pragma once

/// @file
/// Rows for many identifiers, one after the other.

#include "sqlite/Database.h"

namespace KivArchive {

/// From how many identifiers on a lookup takes less time than what planning its statement takes.
inline constexpr std::size_t worthLookup = 32;

/// Looks up one identifier after the other with one run of a statement, which takes about half of what a run for each of
/// them does; the next one may depend on what the one before has led to. Within one transaction.
class Lookup {
public:
    /// @param sql a literal: "SELECT ... FROM asked(?) LEFT JOIN table ON table.id=asked.id"
    Lookup(Database& database, const char* sql);
    Lookup(Lookup const&) = delete;
    Lookup& operator=(Lookup const&) = delete;
    ~Lookup() = default;

    /// The row for @p id, valid until the next one is asked for; its columns are null if there is none.
    [[nodiscard]] Query const& At(Id const& id);

    /// Lets statements of a connection name `asked`, which has the identifier asked for in its only row.
    static void Register(sqlite3* database);

private:
    Id::Digest asked_{};
    Query query_;
};

} // namespace KivArchive
