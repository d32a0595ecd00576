// Disks that came or went without an event: what /sys/block lists against what it listed last.
#pragma once

#include <cstdint>

#include "disk/disk_sets.h"

// Adds the disks that are new since the previous call and removes those that are gone; sets changed
// when there were any. 0, or 1 when /sys/block cannot be read, and nothing is done.
int rescan_block_devices(disk_sets* disks, int32_t* changed);
