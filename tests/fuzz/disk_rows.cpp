#include "disk_rows.h"

#include "disk/disk_db.h"
#include "fuzz.h"
#include "fuzz_sqlite.h"
#include "util/paths.h"

namespace {

sqlite3* connection;

// Kept from input to input.
struct {
    sqlite3_stmt* begin;
    sqlite3_stmt* clear;
    sqlite3_stmt* insert;
    sqlite3_stmt* commit;
    sqlite3_stmt* select;
} statements;

sqlite3_stmt* prepare(const char* sql)
{
    sqlite3_stmt* statement = nullptr;
    require(sqlite3_prepare_v2(connection, sql, -1, &statement, nullptr) == SQLITE_OK, sql);
    return statement;
}

void run(sqlite3_stmt* statement)
{
    require(sqlite3_step(statement) == SQLITE_DONE, sqlite3_sql(statement));
    sqlite3_reset(statement);
}

void bind(sqlite3_stmt* statement, int index, const cell& value)
{
    const auto size = static_cast<int>(value.bytes.size());
    if (value.use == USE_NULL) {
        sqlite3_bind_null(statement, index);
    } else if (value.use == USE_BLOB) {
        sqlite3_bind_blob(statement, index, value.bytes.data(), size, SQLITE_STATIC);
    } else {
        sqlite3_bind_text(statement, index, value.bytes.data(), size, SQLITE_STATIC);
    }
}

cell read_cell(sqlite3_stmt* statement, int column)
{
    const int type = sqlite3_column_type(statement, column);
    const auto* bytes = static_cast<const char*>(sqlite3_column_blob(statement, column));
    const auto size = static_cast<size_t>(sqlite3_column_bytes(statement, column));
    const uint8_t use = type == SQLITE_NULL ? USE_NULL : type == SQLITE_BLOB ? USE_BLOB : USE_TEXT;
    return {use, bytes != nullptr ? std::string(bytes, size) : ""};
}

}  // namespace

sqlite3* rows_open()
{
    fuzz_quicken_sqlite();
    fuzz_keep_databases_in_memory();
    require(sqlite3_open(DISK_DB_FILE, &connection) == SQLITE_OK, "a database can be opened");
    sqlite_handle handle;
    db_handle_init(&handle);
    require(db_open(&handle, DISK_DB_FILE) == 0 && disk_table_create(&handle) == 0 &&
                db_close(&handle) == 0,
            "the table can be made");
    statements = {prepare("begin"), prepare("delete from disk"),
                  prepare("insert into disk values(?,?,?,?,?)"), prepare("commit"),
                  prepare("select * from disk order by rowid")};
    return connection;
}

void rows_put(const std::vector<row>& rows)
{
    run(statements.begin);
    run(statements.clear);
    for (const row& values : rows) {
        for (size_t i = 0; i < ROW_COLUMNS; ++i) {
            bind(statements.insert, static_cast<int>(i + 1), values[i]);
        }
        run(statements.insert);
    }
    run(statements.commit);
}

std::vector<row> rows_get()
{
    std::vector<row> rows;
    while (sqlite3_step(statements.select) == SQLITE_ROW) {
        row values;
        for (size_t i = 0; i < ROW_COLUMNS; ++i) {
            values.push_back(read_cell(statements.select, static_cast<int>(i)));
        }
        rows.push_back(values);
    }
    sqlite3_reset(statements.select);
    return rows;
}

bool row_has_uid(const row& values, const std::string& uid)
{
    return values[0].is_text() && values[0].bytes == uid;
}

bool rows_are_same(const row& a, const row& b)
{
    for (size_t i = 0; i < ROW_COLUMNS; ++i) {
        if (a[i].is_text() != b[i].is_text() || a[i].bytes != b[i].bytes) {
            return false;
        }
    }
    return true;
}
