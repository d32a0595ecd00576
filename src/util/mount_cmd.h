// The shell commands that mount and repair each kind of filesystem.
#pragma once

#include <cstdint>

// The mount command for a filesystem type code: a format that takes the device node and the mount
// directory, in this order. Null for a type that is never mounted.
const char* fs_mount_cmd_format(int32_t fs_type);

// Repair the filesystem on a device node. Nothing in the daemon runs them. Always 0.
int fs_repair_ntfs(const char* dev_path);
int fs_repair_exfat(const char* dev_path);
int fs_repair_ext2(const char* dev_path);
int fs_repair_ext3(const char* dev_path);
int fs_repair_ext4(const char* dev_path);
int fs_repair_fat(const char* dev_path);

// Unmounts every entry of a directory whose name does not begin with a dot. 0 after the walk, 1
// when the directory cannot be opened.
int umount_dir_entries(const char* path);
