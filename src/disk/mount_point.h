// Which directory a partition is mounted at: the disk and part numbers, and the checks that hold
// the inventory against what the system has mounted.
#pragma once

#include <cstdint>

#include "disk/disk_sets.h"

// The number for a disk that is added now: the lowest gap in the numbers of the disks present that
// no mount below the mount base uses.
int32_t get_mount_point_num(const disk_sets* sets);

// Numbers every disk in table order, passing over numbers that mounts use, and its partitions.
// Always 0, 1 for a null table.
int set_all_mount_point_num(disk_sets* sets);

// Part numbers follow the slots: slot index + 1, or + 2 when the whole disk carries a filesystem
// and is part 1 itself.
void number_sub_parts(disk_obj* disk);

// YES when the part's device is mounted already (its mount_path and disk_name then follow), or NO.
int check_part_mounted(part_info* part);

// Marks every part of every disk that is mounted already. Always 0, 1 for a null table.
int check_disks_mounted(disk_sets* sets);

// YES when two mounted devices share one mount path, or NO.
int check_mount_path_dup();

// YES when the node of a mounted device is gone, or NO.
int check_mount_dev_exist();

// Force-unmounts, by device and by path, everything that is mounted below the mount base.
void umount_all_force();
