// Disks that wait for their first mount pass. Nothing was planned for them yet, so that a removal
// of another disk drops them with the empty ones.
#pragma once

#include "disk/disk_sets.h"

struct waiting_disks {
    char root_devs[MAX_DISKS][PART_DEV_NAME_SIZE];
    int count;
};

// All of them but the disk that holds a device of that name: its removal is meant.
[[nodiscard]] waiting_disks find_waiting_disks(const disk_sets* sets, const char* removed_dev);

// Adds those again that the inventory has dropped since, as if they came now.
void bring_back_waiting_disks(disk_sets* sets, const waiting_disks& waiting);
