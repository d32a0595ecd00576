// Arbitrary texts in every column, and as a partition's UUID and label, through the operations on
// the table and through a whole mount and unmount. No row may be made twice or touched for another
// UUID, and no remembered path may be taken that is not a plain directory below the mount base.
//
// Fields: bytes that choose how the texts are used, the partition's UUID, then the columns of up to
// three rows.

#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>

#include "disk/disk_db.h"
#include "disk/mount.h"
#include "disk/removal.h"
#include "fuzz.h"
#include "fuzz_sqlite.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t COLUMNS = 5;
constexpr size_t ROWS = 3;
constexpr size_t FIRST_COLUMN = 2;
constexpr char DEV_NAME[] = "sda1";
constexpr char PLANNED_PATH[] = "/tmp/mountd/disk1_part2";

// What a column holds besides text.
enum use : uint8_t { USE_TEXT, USE_BLOB, USE_NULL, USE_UID, USE_COUNT };

struct cell {
    uint8_t use;
    std::string bytes;

    [[nodiscard]] bool is_text() const { return use == USE_TEXT || use == USE_UID; }
};

using row = std::vector<cell>;

sqlite3* connection;
std::string mounted_line;  // what the mount listing shows of the partition
std::string listing;       // and of others

// The program's own statements, kept from input to input.
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

void insert(const row& values)
{
    for (size_t i = 0; i < COLUMNS; ++i) {
        bind(statements.insert, static_cast<int>(i + 1), values[i]);
    }
    run(statements.insert);
}

// All rows in their order, in the form in which they were written.
std::vector<row> stored_rows()
{
    std::vector<row> rows;
    sqlite3_stmt* statement = statements.select;
    while (sqlite3_step(statement) == SQLITE_ROW) {
        row values;
        for (int i = 0; i < static_cast<int>(COLUMNS); ++i) {
            const int type = sqlite3_column_type(statement, i);
            const uint8_t use = type == SQLITE_NULL   ? USE_NULL
                                : type == SQLITE_BLOB ? USE_BLOB
                                                      : USE_TEXT;
            const void* bytes = sqlite3_column_blob(statement, i);
            const auto size = static_cast<size_t>(sqlite3_column_bytes(statement, i));
            values.push_back({use, std::string(static_cast<const char*>(bytes), bytes ? size : 0)});
        }
        rows.push_back(values);
    }
    sqlite3_reset(statement);
    return rows;
}

bool has_uid(const row& values, const std::string& uid)
{
    return values[0].is_text() && values[0].bytes == uid;
}

int count_of_uid(const std::vector<row>& rows, const std::string& uid)
{
    int count = 0;
    for (const row& values : rows) {
        count += has_uid(values, uid) ? 1 : 0;
    }
    return count;
}

bool same(const row& a, const row& b)
{
    for (size_t i = 0; i < COLUMNS; ++i) {
        if (a[i].is_text() != b[i].is_text() || a[i].bytes != b[i].bytes) {
            return false;
        }
    }
    return true;
}

std::vector<row> rows_of(const std::vector<std::string>& fields, const std::string& uid)
{
    std::vector<row> rows;
    size_t at = 0;
    const std::string& uses = fields[0];
    for (size_t first = FIRST_COLUMN; first < fields.size() && rows.size() < ROWS;
         first += COLUMNS) {
        row values;
        for (size_t i = 0; i < COLUMNS; ++i) {
            ++at;
            const auto chosen = at < uses.size() ? static_cast<uint8_t>(uses[at]) : USE_TEXT;
            const uint8_t use = chosen % USE_COUNT;
            const std::string bytes = first + i < fields.size() ? fields[first + i] : "";
            values.push_back({use, use == USE_NULL ? "" : use == USE_UID ? uid : bytes});
        }
        rows.push_back(values);
    }
    return rows;
}

std::string cut(const std::string& bytes, size_t size)
{
    return c_text(bytes).substr(0, size - 1);
}

// The first row of the UUID when none of its columns is missing.
const row* expected_row(const std::vector<row>& rows, const std::string& uid)
{
    for (const row& values : rows) {
        if (!has_uid(values, uid)) {
            continue;
        }
        for (const cell& value : values) {
            if (value.use == USE_NULL) {
                return nullptr;
            }
        }
        return &values;
    }
    return nullptr;
}

// A UUID that is stored once is kept up to date; one that is not there is stored; of one that is
// stored twice nobody knows which row to trust.
void check_rows(const std::vector<row>& before, const std::string& uid, bool unmounted)
{
    const std::vector<row> after = stored_rows();
    const int count = count_of_uid(before, uid);
    const bool read = expected_row(before, uid) != nullptr;
    const bool stored = !uid.empty() && count != 1 && !read;
    require(after.size() == before.size() + (stored ? 1 : 0), "a row is stored when there is none");
    for (size_t i = 0; i < before.size(); ++i) {
        if (count != 1 || !has_uid(before[i], uid)) {
            require(same(before[i], after[i]), "others' rows stay");
        } else if (read || unmounted) {
            require(has_uid(after[i], uid) && after[i][4].bytes == (unmounted ? "no" : "yes"),
                    "the row says whether it is mounted");
        }
    }
    if (stored) {
        require(has_uid(after.back(), uid), "the new row is the UUID's");
    }
}

void check_get(const std::vector<row>& rows, const std::string& uid)
{
    disk_db_record record{};
    sqlite_handle handle{connection, nullptr};
    const int ret = disk_table_select(uid.c_str(), &record, &handle);
    require(handle.stmt == nullptr, "no statement is left");
    const row* expected = expected_row(rows, uid);
    require((ret == 0) == (expected != nullptr), "a whole row is read");
    if (expected == nullptr) {
        return;
    }
    const row& values = *expected;
    require(is_clean_text(record.uid) && is_clean_text(record.dev_name) &&
                is_clean_text(record.disk_name) && is_clean_text(record.mount_path),
            "texts are terminated");
    require(record.uid == cut(values[0].bytes, PART_UID_SIZE), "the UUID is the row's");
    require(record.dev_name == cut(values[1].bytes, PART_DEV_NAME_SIZE), "the device too");
    require(record.disk_name == cut(values[2].bytes, PART_DISK_NAME_SIZE), "the name too");
    require(record.mount_path == cut(values[3].bytes, PART_MOUNT_PATH_SIZE), "the path too");
    require(record.mountd == (values[4].bytes.rfind("yes", 0) == 0 ? 1 : 0), "mounted is yes");
}

// Directly below the mount base, and only of characters that no shell and no path reads otherwise.
bool is_plain_mount_path(const std::string& path)
{
    const std::string base = std::string(MOUNT_BASE) + "/";
    const std::string name = path.substr(std::min(base.size(), path.size()));
    const std::string plain = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789._-!";
    return path.rfind(base, 0) == 0 && !name.empty() && name[0] != '.' &&
           name.find_first_not_of(plain) == std::string::npos;
}

void check_mount(const std::vector<row>& rows, part_info* part, bool whole)
{
    const std::string uid = part->uid;
    const row* remembered = expected_row(rows, uid);
    if (whole) {
        mount_part(part);
    } else {
        sync_part_with_db(part);
    }
    const std::string path = part->mount_path;
    require(is_clean_text(part->mount_path) && is_clean_text(part->disk_name),
            "texts are terminated");
    require(is_plain_mount_path(path), "only plain directories below the base are taken");
    const bool is_remembered =
        remembered != nullptr && path == cut((*remembered)[3].bytes, PART_MOUNT_PATH_SIZE);
    require(path == PLANNED_PATH || is_remembered, "the planned path or the remembered one");
}

void begin_rows(const std::vector<row>& rows)
{
    run(statements.begin);
    run(statements.clear);
    for (const row& values : rows) {
        insert(values);
    }
    run(statements.commit);
}

}  // namespace

void fuzz_begin()
{
    mkdir(CONFIG_DIR, 0755);
    mkdir(MOUNT_BASE, 0755);
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
}

// Mounting works at once, and so does unmounting.
std::string fuzz_answer(const std::string& command)
{
    if (command == "mount") {
        return listing + mounted_line;
    }
    if (command.rfind("mount ", 0) == 0) {
        const std::string path = command.substr(command.rfind(' ') + 1);
        mounted_line = "/dev/sda1 on " + path + " type ext4 (rw)\n";
    } else if (command.rfind("umount ", 0) == 0) {
        mounted_line.clear();
    } else {
        require(command.rfind("chmod a+wr /tmp/mountd/", 0) == 0, "only known commands are run");
    }
    return "";
}

void fuzz_one(const std::string& input)
{
    const std::vector<std::string> fields = fields_of(input, FIRST_COLUMN);
    part_info part{};
    part_info root{};
    root.mount_point_num = 1;
    part.ref_root = &root;
    part.mount_point_num = 2;
    part.fs_type = FS_EXT4;
    text_copy(part.dev_name, DEV_NAME);
    text_copy(part.uid, fields[1].c_str());
    text_copy(part.disk_name, "disk1_part2");
    text_copy(part.mount_path, PLANNED_PATH);
    const std::string uid = part.uid;

    const std::vector<row> rows = rows_of(fields, uid);
    begin_rows(rows);
    mounted_line.clear();
    // Every other input finds the first row's path taken.
    const bool occupied = !fields[0].empty() && (fields[0][0] & 1) != 0 && !rows.empty();
    listing = occupied ? "/dev/sdz1 on " + rows[0][3].bytes + " type ext4 (rw)\n" : "";

    check_get(rows, uid);
    check_mount(rows, &part, input.size() % 4 < 2);
    const bool unmounted = input.size() % 4 == 0;
    if (unmounted) {
        umount_part(&part);
    }
    check_rows(rows, uid, unmounted);
}
