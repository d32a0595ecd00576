// Disks that left by themselves: pulled, or replaced by another one under the same name. What is
// known of such a disk is known of something that is not there any more: it is unmounted and
// forgotten, whether a message tells of it or not, and before or after.
#pragma once

#include <cstdint>

#include "disk/disk_sets.h"

// A pulled disk's messages may be late: for so long they may come for a disk that has its name by
// now.
constexpr int64_t FORMER_DISK_SECONDS = 20;

// Unmounts and forgets every disk that the kernel no longer lists, or lists anew. True when there
// was any; false as well when /sys/block cannot be read whole, which proves nothing.
bool forget_pulled_disks(disk_sets* sets);

// The second half of that alone: the disks whose name another one has by now.
bool forget_replaced_disks(disk_sets* sets);

// As forget_pulled_disks, for a moment at which a mount without its device was found: a disk that
// is about to leave, its nodes gone and itself still listed, gets a second for it.
bool forget_leaving_disks(disk_sets* sets);

// remove_root_part of a disk that is known to have left. 0, 1 when there is none.
int remove_pulled_disk(disk_sets* sets, const char* root_dev);

// True when a message about the device's removal may mean a disk that left lately, and not the one
// that has its name now. Notes a disk that leaves with this message.
[[nodiscard]] bool may_mean_former_disk(const disk_sets* sets, const char* dev_name);

// Forgets which disks have left. For tests.
void pulled_reset();
