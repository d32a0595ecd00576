// Mounting: every partition of every known disk at its own directory, remembered by UUID.
#pragma once

#include "disk/disk_sets.h"

// Looks at the mount table after the mount command, each after a pause: util/waits.h.
constexpr int MOUNT_WAIT_TRIES = 9;

// The whole mount pass: drops small partitions, sorts and numbers the disks the first time, mounts
// what is not mounted yet and refreshes the sizes. Blocks up to 18 s for each partition that does
// not appear. 0, 1 for a null table.
int mount_all(disk_sets* sets);

// mount_all as the loop runs it: before each disk that has something to mount, those that the
// kernel no longer lists are forgotten. mount_all believes its table.
int mount_all_present(disk_sets* sets);

// Parts of the pass. Always 0, 1 for a null argument.
int mount_disk_sets(disk_sets* sets);
int mount_root_part(disk_obj* disk);
int mount_sub_parts(disk_obj* disk);

// Mounts one partition unless it is mounted already; mount_status tells the outcome.
void mount_part(part_info* part);

// Gives the part the mount path remembered for its UUID when that is free, and writes down where
// it goes.
void sync_part_with_db(part_info* part);
