#include "db_sqlite/db_sqlite.h"

#include <cstring>

#include "log/log.h"
#include "util/guard.h"
#include "util/text.h"

namespace {

constexpr size_t TABLE_QUERY_SIZE = 256;

int log_code_and_error(sqlite_handle* handle, int code)
{
    log_err("err code = %d\n", code);
    db_log_error(handle);
    return 1;
}

// All values or none: an index beyond the statement's parameters is an error of the library's.
int bind_all(sqlite3_stmt* stmt, std::span<const char* const> values)
{
    int index = 0;
    for (const char* value : values) {
        const int code = sqlite3_bind_text(stmt, ++index, value, -1, SQLITE_STATIC);
        if (code != SQLITE_OK) {
            return code;
        }
    }
    return SQLITE_OK;
}

bool run_bound(sqlite3* db, const char* sql, std::span<const char* const> values)
{
    sqlite3_stmt* prepared = nullptr;
    const int code = sqlite3_prepare(db, sql, -1, &prepared, nullptr);
    const guard<sqlite3_stmt*, nullptr, sqlite3_finalize> statement(prepared);
    return code == SQLITE_OK && bind_all(statement, values) == SQLITE_OK &&
           sqlite3_step(statement) == SQLITE_DONE;
}

int prepare(sqlite_handle* handle, const char* sql, const char* shown)
{
    const auto length = static_cast<int>(strlen(sql));
    const int code = sqlite3_prepare(handle->db, sql, length, &handle->stmt, nullptr);
    if (code == SQLITE_OK) {
        return 0;
    }
    log_err("err code = %d\n", code);
    log_err("sq = %s\n", shown);
    db_log_error(handle);
    return 1;
}

void clear(sqlite_handle* handle)
{
    handle->db = nullptr;
    handle->stmt = nullptr;
}

}  // namespace

int db_handle_init(sqlite_handle* handle)
{
    if (handle == nullptr) {
        return 1;
    }
    clear(handle);
    return 0;
}

int db_open(sqlite_handle* handle, const char* file_name)
{
    if (handle == nullptr) {
        return 1;
    }
    if (sqlite3_open(file_name, &handle->db) != SQLITE_OK) {
        log_err("open err, db = %s\n", file_name);
        db_log_error(handle);
        db_close(handle);
        return 1;
    }
    return 0;
}

int db_close(sqlite_handle* handle)
{
    if (handle == nullptr) {
        return 1;
    }
    db_finalize(handle);
    int ret = 0;
    if (handle->db != nullptr) {
        const int code = sqlite3_close(handle->db);
        if (code != SQLITE_OK) {
            ret = log_code_and_error(handle, code);
        }
    }
    clear(handle);
    return ret;
}

int db_finalize(sqlite_handle* handle)
{
    if (handle == nullptr || handle->stmt == nullptr) {
        return 1;
    }
    const int code = sqlite3_finalize(handle->stmt);
    handle->stmt = nullptr;
    return code == SQLITE_OK ? 0 : log_code_and_error(handle, code);
}

int db_exec(sqlite_handle* handle, const char* sql)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr) {
        log_err("err!\n");
        return 1;
    }
    guard<char*, nullptr, sqlite3_free> message(nullptr);
    const int code = sqlite3_exec(handle->db, sql, nullptr, nullptr, &message.held);
    if (code == SQLITE_OK) {
        return 0;
    }
    if (message != nullptr) {
        log_err("err str = %s\n", message.held);
    }
    db_log_error(handle);
    return 1;
}

int db_exec_bound(sqlite_handle* handle, const char* sql, std::span<const char* const> values)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr) {
        log_err("err!\n");
        return 1;
    }
    if (run_bound(handle->db, sql, values)) {
        return 0;
    }
    // The step itself only says that something failed; the statement's end has told what.
    log_err("err str = %s\n", sqlite3_errmsg(handle->db));
    db_log_error(handle);
    return 1;
}

int db_prepare(sqlite_handle* handle, const char* sql)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return prepare(handle, sql, sql);
}

int db_prepare_bound(sqlite_handle* handle, const char* sql, const char* shown,
                     std::span<const char* const> values)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr || shown == nullptr) {
        log_err("err!\n");
        return 1;
    }
    if (prepare(handle, sql, shown) != 0) {
        return 1;
    }
    const int code = bind_all(handle->stmt, values);
    if (code != SQLITE_OK) {
        log_code_and_error(handle, code);
        db_finalize(handle);
        return 1;
    }
    return 0;
}

one_answer db_step_is_one(sqlite_handle* handle)
{
    const statement_guard statement(handle);
    int code = sqlite3_step(handle->stmt);
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        log_code_and_error(handle, code);
        return ONE_UNKNOWN;
    }
    const int columns = sqlite3_column_count(handle->stmt);
    int value = 0;
    for (; code == SQLITE_ROW; code = sqlite3_step(handle->stmt)) {
        for (int i = 0; i < columns; ++i) {
            value = sqlite3_column_int(handle->stmt, i);
        }
    }
    return value == 1 ? ONE_IS : ONE_NOT;
}

int db_table_exists(sqlite_handle* handle, const char* table)
{
    if (handle == nullptr || handle->db == nullptr || table == nullptr) {
        log_err("err!\n");
        return TABLE_UNKNOWN;
    }
    char query[TABLE_QUERY_SIZE];
    text_format(query, "select count(*) from sqlite_master where type='table' and name='%s'",
                table);
    if (db_prepare(handle, query) != 0) {
        log_err("err!\n");
        return TABLE_UNKNOWN;
    }
    switch (db_step_is_one(handle)) {
        case ONE_IS:
            return TABLE_EXISTS;
        case ONE_NOT:
            return TABLE_MISSING;
        case ONE_UNKNOWN:
            break;
    }
    return TABLE_UNKNOWN;
}

void db_log_error(sqlite_handle* handle)
{
    if (handle == nullptr) {
        return;
    }
    log_info("sqlite err code = %d\n", sqlite3_errcode(handle->db));
    log_info("sqlite err = %s\n", sqlite3_errmsg(handle->db));
}
