// A thin layer over SQLite: one connection with at most one prepared statement. Results are 0 for
// success and 1 for failure unless a line says otherwise; every failure is logged, nothing retries.
#pragma once

#include <sqlite3.h>

#include <span>

// Owned by its caller. Finalize before preparing the next statement.
struct sqlite_handle {
    sqlite3* db;         // null when closed
    sqlite3_stmt* stmt;  // null when no statement is prepared
};

// What db_table_exists answers.
enum table_answer { TABLE_UNKNOWN = -1, TABLE_EXISTS = 0, TABLE_MISSING = 1 };

// What db_step_is_one answers.
enum one_answer { ONE_UNKNOWN = -1, ONE_NOT = 0, ONE_IS = 1 };

int db_handle_init(sqlite_handle* handle);

// Opens the database file, creating it when missing. A failed open leaves the handle closed.
int db_open(sqlite_handle* handle, const char* file_name);

// Finalizes and closes. The handle is cleared also when closing fails; 0 when it was not open.
int db_close(sqlite_handle* handle);

// 1 also when there is no statement.
int db_finalize(sqlite_handle* handle);

// Runs a whole SQL text without looking at rows.
int db_exec(sqlite_handle* handle, const char* sql);

// Runs one statement with its parameters bound to values, in order. The handle's own statement is
// not touched.
[[nodiscard]] int db_exec_bound(sqlite_handle* handle, const char* sql,
                                std::span<const char* const> values);

// Prepares the SQL text as the handle's statement.
int db_prepare(sqlite_handle* handle, const char* sql);

// db_prepare with the statement's parameters bound to values, which must outlive the statement.
// A failure logs the text "shown" in place of the one with parameters.
[[nodiscard]] int db_prepare_bound(sqlite_handle* handle, const char* sql, const char* shown,
                                   std::span<const char* const> values);

// Finalizes the handle's statement, if there is one, at the end of its scope.
struct statement_guard {
    sqlite_handle* handle;

    explicit statement_guard(sqlite_handle* owner) : handle(owner) {}
    ~statement_guard() { db_finalize(handle); }
    statement_guard(const statement_guard&) = delete;
    statement_guard& operator=(const statement_guard&) = delete;
};

// Runs the prepared statement and finalizes it in every case. ONE_IS when the last integer of its
// last row is exactly 1, ONE_NOT also when there is no row.
[[nodiscard]] one_answer db_step_is_one(sqlite_handle* handle);

// A table_answer. The name stands in the statement as it is.
int db_table_exists(sqlite_handle* handle, const char* table);

// Logs the connection's last error code and message, of a handle that is not open the library's
// words for that; nothing of a null one.
void db_log_error(sqlite_handle* handle);
