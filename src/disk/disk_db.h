// The "disk" table: where each partition was mounted last, remembered by filesystem UUID so that it
// returns to the same directory after re-plugging and restarts.
#pragma once

#include <cstdint>

#include "db_sqlite/db_sqlite.h"
#include "disk/part_info.h"

// One row of the table.
struct disk_db_record {
    char uid[PART_UID_SIZE];                // the key
    char dev_name[PART_DEV_NAME_SIZE];      // kernel device name when it was written
    char disk_name[PART_DISK_NAME_SIZE];    // directory name below the mount base
    char mount_path[PART_MOUNT_PATH_SIZE];  // the full mount path
    int32_t mountd;                         // 1 while mounted by the daemon, 0 after an unmount
};

// Operations that open the database file, act and close it again. A failure is logged and never
// more than that: mounting goes on without the memory.

// Inserts the record when its four texts are non-empty and its uid is not stored once already.
void disk_db_add(const disk_db_record* record);

// 0 when a row was read, non-zero otherwise.
int disk_db_get(const char* uid, disk_db_record* record);

// The update's result; 0 when nothing was updated because the uid is not stored exactly once.
int disk_db_set_mountd(const disk_db_record* record);
int disk_db_update_all(const disk_db_record* record);

// What the operations above are made of, for whoever has the database open, and what nobody in the
// daemon calls.

// What disk_table_uid_exists answers. Two rows of one uid count as none.
enum stored_answer { STORED_UNKNOWN = -1, STORED_NOT_ONCE = 0, STORED_ONCE = 1 };

// On an open database. 0 or 1 unless a line says otherwise.

// Makes sure that the table exists.
int disk_table_create(sqlite_handle* handle);

// A stored_answer.
int disk_table_uid_exists(const char* uid, sqlite_handle* handle);

// Reads the first row of the uid into the record, which stays untouched otherwise. 1 when there is
// none or a column is missing, -1 when the statement could not be prepared.
int disk_table_select(const char* uid, disk_db_record* record, sqlite_handle* handle);

// Write the columns that their names say into the row of the record's uid.
int disk_table_set_mountd(const disk_db_record* record, sqlite_handle* handle);
int disk_table_update_paths(const disk_db_record* record, sqlite_handle* handle);
int disk_table_update_all(const disk_db_record* record, sqlite_handle* handle);

// As disk_db_update_all, for the three names alone.
int disk_db_update_paths(const disk_db_record* record);

// Logs the record's fields; nothing of a null one.
void disk_db_record_dump(const disk_db_record* record);
