// Arbitrary texts in every column, and as a partition's UUID, through the operations on
// the table and through a whole mount and unmount. No row may be made twice or touched for another
// UUID, and no remembered path may be taken that is not a plain directory below the mount base.
//
// Fields: bytes that choose how the texts are used, the partition's UUID, then the columns of up to
// three rows.

#include <sys/stat.h>

#include <cstring>

#include "disk/disk_db.h"
#include "disk/mount.h"
#include "disk/removal.h"
#include "disk_rows.h"
#include "fuzz.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t ROWS = 3;
constexpr size_t FIRST_COLUMN = 2;
constexpr char DEV_NAME[] = "sda1";
constexpr char PLANNED_PATH[] = "/tmp/mountd/disk1_part2";

sqlite3* connection;
std::string mounted_line;  // what the mount listing shows of the partition
std::string listing;       // and of others

int count_of_uid(const std::vector<row>& rows, const std::string& uid)
{
    int count = 0;
    for (const row& values : rows) {
        count += row_has_uid(values, uid) ? 1 : 0;
    }
    return count;
}

std::vector<row> rows_of(const std::vector<std::string>& fields, const std::string& uid)
{
    std::vector<row> rows;
    size_t at = 0;
    const std::string& uses = fields[0];
    for (size_t first = FIRST_COLUMN; first < fields.size() && rows.size() < ROWS;
         first += ROW_COLUMNS) {
        row values;
        for (size_t i = 0; i < ROW_COLUMNS; ++i) {
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
        if (!row_has_uid(values, uid)) {
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
    const std::vector<row> after = rows_get();
    const int count = count_of_uid(before, uid);
    const bool read = expected_row(before, uid) != nullptr;
    const bool stored = !uid.empty() && count != 1 && !read;
    require(after.size() == before.size() + (stored ? 1 : 0), "a row is stored when there is none");
    for (size_t i = 0; i < before.size(); ++i) {
        if (count != 1 || !row_has_uid(before[i], uid)) {
            require(rows_are_same(before[i], after[i]), "others' rows stay");
        } else if (read || unmounted) {
            require(row_has_uid(after[i], uid) && after[i][4].bytes == (unmounted ? "no" : "yes"),
                    "the row says whether it is mounted");
        }
    }
    if (stored) {
        require(row_has_uid(after.back(), uid), "the new row is the UUID's");
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

}  // namespace

void fuzz_begin()
{
    mkdir(CONFIG_DIR, 0755);
    mkdir(MOUNT_BASE, 0755);
    connection = rows_open();
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
    rows_put(rows);
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
