// The shell commands that mount, unmount and repair filesystems. Who fills a mount command passes
// plain words; the others refuse and log what a shell would not take as one.
#pragma once

#include "util/fs_code.h"

// The mount command for a filesystem type code: a format that takes the device node and the mount
// directory, in this order. Null for a type that is never mounted.
const char* fs_mount_cmd_format(fs_code fs_type);

// Nothing in the daemon runs repairs. The filesystem's own command for a device node; 0, or 1 for a
// type without one.
int fs_repair(fs_code fs_type, const char* dev_path);

// fs_repair of one filesystem. Always 0.
int fs_repair_ntfs(const char* dev_path);
int fs_repair_exfat(const char* dev_path);
int fs_repair_ext2(const char* dev_path);
int fs_repair_ext3(const char* dev_path);
int fs_repair_ext4(const char* dev_path);
int fs_repair_fat(const char* dev_path);

// Unmount a device node or a directory. Whether it worked shows in the mount table.
void fs_umount(const char* target);
void fs_umount_force(const char* target);

// Nothing in the daemon calls it. Unmounts every entry of a directory whose name does not begin
// with a dot. 0 after the walk, 1 when the directory cannot be opened.
int umount_dir_entries(const char* path);
