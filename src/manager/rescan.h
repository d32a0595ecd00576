// Disks that came or went without an event: what /sys/block lists against what it listed last.
#pragma once

#include <cstdint>

#include "disk/disk_sets.h"

// Adds the disks that are new since the previous call and removes those that are gone; sets changed
// when there were any. False when /sys/block cannot be read whole, and nothing is done.
[[nodiscard]] bool rescan_block_devices(disk_sets* disks, int32_t* changed);

// Has the next call offer the disk or partition to the inventory as if it came then.
void rescan_offer_again(const char* dev_name);

// Drops such offers of the disk that the device is or is on, since its removal is meant: to take in
// one partition would take in all of a disk that is forgotten. Of all disks for a null name.
void rescan_drop_offers(const char* dev_name);

// Forgets the previous call. For tests.
void rescan_reset();
