#pragma once

/// @file
/// Looking up many identifiers, one after the other.

#include "sqlite/Database.h"

namespace KivArchive {

/// The number of identifiers from which on a lookup is worth the planning of its statement.
inline constexpr std::size_t worthLookup = 32;

/// Looks up one identifier after the other with one run of a statement, within one transaction, which takes half of the
/// time of a run for each. The next identifier may depend on the row that was found.
class Lookup {
public:
    /// @param sql a literal: "SELECT ... FROM asked(?) LEFT JOIN table ON table.id=asked.id"
    Lookup(Database& database, const char* sql);
    Lookup(Lookup const&) = delete;
    Lookup& operator=(Lookup const&) = delete;
    ~Lookup() = default;

    /// The row for @p id, valid until the next one is asked for; its columns are null if there is none.
    [[nodiscard]] Query const& At(Id const& id);

    /// Gives a connection the table `asked`, whose only row holds the identifier asked for.
    static void Register(sqlite3* database);

private:
    Id::Digest asked_{};
    Query query_;
};

} // namespace KivArchive
