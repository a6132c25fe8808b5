#include "postgres/Store.h"

#include <algorithm>
#include <array>

namespace KivArchive::Postgres {

namespace {

constexpr std::int64_t newestFormat = 1;

/// In the order of their names; each column with its type.
constexpr std::string_view expectedColumns =
    "attempts token bytea\nattempts time bigint\nbranches name bytea\nbranches head bytea\ncontained id "
    "bytea\ncontained how "
    "smallint\ncontained other bytea\n"
    "format version smallint\nmarks id bytea\nmarks time bigint\nobjects id bytea\nobjects type smallint\n"
    "objects size bigint\nobjects base bytea\nobjects form bytea\nobjects parent bytea\nobjects tree bytea\n"
    "objects token bytea\nrecords name bytea\nrecords value bytea\n";

std::string TextAt(Rows const& rows, int row, int column) {
    ByteView const bytes = rows.Value(row, column);
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

/// The columns of the schema, as above; of those tables only that the role may use.
std::string ReadColumns(Connection& connection, std::string const& schema) {
    RoundTrip trip(connection);
    trip.Add(Statement::ReadColumns, Parameters().With(schema));
    Rows const rows = trip.Run().front();
    std::string columns;
    for (int row = 0; row < rows.Count(); ++row)
        columns += TextAt(rows, row, 0) + " " + TextAt(rows, row, 1) + " " + TextAt(rows, row, 2) + "\n";
    return columns;
}

std::int64_t ReadFormat(Connection& connection) {
    RoundTrip trip(connection);
    trip.Add(Statement::ReadFormat);
    Rows const rows = trip.Run().front();
    return rows.Count() == 0 || rows.IsNull(0, 0) ? 0 : rows.Number(0, 0);
}

/// Makes what is missing, unless somebody else is making the same.
void Make(Connection& connection) {
    static constexpr std::array<std::string_view, 5> duplicates{"23505", "42P06", "42P07", "42710", "XX000"};
    RoundTrip trip(connection);
    trip.Add(Statement::Begin);
    for (Statement const statement : tableStatements)
        trip.Add(statement);
    trip.Add(Statement::Commit);
    try {
        trip.Run();
    } catch (Refused const& refused) {
        if (std::find(duplicates.begin(), duplicates.end(), refused.code) == duplicates.end())
            throw;
    }
}

[[noreturn]] void Refuse(Store const& store, Failure kind, std::string const& why) {
    throw ArchiveError(kind, store.Shown(), why + ": " + store.Shown() + ", schema " + store.Schema() + ".");
}

} // namespace

void EnsureSchema(Connection& connection, Store const& store) {
    std::string const& schema = store.Options().schema;
    std::string columns = ReadColumns(connection, schema);
    if (columns.empty() && store.Options().create) {
        Make(connection);
        columns = ReadColumns(connection, schema);
    }
    if (columns.empty())
        Refuse(store, Failure::Unavailable, "There is no archive, or none that the role may read");
    if (columns != expectedColumns)
        Refuse(store, Failure::Foreign, "These are not the tables of an archive, or the role may not read all of them");
    std::int64_t const format = ReadFormat(connection);
    if (format > newestFormat)
        Refuse(store, Failure::NewerFormat, "This archive was written by a later release");
    if (format < 1)
        Refuse(store, Failure::Foreign, "This archive does not say its format");
}

} // namespace KivArchive::Postgres
