#include "db_sqlite/db_sqlite.h"

#include <cstring>

#include "log/log.h"
#include "util/text.h"

namespace {

constexpr size_t TABLE_QUERY_SIZE = 256;

int log_code_and_error(sqlite_handle* handle, int code)
{
    log_err("err code = %d\n", code);
    db_log_error(handle);
    return 1;
}

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
    char* message = nullptr;
    const int code = sqlite3_exec(handle->db, sql, nullptr, nullptr, &message);
    if (code != SQLITE_OK) {
        if (message != nullptr) {
            log_err("err str = %s\n", message);
        }
        db_log_error(handle);
    }
    sqlite3_free(message);
    return code == SQLITE_OK ? 0 : 1;
}

int db_exec_bound(sqlite_handle* handle, const char* sql, std::span<const char* const> values)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr) {
        log_err("err!\n");
        return 1;
    }
    const bool done = sqlite3_prepare(handle->db, sql, -1, &handle->stmt, nullptr) == SQLITE_OK &&
                      bind_all(handle->stmt, values) == SQLITE_OK &&
                      sqlite3_step(handle->stmt) == SQLITE_DONE;
    // The step itself only says that something failed; finalizing tells what.
    sqlite3_finalize(handle->stmt);
    handle->stmt = nullptr;
    if (!done) {
        log_err("err str = %s\n", sqlite3_errmsg(handle->db));
        db_log_error(handle);
    }
    return done ? 0 : 1;
}

int db_prepare(sqlite_handle* handle, const char* sql)
{
    if (handle == nullptr || handle->db == nullptr || sql == nullptr) {
        log_err("err!\n");
        return 1;
    }
    const auto length = static_cast<int>(strlen(sql));
    const int code = sqlite3_prepare(handle->db, sql, length, &handle->stmt, nullptr);
    if (code != SQLITE_OK) {
        log_err("err code = %d\n", code);
        log_err("sq = %s\n", sql);
        db_log_error(handle);
        return 1;
    }
    return 0;
}

int db_prepare_bound(sqlite_handle* handle, const char* sql, std::span<const char* const> values)
{
    if (db_prepare(handle, sql) != 0) {
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

int db_step_is_one(sqlite_handle* handle)
{
    int code = sqlite3_step(handle->stmt);
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        log_code_and_error(handle, code);
        db_finalize(handle);
        return -1;
    }
    const int columns = sqlite3_column_count(handle->stmt);
    int value = 0;
    for (; code == SQLITE_ROW; code = sqlite3_step(handle->stmt)) {
        for (int i = 0; i < columns; ++i) {
            value = sqlite3_column_int(handle->stmt, i);
        }
    }
    db_finalize(handle);
    return value == 1 ? 1 : 0;
}

int db_table_exists(sqlite_handle* handle, const char* table)
{
    if (handle == nullptr || handle->db == nullptr || table == nullptr) {
        log_err("err!\n");
        return -1;
    }
    char query[TABLE_QUERY_SIZE];
    text_format(query, sizeof(query),
                "select count(*) from sqlite_master where type='table' and name='%s'", table);
    if (db_prepare(handle, query) != 0) {
        log_err("err!\n");
        return -1;
    }
    const int found = db_step_is_one(handle);
    if (found < 0) {
        return -1;
    }
    return found == 1 ? 0 : 1;
}

void db_log_error(sqlite_handle* handle)
{
    log_info("sqlite err code = %d\n", sqlite3_errcode(handle->db));
    log_info("sqlite err = %s\n", sqlite3_errmsg(handle->db));
}
