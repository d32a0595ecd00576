// A thin layer over SQLite: one connection with at most one prepared statement. Results are 0 for
// success and 1 for failure unless a line says otherwise; every failure is logged, nothing retries.
#pragma once

#include <sqlite3.h>

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

// Prepares the SQL text as the handle's statement.
int db_prepare(sqlite_handle* handle, const char* sql);

// Binds text to the statement's parameter number index (from 1). text must outlive the statement.
int db_bind_text(sqlite_handle* handle, int index, const char* text);

// Runs the prepared statement and finalizes it in every case. 1 when the last integer of its last
// row is exactly 1, 0 when it is not or there is no row, -1 on error.
int db_step_is_one(sqlite_handle* handle);

// Runs a prepared statement that gives no rows, and finalizes it in every case.
int db_step_done(sqlite_handle* handle);

// 0 when the table exists, 1 when it does not, -1 on error.
int db_table_exists(sqlite_handle* handle, const char* table);

// Logs the connection's last error code and message.
void db_log_error(sqlite_handle* handle);
