#include "disk/disk_db.h"

#include <cstring>
#include <span>

#include "log/log.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr char TABLE[] = "disk";
constexpr size_t STATEMENT_SIZE = 512;
constexpr int COLUMN_COUNT = 5;
constexpr int MAX_VALUES = 5;

// The statement texts. The first %s is the table, each '%s' a value.
constexpr char CREATE_TABLE[] =
    "CREATE TABLE %s (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,mountd TEXT);";
constexpr char COUNT_UID[] = "select count(*) from %s where uid='%s'";
constexpr char SELECT_UID[] = "select * from %s where uid='%s'";
constexpr char INSERT[] = "insert into %s values('%s','%s','%s','%s','%s')";
constexpr char UPDATE_MOUNTD[] = "update %s set mountd='%s'where uid='%s'";
constexpr char UPDATE_PATHS[] =
    "update %s set dev_name='%s',disk_name='%s',mount_path='%s' where uid='%s'";
constexpr char UPDATE_ALL[] =
    "update %s set dev_name='%s',disk_name='%s',mount_path='%s',mountd='%s' where uid='%s'";

struct value_list {
    const char* values[MAX_VALUES];
    int count;
};

// Appends to a buffer of fixed size and cuts what does not fit.
struct text_builder {
    char* out;
    size_t size;
    size_t used;

    void append(const char* text, size_t length)
    {
        text_copy_n(out + used, size - used, text, length);
        used += strlen(out + used);
    }
};

// Fills a statement text. Each value stands in it as text, for people to read, or as a parameter,
// for SQLite to run: a quote in a value is then data like any other.
void build_statement(char (&out)[STATEMENT_SIZE], const char* format, const value_list* readable)
{
    text_builder builder{out, sizeof(out), 0};
    bool table_done = false;
    int next_value = 0;
    const char* rest = format;
    while (const char* mark = strstr(rest, "%s")) {
        const bool as_parameter = table_done && readable == nullptr;
        const auto before = static_cast<size_t>(mark - rest);
        builder.append(rest, as_parameter ? before - 1 : before);
        rest = mark + strlen("%s");
        if (!table_done) {
            builder.append(TABLE, strlen(TABLE));
            table_done = true;
        } else if (as_parameter) {
            builder.append("?", 1);
            ++rest;
        } else {
            const char* value = readable->values[next_value++];
            builder.append(value, strlen(value));
        }
    }
    builder.append(rest, strlen(rest));
}

std::span<const char* const> bound_values(const value_list& values)
{
    return {values.values, static_cast<size_t>(values.count)};
}

int prepare_select(sqlite_handle* handle, const char* format, const value_list& values)
{
    char sql[STATEMENT_SIZE];
    build_statement(sql, format, nullptr);
    return db_prepare_bound(handle, sql, bound_values(values));
}

int run_statement(sqlite_handle* handle, const char* format, const value_list& values)
{
    char sql[STATEMENT_SIZE];
    build_statement(sql, format, &values);
    log_info("sql = \n%s\n", sql);
    build_statement(sql, format, nullptr);
    return db_exec_bound(handle, sql, bound_values(values));
}

int run_update(sqlite_handle* handle, const char* format, const value_list& values)
{
    if (run_statement(handle, format, values) != 0) {
        log_err("err!\n");
        return 1;
    }
    return 0;
}

const char* mountd_text(int32_t mountd)
{
    return mountd == 1 ? "yes" : "no";
}

bool copy_columns(sqlite_handle* handle, disk_db_record* record)
{
    const char* texts[COLUMN_COUNT];
    for (int i = 0; i < COLUMN_COUNT; ++i) {
        texts[i] = reinterpret_cast<const char*>(sqlite3_column_text(handle->stmt, i));
        if (texts[i] == nullptr) {
            return false;
        }
    }
    text_copy(record->uid, texts[0]);
    text_copy(record->dev_name, texts[1]);
    text_copy(record->disk_name, texts[2]);
    text_copy(record->mount_path, texts[3]);
    record->mountd = text_has_prefix(texts[4], "yes") ? 1 : 0;
    return true;
}

// A database that is open, with its table, until the end of the scope.
struct open_disk_db {
    sqlite_handle handle;
    bool ready;

    open_disk_db()
    {
        db_handle_init(&handle);
        ready = db_open(&handle, DISK_DB_FILE) == 0 && disk_table_create(&handle) == 0;
        if (!ready) {
            log_err("err!\n");
        }
    }
    ~open_disk_db() { db_close(&handle); }
    open_disk_db(const open_disk_db&) = delete;
    open_disk_db& operator=(const open_disk_db&) = delete;
};

int update_stored(const disk_db_record* record,
                  int (*update)(const disk_db_record*, sqlite_handle*))
{
    if (record == nullptr) {
        log_err("err!\n");
        return 1;
    }
    open_disk_db db;
    if (!db.ready) {
        return 0;
    }
    const int stored = disk_table_uid_exists(record->uid, &db.handle);
    if (stored < 0) {
        log_err("err!\n");
        return 0;
    }
    if (stored == 0) {
        log_warn("uid not exist\n");
        return 0;
    }
    return update(record, &db.handle);
}

bool is_complete(const disk_db_record* record)
{
    return record->uid[0] != '\0' && record->dev_name[0] != '\0' && record->disk_name[0] != '\0' &&
           record->mount_path[0] != '\0';
}

}  // namespace

int disk_table_create(sqlite_handle* handle)
{
    if (db_table_exists(handle, TABLE) == 0) {
        log_warn("db table already exist, table = %s\n", TABLE);
        return 0;
    }
    char sql[STATEMENT_SIZE];
    build_statement(sql, CREATE_TABLE, nullptr);
    log_info("len = %d, sql = \n%s\n", static_cast<int>(strlen(sql)), sql);
    if (db_exec(handle, sql) != 0) {
        log_err("err!\n");
        return 1;
    }
    return 0;
}

int disk_table_uid_exists(const char* uid, sqlite_handle* handle)
{
    if (uid == nullptr || handle == nullptr) {
        log_err("err!\n");
        return -1;
    }
    if (prepare_select(handle, COUNT_UID, {{uid}, 1}) != 0) {
        log_err("err!\n");
        return -1;
    }
    return db_step_is_one(handle);
}

int disk_table_select(const char* uid, disk_db_record* record, sqlite_handle* handle)
{
    if (uid == nullptr || record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    if (prepare_select(handle, SELECT_UID, {{uid}, 1}) != 0) {
        log_err("err!\n");
        return -1;
    }
    const int code = sqlite3_step(handle->stmt);
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        log_err("err code = %d\n", code);
        db_log_error(handle);
        db_finalize(handle);
        return 1;
    }
    const bool complete = code == SQLITE_ROW && copy_columns(handle, record);
    if (complete) {
        disk_db_record_dump(record);
    } else {
        log_err("err!\n");
    }
    db_finalize(handle);
    return complete ? 0 : 1;
}

int disk_table_set_mountd(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_MOUNTD, {{mountd_text(record->mountd), record->uid}, 2});
}

int disk_table_update_paths(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_PATHS,
                      {{record->dev_name, record->disk_name, record->mount_path, record->uid}, 4});
}

int disk_table_update_all(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_ALL,
                      {{record->dev_name, record->disk_name, record->mount_path,
                        mountd_text(record->mountd), record->uid},
                       5});
}

void disk_db_add(const disk_db_record* record)
{
    if (record == nullptr || !is_complete(record)) {
        log_err("err!\n");
        return;
    }
    dir_make(CONFIG_DIR);
    open_disk_db db;
    if (!db.ready) {
        return;
    }
    const int stored = disk_table_uid_exists(record->uid, &db.handle);
    if (stored < 0) {
        log_err("err!\n");
        return;
    }
    if (stored == 0) {
        run_statement(&db.handle, INSERT,
                      {{record->uid, record->dev_name, record->disk_name, record->mount_path,
                        record->mountd != 0 ? "yes" : "no"},
                       5});
    }
}

int disk_db_get(const char* uid, disk_db_record* record)
{
    if (uid == nullptr || record == nullptr) {
        log_err("err!\n");
        return 1;
    }
    open_disk_db db;
    return db.ready ? disk_table_select(uid, record, &db.handle) : 1;
}

int disk_db_set_mountd(const disk_db_record* record)
{
    return update_stored(record, disk_table_set_mountd);
}

int disk_db_update_paths(const disk_db_record* record)
{
    return update_stored(record, disk_table_update_paths);
}

int disk_db_update_all(const disk_db_record* record)
{
    return update_stored(record, disk_table_update_all);
}

void disk_db_record_dump(const disk_db_record* record)
{
    log_info("disk info:\n");
    log_info("uid = %s\n", record->uid);
    log_info("dev name = %s\n", record->dev_name);
    log_info("disk name = %s\n", record->disk_name);
    log_info("mount path = %s\n", record->mount_path);
    log_info("mountd = %d\n", record->mountd);
}
