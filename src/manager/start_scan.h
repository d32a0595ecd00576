// The disks that are there when the daemon starts.
#pragma once

#include "disk/disk_sets.h"

enum scan_result {
    SCAN_FAILED,  // the kernel's list cannot be opened
    SCAN_NO_DISK,
    SCAN_HAS_DISK,
};

// Adds every disk that the kernel lists. What the kernel does not tell whole has a disk.
scan_result add_all_disks(disk_sets* disks);
