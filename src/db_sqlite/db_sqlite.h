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

int db_handle_init(sqlite_handle* handle);

// Opens the database file, creating it when missing. A failed open leaves the handle closed.
int db_open(sqlite_handle* handle, const char* file_name);

// Finalizes and closes. The handle is cleared also when closing fails; 0 when it was not open.
int db_close(sqlite_handle* handle);

// 1 also when there is no statement.
int db_finalize(sqlite_handle* handle);

// Runs a whole SQL text without looking at rows.
int db_exec(sqlite_handle* handle, const char* sql);

// db_exec of one statement with its parameters bound to values, in order.
int db_exec_bound(sqlite_handle* handle, const char* sql, std::span<const char* const> values);

// Prepares the SQL text as the handle's statement.
int db_prepare(sqlite_handle* handle, const char* sql);

// db_prepare with the statement's parameters bound to values, which must outlive the statement.
int db_prepare_bound(sqlite_handle* handle, const char* sql, std::span<const char* const> values);

// Runs the prepared statement and finalizes it in every case. 1 when the last integer of its last
// row is exactly 1, 0 when it is not or there is no row, -1 on error.
int db_step_is_one(sqlite_handle* handle);

// 0 when the table exists, 1 when it does not, -1 on error.
int db_table_exists(sqlite_handle* handle, const char* table);

// Logs the connection's last error code and message.
void db_log_error(sqlite_handle* handle);
