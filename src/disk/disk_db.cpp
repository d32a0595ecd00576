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

// A statement with N values in its two forms. As shown in the log, for people to read and paste:
// the first %s is the table, the others are the values. As run, with a parameter for each value: a
// quote in a value is then data like any other.
template <size_t N>
struct statement {
    const char* shown;
    const char* run;
};

template <size_t N>
using statement_values = const char* const (&)[N];

constexpr char CREATE_TABLE[] =
    "CREATE TABLE %s (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,mountd TEXT);";
constexpr statement<1> COUNT_UID{
    "select count(*) from %s where uid='%s'",
    "select count(*) from disk where uid=?",
};
constexpr statement<1> SELECT_UID{
    "select * from %s where uid='%s'",
    "select * from disk where uid=?",
};
constexpr statement<5> INSERT{
    "insert into %s values('%s','%s','%s','%s','%s')",
    "insert into disk values(?,?,?,?,?)",
};
constexpr statement<2> UPDATE_MOUNTD{
    "update %s set mountd='%s'where uid='%s'",
    "update disk set mountd=? where uid=?",
};
constexpr statement<4> UPDATE_PATHS{
    "update %s set dev_name='%s',disk_name='%s',mount_path='%s' where uid='%s'",
    "update disk set dev_name=?,disk_name=?,mount_path=? where uid=?",
};
constexpr statement<5> UPDATE_ALL{
    "update %s set dev_name='%s',disk_name='%s',mount_path='%s',mountd='%s' where uid='%s'",
    "update disk set dev_name=?,disk_name=?,mount_path=?,mountd=? where uid=?",
};

// The shown form with its words filled in, cut to the buffer.
void fill_words(char (&out)[STATEMENT_SIZE], const char* shown, std::span<const char* const> values)
{
    const char* word = TABLE;
    size_t used = 0;
    while (const char* mark = strstr(shown, "%s")) {
        text_format({out + used, sizeof(out) - used}, "%.*s%s", static_cast<int>(mark - shown),
                    shown, word);
        used += strlen(out + used);
        shown = mark + strlen("%s");
        if (!values.empty()) {
            word = values.front();
            values = values.subspan(1);
        }
    }
    text_copy({out + used, sizeof(out) - used}, shown);
}

template <size_t N>
int prepare_select(sqlite_handle* handle, const statement<N>& select, statement_values<N> values)
{
    char shown[STATEMENT_SIZE];
    fill_words(shown, select.shown, values);
    return db_prepare_bound(handle, select.run, shown, values);
}

template <size_t N>
int run_statement(sqlite_handle* handle, const statement<N>& change, statement_values<N> values)
{
    char shown[STATEMENT_SIZE];
    fill_words(shown, change.shown, values);
    log_info("sql = \n%s\n", shown);
    return db_exec_bound(handle, change.run, values);
}

template <size_t N>
int run_update(sqlite_handle* handle, const statement<N>& update, statement_values<N> values)
{
    if (run_statement(handle, update, values) != 0) {
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
    if (stored == STORED_UNKNOWN) {
        log_err("err!\n");
        return 0;
    }
    if (stored == STORED_NOT_ONCE) {
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
    if (db_table_exists(handle, TABLE) == TABLE_EXISTS) {
        // Logged on every operation of the daemon's: the table is there ever after the first.
        log_warn("db table already exist, table = %s\n", TABLE);
        return 0;
    }
    char sql[STATEMENT_SIZE];
    text_format(sql, CREATE_TABLE, TABLE);
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
        return STORED_UNKNOWN;
    }
    if (prepare_select(handle, COUNT_UID, {uid}) != 0) {
        log_err("err!\n");
        return STORED_UNKNOWN;
    }
    switch (db_step_is_one(handle)) {
        case ONE_IS:
            return STORED_ONCE;
        case ONE_NOT:
            return STORED_NOT_ONCE;
        case ONE_UNKNOWN:
            break;
    }
    return STORED_UNKNOWN;
}

int disk_table_select(const char* uid, disk_db_record* record, sqlite_handle* handle)
{
    if (uid == nullptr || record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    if (prepare_select(handle, SELECT_UID, {uid}) != 0) {
        log_err("err!\n");
        return -1;
    }
    const statement_guard statement(handle);
    const int code = sqlite3_step(handle->stmt);
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
        log_err("err code = %d\n", code);
        db_log_error(handle);
        return 1;
    }
    if (code == SQLITE_DONE || !copy_columns(handle, record)) {
        log_err("err!\n");
        return 1;
    }
    disk_db_record_dump(record);
    return 0;
}

int disk_table_set_mountd(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_MOUNTD, {mountd_text(record->mountd), record->uid});
}

int disk_table_update_paths(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_PATHS,
                      {record->dev_name, record->disk_name, record->mount_path, record->uid});
}

int disk_table_update_all(const disk_db_record* record, sqlite_handle* handle)
{
    if (record == nullptr || handle == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return run_update(handle, UPDATE_ALL,
                      {record->dev_name, record->disk_name, record->mount_path,
                       mountd_text(record->mountd), record->uid});
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
    if (stored == STORED_UNKNOWN) {
        log_err("err!\n");
        return;
    }
    if (stored == STORED_NOT_ONCE) {
        // When it fails the log has it, and the mount goes on without its row.
        run_statement(&db.handle, INSERT,
                      {record->uid, record->dev_name, record->disk_name, record->mount_path,
                       record->mountd != 0 ? "yes" : "no"});
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
    if (record == nullptr) {
        return;
    }
    log_info("disk info:\n");
    log_info("uid = %s\n", record->uid);
    log_info("dev name = %s\n", record->dev_name);
    log_info("disk name = %s\n", record->disk_name);
    log_info("mount path = %s\n", record->mount_path);
    log_info("mountd = %d\n", record->mountd);
}
