#include "postgres/Statements.h"

#include <algorithm>
#include <string_view>

namespace KivArchive::Postgres {

namespace {

// "@" stands for the schema. Types of rows that are kept as bases only are 8 higher than those of objects, 3 is a piece of a
// content, 10 is what is left of a commit that has been removed: its facts. A check that does not hold divides by zero, which
// ends the transaction on the server: so all of it goes in one round trip, whether it comes to its end or not. What is looked up
// row by row is fenced by OFFSET 0: joined, small tables would be read whole for each step.
struct Template {
    Statement statement;
    std::string_view text;
    std::string_view check = {};
};

// Stores nothing where the branch has not moved: who has lost the race changes no row. "%" stands for what is checked besides.
// Arrays side by side take a tenth less of all this than a table of them, and each takes its part: so $5 is 16 times the size and
// the type, and what only the new head has comes alone.
constexpr std::string_view moveBranchToNew =
    "WITH moved AS (UPDATE @.branches SET head = $3::bytea WHERE name = $1::bytea AND head = $2::bytea %"
    "RETURNING name), made AS NOT MATERIALIZED (SELECT unnest($4::bytea[]) AS id, unnest($5::bigint[]) AS kind, "
    "unnest($6::bytea[]) AS base, unnest($7::bytea[]) AS form FROM moved) "
    "INSERT INTO @.objects(id, type, size, base, form, parent, tree, token) "
    "SELECT id, CAST(kind & 15 AS smallint), kind >> 4, base, form, CASE WHEN id = $3::bytea THEN $8::bytea END, "
    "CASE WHEN id = $3::bytea THEN $9::bytea END, CASE WHEN id = $3::bytea THEN $10::bytea END FROM made";

// Whether rows that others become differences to are as they were. They are held, so that nobody removes them before the end.
constexpr std::string_view baseStands =
    "AND EXISTS (SELECT 1 FROM @.objects WHERE id = $11::bytea AND base = $12::bytea FOR SHARE) ";
constexpr std::string_view basesStand =
    "AND (SELECT count(*) FROM (SELECT o.id FROM unnest($11::bytea[], $12::bytea[]) AS known(id, base) "
    "JOIN @.objects o ON o.id = known.id AND o.base = known.base ORDER BY o.id FOR SHARE OF o) AS held) = $13::bigint ";

constexpr std::array<Template, statementCount> templates{{
    {Statement::Begin, "BEGIN ISOLATION LEVEL READ COMMITTED"},
    {Statement::Commit, "COMMIT"},
    {Statement::Rollback, "ROLLBACK"},
    {Statement::ReadColumns,
     "SELECT CAST(table_name AS text), CAST(column_name AS text), CAST(data_type AS text) "
     "FROM information_schema.columns WHERE table_schema = $1 ORDER BY table_name, ordinal_position"},
    {Statement::ReadFormat, "SELECT CAST(max(version) AS bigint) FROM @.format"},
    {Statement::MakeSchema, "CREATE SCHEMA IF NOT EXISTS @"},
    {Statement::MakeAttempts, "CREATE TABLE IF NOT EXISTS @.attempts(token bytea PRIMARY KEY, time bigint NOT NULL)"},
    {Statement::MakeBranches, "CREATE TABLE IF NOT EXISTS @.branches(name bytea PRIMARY KEY, head bytea NOT NULL)"},
    {Statement::MakeContained, "CREATE TABLE IF NOT EXISTS @.contained(id bytea, how smallint, other bytea, "
                               "PRIMARY KEY(id, how, other))"},
    {Statement::MakeFormat, "CREATE TABLE IF NOT EXISTS @.format(version smallint PRIMARY KEY)"},
    {Statement::MakeMarks, "CREATE TABLE IF NOT EXISTS @.marks(id bytea PRIMARY KEY, time bigint NOT NULL)"},
    {Statement::MakeObjects,
     "CREATE TABLE IF NOT EXISTS @.objects(id bytea PRIMARY KEY, type smallint NOT NULL, "
     "size bigint NOT NULL, base bytea NOT NULL, form bytea NOT NULL, parent bytea, tree bytea, "
     "token bytea)"},
    {Statement::MakeIndexOfBases, "CREATE INDEX IF NOT EXISTS objects_by_base ON @.objects(base) WHERE base <> '\\x'"},
    {Statement::MakeIndexOfFacts,
     "CREATE INDEX IF NOT EXISTS objects_with_facts ON @.objects(id) WHERE parent IS NOT NULL"},
    {Statement::MakeRecords, "CREATE TABLE IF NOT EXISTS @.records(name bytea PRIMARY KEY, value bytea NOT NULL)"},
    {Statement::AddFormat, "INSERT INTO @.format(version) VALUES(1) ON CONFLICT DO NOTHING"},
    {Statement::FindObjects,
     "SELECT id, CAST(type AS bigint), size FROM @.objects WHERE id = ANY($1::bytea[]) AND type < 8"},
    {Statement::FindRows, "SELECT id, CAST(type AS bigint) FROM @.objects WHERE id = ANY($1::bytea[])"},
    // Rows, and all that they are differences to; without their forms if these are too much for one answer.
    {Statement::ReadRows,
     "WITH RECURSIVE wanted(id) AS (SELECT unnest($1::bytea[]) UNION SELECT l.base FROM wanted w "
     "CROSS JOIN LATERAL (SELECT base FROM @.objects WHERE id = w.id AND base <> '\\x' OFFSET 0) l), "
     "found AS (SELECT o.id, o.type, o.size, o.base, o.form, "
     "sum(octet_length(o.form)) OVER () AS total FROM wanted w CROSS JOIN LATERAL "
     "(SELECT id, type, size, base, form FROM @.objects WHERE id = w.id OFFSET 0) o) "
     "SELECT id, CAST(type AS bigint), size, base, CAST(octet_length(form) AS bigint), "
     "CASE WHEN total <= $2::bigint THEN form END FROM found"},
    {Statement::ListObjects,
     "SELECT id, CAST(type AS bigint), size FROM @.objects WHERE id > $1::bytea AND type <> 3 AND type < 8 "
     "ORDER BY id LIMIT $2::bigint"},
    {Statement::ReadBranches, "SELECT name, head FROM @.branches"},
    {Statement::ReadHeads, "SELECT name, head FROM @.branches WHERE name = ANY($1::bytea[])"},
    {Statement::ReadRecords, "SELECT name, value FROM @.records WHERE name = ANY($1::bytea[])"},
    {Statement::ListRecords, "SELECT name FROM @.records"},
    {Statement::ListMarked,
     "SELECT m.id FROM @.marks m JOIN @.objects o ON o.id = m.id "
     "WHERE m.time <= CAST(extract(epoch FROM now()) AS bigint) - $1::bigint AND m.id > $2::bytea "
     "AND o.type <> 3 AND o.type < 8 ORDER BY m.id LIMIT $3::bigint"},
    {Statement::WalkParents,
     "WITH RECURSIVE walk(id) AS (SELECT unnest($1::bytea[]) UNION SELECT l.link FROM walk w CROSS JOIN "
     "LATERAL "
     "(SELECT parent AS link FROM @.objects WHERE id = w.id AND parent <> '\\x' OFFSET 0) l), "
     "near AS (SELECT id FROM walk LIMIT $2::bigint) "
     "SELECT n.id, a.parent, a.tree, CAST(c.how AS bigint), c.other FROM near n "
     "LEFT JOIN LATERAL (SELECT parent, tree FROM @.objects WHERE id = n.id AND parent IS NOT NULL OFFSET 0) a ON true "
     "LEFT JOIN LATERAL (SELECT how, other FROM @.contained WHERE id = n.id OFFSET 0) c ON true"},
    {Statement::WalkReachable,
     "WITH RECURSIVE walk(id) AS (SELECT unnest($1::bytea[]) UNION SELECT l.link FROM walk w CROSS JOIN "
     "LATERAL "
     "(SELECT parent AS link FROM @.objects WHERE id = w.id AND parent <> '\\x' UNION ALL "
     "SELECT other FROM @.contained WHERE id = w.id AND how = 0 OFFSET 0) l), "
     "near AS (SELECT id FROM walk LIMIT $2::bigint) "
     "SELECT n.id, a.parent, a.tree, CAST(c.how AS bigint), c.other FROM near n "
     "LEFT JOIN LATERAL (SELECT parent, tree FROM @.objects WHERE id = n.id AND parent IS NOT NULL OFFSET 0) a ON true "
     "LEFT JOIN LATERAL (SELECT how, other FROM @.contained WHERE id = n.id OFFSET 0) c ON true"},
    {Statement::WalkEverything,
     "WITH RECURSIVE walk(id) AS (SELECT unnest($1::bytea[]) UNION SELECT l.link FROM walk w CROSS JOIN "
     "LATERAL "
     "(SELECT parent AS link FROM @.objects WHERE id = w.id AND parent <> '\\x' UNION ALL "
     "SELECT other FROM @.contained WHERE id = w.id OFFSET 0) l), "
     "near AS (SELECT id FROM walk LIMIT $2::bigint) "
     "SELECT n.id, a.parent, a.tree, CAST(c.how AS bigint), c.other FROM near n "
     "LEFT JOIN LATERAL (SELECT parent, tree FROM @.objects WHERE id = n.id AND parent IS NOT NULL OFFSET 0) a ON true "
     "LEFT JOIN LATERAL (SELECT how, other FROM @.contained WHERE id = n.id OFFSET 0) c ON true"},
    {Statement::ListAncestry,
     "SELECT a.id, a.parent, a.tree, CAST(c.how AS bigint), c.other "
     "FROM (SELECT id, parent, tree FROM @.objects WHERE id > $1::bytea AND parent IS NOT NULL ORDER BY id "
     "LIMIT $2::bigint) a "
     "LEFT JOIN @.contained c ON c.id = a.id ORDER BY a.id"},
    {Statement::CountObjects,
     "SELECT CAST(type AS bigint), count(*), CAST(sum(octet_length(form)) AS bigint) FROM @.objects "
     "GROUP BY type"},
    {Statement::CountRows,
     "SELECT (SELECT count(*) FROM @.objects WHERE parent IS NOT NULL), (SELECT count(*) FROM @.branches), "
     "(SELECT count(*) FROM @.records), (SELECT count(*) FROM @.marks m JOIN @.objects o ON o.id = m.id "
     "WHERE o.type <> 3 AND o.type < 8)"},
    {Statement::RememberAttempt,
     "INSERT INTO @.attempts(token, time) VALUES($1::bytea, CAST(extract(epoch FROM now()) AS bigint))"},
    {Statement::ForgetAttempts,
     "DELETE FROM @.attempts WHERE time < CAST(extract(epoch FROM now()) AS bigint) - $1::bigint"},
    {Statement::AddObjects,
     "INSERT INTO @.objects(id, type, size, base, form, parent, tree) SELECT * FROM "
     "unnest($1::bytea[], $2::smallint[], $3::bigint[], $4::bytea[], $5::bytea[], $6::bytea[], $7::bytea[]) "
     "ON CONFLICT DO NOTHING"},
    {Statement::AddNewObjects,
     "INSERT INTO @.objects(id, type, size, base, form, parent, tree) SELECT * FROM "
     "unnest($1::bytea[], $2::smallint[], $3::bigint[], $4::bytea[], $5::bytea[], $6::bytea[], $7::bytea[])"},
    {Statement::AddToFacts,
     "UPDATE @.objects SET type = made.type, size = made.size, base = made.base, form = made.form "
     "FROM unnest($1::bytea[], $2::smallint[], $3::bigint[], $4::bytea[], $5::bytea[]) "
     "AS made(id, type, size, base, form) WHERE objects.id = made.id AND objects.type = 10"},
    {Statement::BringBack, "UPDATE @.objects SET type = type - 8 WHERE id = ANY($1::bytea[]) AND type >= 8"},
    {Statement::CheckUsed,
     "SELECT 1 / CASE count(*) WHEN $2::bigint THEN 1 ELSE 0 END FROM (SELECT id FROM @.objects "
     "WHERE id = ANY($1::bytea[]) AND (type < 8 OR id = ANY($3::bytea[])) ORDER BY id FOR SHARE) AS used"},
    {Statement::AddFacts,
     "INSERT INTO @.objects(id, type, size, base, form, parent, tree) SELECT id, 10, 0, '\\x', '\\x', parent, tree "
     "FROM unnest($1::bytea[], $2::bytea[], $3::bytea[]) AS facts(id, parent, tree) ON CONFLICT DO NOTHING"},
    {Statement::SetFacts, "UPDATE @.objects SET parent = facts.parent, tree = facts.tree "
                          "FROM unnest($1::bytea[], $2::bytea[], $3::bytea[]) AS facts(id, parent, tree) "
                          "WHERE objects.id = facts.id AND objects.parent IS NULL"},
    {Statement::AddContained,
     "INSERT INTO @.contained(id, how, other) SELECT * FROM unnest($1::bytea[], $2::smallint[], $3::bytea[]) "
     "ON CONFLICT DO NOTHING"},
    {Statement::DeleteMarks, "DELETE FROM @.marks WHERE id = ANY($1::bytea[])"},
    {Statement::CheckNoHead,
     "SELECT 1 / CASE count(*) WHEN 0 THEN 1 ELSE 0 END FROM @.branches WHERE name = $1::bytea"},
    {Statement::MoveBranch,
     "WITH moved AS (UPDATE @.branches SET head = $3::bytea WHERE name = $1::bytea AND head = $2::bytea "
     "RETURNING name) SELECT 1 / count(*) FROM moved"},
    {Statement::MoveBranchToNew, moveBranchToNew},
    {Statement::MoveBranchToNewIfBaseStands, moveBranchToNew, baseStands},
    {Statement::MoveBranchToNewIfBasesStand, moveBranchToNew, basesStand},
    {Statement::FindAttempt, "SELECT id FROM @.objects WHERE id = $1::bytea AND token = $2::bytea"},
    {Statement::MakeBranch, "INSERT INTO @.branches(name, head) VALUES($1::bytea, $2::bytea)"},
    {Statement::RemoveBranch,
     "WITH removed AS (DELETE FROM @.branches WHERE name = $1::bytea AND head = $2::bytea RETURNING name) "
     "SELECT 1 / count(*) FROM removed"},
    {Statement::CheckRecord,
     "SELECT 1 / count(*) FROM (SELECT name FROM @.records WHERE name = $1::bytea AND value = $2::bytea "
     "FOR UPDATE) AS expected"},
    {Statement::CheckNoRecord,
     "SELECT 1 / CASE count(*) WHEN 0 THEN 1 ELSE 0 END FROM @.records WHERE name = $1::bytea"},
    {Statement::ChangeRecord, "UPDATE @.records SET value = $2::bytea WHERE name = $1::bytea"},
    {Statement::MakeRecord, "INSERT INTO @.records(name, value) VALUES($1::bytea, $2::bytea)"},
    {Statement::AddRecord, "INSERT INTO @.records(name, value) VALUES($1::bytea, $2::bytea) ON CONFLICT DO NOTHING"},
    {Statement::RemoveRecord, "DELETE FROM @.records WHERE name = $1::bytea"},
    {Statement::LockRows,
     "SELECT id, CAST(type AS bigint) FROM @.objects WHERE id = ANY($1::bytea[]) ORDER BY id FOR UPDATE"},
    {Statement::AddMarks,
     "INSERT INTO @.marks(id, time) SELECT id, CAST(extract(epoch FROM now()) AS bigint) FROM @.objects "
     "WHERE id = ANY($1::bytea[]) AND type < 8 ON CONFLICT DO NOTHING"},
    {Statement::FindMarked, "SELECT id FROM @.marks WHERE id = ANY($1::bytea[]) "
                            "AND time <= CAST(extract(epoch FROM now()) AS bigint) - $2::bigint"},
    {Statement::MarkForNow, "INSERT INTO @.marks(id, time) SELECT id, 0 FROM @.objects WHERE id = ANY($1::bytea[]) "
                            "ON CONFLICT(id) DO UPDATE SET time = 0"},
    {Statement::FindBases, "SELECT DISTINCT base FROM @.objects WHERE base = ANY($1::bytea[]) AND base <> '\\x'"},
    {Statement::KeepAsBases, "UPDATE @.objects SET type = type + 8 WHERE id = ANY($1::bytea[]) AND type < 8"},
    {Statement::KeepFacts, "UPDATE @.objects SET type = 10, size = 0, base = '\\x', form = '\\x' "
                           "WHERE id = ANY($1::bytea[]) AND parent IS NOT NULL"},
    {Statement::RemoveRows, "DELETE FROM @.objects WHERE id = ANY($1::bytea[]) AND parent IS NULL"},
    {Statement::FindUnusedBases,
     "SELECT m.id, CAST(octet_length(o.form) AS bigint) FROM @.marks m JOIN @.objects o ON o.id = m.id "
     "WHERE o.type >= 8 AND NOT EXISTS (SELECT 1 FROM @.objects d WHERE d.base = m.id AND d.base <> '\\x') "
     "LIMIT $1::bigint"},
    {Statement::ListPieces, "SELECT id FROM @.objects WHERE type = 3 AND id > $1::bytea ORDER BY id LIMIT $2::bigint"},
    {Statement::ReadPieceLists,
     "SELECT id, form FROM @.objects WHERE type = 4 AND id > $1::bytea ORDER BY id LIMIT $2::bigint"},
}};

static_assert(std::all_of(templates.begin(), templates.end(), [next = std::size_t{0}](Template const& one) mutable {
    return static_cast<std::size_t>(one.statement) == next++;
}));

} // namespace

std::string TextOf(Statement statement, std::string const& schema) {
    Template const& made = templates.at(static_cast<std::size_t>(statement));
    std::string text(made.text);
    if (std::size_t const check = text.find('%'); check != std::string::npos)
        text.replace(check, 1, made.check);
    for (std::size_t at = text.find('@'); at != std::string::npos; at = text.find('@', at + schema.size()))
        text.replace(at, 1, schema);
    return text;
}

} // namespace KivArchive::Postgres
