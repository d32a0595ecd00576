// Unmounting and forgetting partitions and disks. A name is a kernel device name (dev_name), that
// of a whole disk (root_dev), or a directory name below the mount base (dir_name).
#pragma once

#include "disk/disk_sets.h"

constexpr int UMOUNT_TRIES = 10;  // further attempts, a second apart, while a device stays mounted

// Unmounts by device and by path and notes it in the database. Blocks up to 10 s for a device that
// somebody keeps busy. The record itself is left to the caller.
void umount_part(const part_info* part);

// Unmounts every partition of the disk and the whole disk. Always 0, 1 for a null disk.
int umount_disk_parts(disk_obj* disk);

// Unmounts and forgets the disk of that name. 0, 1 when there is none.
int remove_root_part(disk_sets* sets, const char* root_dev);

// Unmounts and forgets the partition of that device name. Always 0, 1 for a null table.
int remove_sub_part(disk_sets* sets, const char* dev_name);

// Either of the two, whichever the name is at the moment. Always 0, 1 for a null table.
int remove_dev(disk_sets* sets, const char* dev_name);

// Unmounts and forgets the partition of that directory name (disk1_part2); a whole disk's is not
// looked for. Always 0, 1 for a null table.
int remove_disk(disk_sets* sets, const char* dir_name);

// Unmounts and forgets every disk that the kernel lists. 0, 1 when /sys/block cannot be read.
int safe_remove_all(disk_sets* sets);
