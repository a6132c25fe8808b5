#include "sqlite/Lookup.h"

#include "Changes.h"

#include <memory>
#include <new>

namespace KivArchive {

namespace {

/// The type of the pointer by which a statement finds the identifier asked for.
constexpr const char* pointerType = "KivArchive identifier";

enum Column : int { IdColumn, SourceColumn };

struct Cursor : sqlite3_vtab_cursor {
    Id::Digest const* wanted = nullptr;
};

Cursor& CursorOf(sqlite3_vtab_cursor* cursor) {
    return *static_cast<Cursor*>(cursor);
}

/// Hands a new object over to SQLite, which passes it to the function that deletes it.
template <class T, class Base>
int Give(Base** object) {
    try {
        *object = std::make_unique<T>().release();
        return SQLITE_OK;
    } catch (std::bad_alloc const&) {
        return SQLITE_NOMEM;
    }
}

int Connect(sqlite3* database, void* /*unused*/, int /*count*/, const char* const* /*arguments*/, sqlite3_vtab** table,
            char** /*error*/) {
    if (int const code = sqlite3_declare_vtab(database, "CREATE TABLE asked(id BLOB, source HIDDEN)");
        code != SQLITE_OK)
        return code;
    return Give<sqlite3_vtab>(table);
}

int Disconnect(sqlite3_vtab* table) {
    std::unique_ptr<sqlite3_vtab> const taken(table);
    return SQLITE_OK;
}

/// A query must name the source, which is a parameter of the table.
int FindBestIndex(sqlite3_vtab* /*table*/, sqlite3_index_info* info) {
    for (int i = 0; i < info->nConstraint; ++i)
        if (auto const& constraint = info->aConstraint[i]; constraint.iColumn == SourceColumn &&
                                                           constraint.op == SQLITE_INDEX_CONSTRAINT_EQ &&
                                                           constraint.usable != 0) {
            info->aConstraintUsage[i].argvIndex = 1;
            info->aConstraintUsage[i].omit = 1;
            info->estimatedCost = 1;
            info->estimatedRows = 1;
            return SQLITE_OK;
        }
    return SQLITE_CONSTRAINT;
}

int Open(sqlite3_vtab* /*table*/, sqlite3_vtab_cursor** cursor) {
    return Give<Cursor>(cursor);
}

int Close(sqlite3_vtab_cursor* cursor) {
    std::unique_ptr<Cursor> const taken(&CursorOf(cursor));
    return SQLITE_OK;
}

int Filter(sqlite3_vtab_cursor* cursor, int /*index*/, const char* /*name*/, int /*count*/, sqlite3_value** values) {
    CursorOf(cursor).wanted = static_cast<Id::Digest const*>(sqlite3_value_pointer(values[0], pointerType));
    return SQLITE_OK;
}

/// There is always another row: `Lookup` sets the next identifier before it steps the statement.
int Next(sqlite3_vtab_cursor* /*cursor*/) {
    return SQLITE_OK;
}

int IsAtEnd(sqlite3_vtab_cursor* cursor) {
    return static_cast<int>(CursorOf(cursor).wanted == nullptr);
}

int GiveColumn(sqlite3_vtab_cursor* cursor, sqlite3_context* context, int column) {
    if (column == IdColumn)
        sqlite3_result_blob(context, CursorOf(cursor).wanted->data(), sizeof(Id::Digest), SQLITE_STATIC);
    return SQLITE_OK;
}

int GiveRow(sqlite3_vtab_cursor* /*cursor*/, sqlite3_int64* row) {
    *row = 0;
    return SQLITE_OK;
}

constexpr sqlite3_module asked = [] {
    sqlite3_module methods{};
    methods.xConnect = Connect;
    methods.xBestIndex = FindBestIndex;
    methods.xDisconnect = Disconnect;
    methods.xOpen = Open;
    methods.xClose = Close;
    methods.xFilter = Filter;
    methods.xNext = Next;
    methods.xEof = IsAtEnd;
    methods.xColumn = GiveColumn;
    methods.xRowid = GiveRow;
    return methods;
}();

} // namespace

Lookup::Lookup(Database& database, const char* sql) : query_(database, sql) {
    query_.WithPointer(&asked_, pointerType);
}

Query const& Lookup::At(Id const& id) {
    asked_ = DigestOf(id);
    static_cast<void>(query_.Next());
    return query_;
}

void Lookup::Register(sqlite3* database) {
    // If this fails, preparing a statement that needs it does.
    static_cast<void>(sqlite3_create_module(database, "asked", &asked, nullptr));
}

} // namespace KivArchive
