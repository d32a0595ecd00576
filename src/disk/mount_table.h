// What the system has mounted below the mount base right now, read back from the mount command.
#pragma once

#include <cstddef>
#include <cstdint>

#include "util/answer.h"

constexpr int MOUNT_TABLE_SIZE = 16;
constexpr size_t MOUNT_DEV_SIZE = 32;
constexpr size_t MOUNT_PATH_SIZE = 128;

struct mount_entry {
    char dev[MOUNT_DEV_SIZE];    // device path as listed, cut when longer
    char path[MOUNT_PATH_SIZE];  // mount path as listed, cut when longer
    int32_t main;                // disk number in path, 0 when it has none
    int32_t sub;                 // part number in path, 0 when it has none
};

// A snapshot of sd and mmcblk0 devices below the mount base; what does not fit is left out.
struct mount_table {
    mount_entry entries[MOUNT_TABLE_SIZE];
    int32_t num;
};

// Takes a fresh snapshot. 0, or 1 and an empty one when the listing cannot be read.
int read_mount_table(mount_table* table);

// Adds one line of the listing. 0 when it was taken, 1 when it was skipped.
int parse_mount_line(mount_table* table, const char* line);

// Takes the numbers out of a mount path. The outputs (either may be null) stay untouched when the
// path has none.
void parse_mount_point_num(const char* path, int32_t* main_number, int32_t* sub_number);

// Index of the first entry with exactly that device or path, -1 when none.
int find_mount_by_dev(const mount_table* table, const char* dev_path);
int find_mount_by_path(const mount_table* table, const char* path);

// Each takes a fresh snapshot. YES or NO; a null argument counts as mounted, so that nothing
// is ever mounted over an unknown state.
int is_dev_mounted(const char* dev_path);
int is_path_mounted(const char* path);

// As is_dev_mounted; copies the device's last listed path into out (MOUNT_PATH_SIZE bytes, may be
// null).
int get_dev_mount_path(const char* dev_path, char* out);
