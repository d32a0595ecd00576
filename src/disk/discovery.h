// From a kernel device name to a filled record of the inventory.
#pragma once

#include "disk/disk_sets.h"

// Adds the disk or partition of that name, or nothing when blkid does not know it, it is no device
// that the daemon handles or the router's own, the table is full or some disk holds it already.
// Always 0, 1 for a null table.
int disk_sets_add_dev(disk_sets* sets, const char* dev_name);

// Adds a whole disk with all its partitions. 0 added, 1 table full.
int disk_sets_add_disk(disk_sets* sets, const char* root_dev);

// Adds a partition, and its disk when that is missing.
void disk_sets_add_part(disk_sets* sets, const char* dev_name);

// 0 when blkid identifies the device, else 1. A name that no kernel device has is never put into a
// command.
int dev_check_blkid(const char* dev_name);

// Adds every partition that the kernel lists below the disk.
void disk_obj_scan_parts(disk_obj* disk);

// Sets sd_card from the disk's name or its place in the kernel's device tree.
void disk_obj_detect_sd_card(disk_obj* disk);
