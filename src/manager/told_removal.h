// Removals that a message asks for. The file services are stopped before and started after each,
// for an unknown name too; what goes wrong is logged where it happens.
#pragma once

#include "disk/disk_sets.h"

// Unmounts and forgets a partition or whole disk. A message of the hotplug script tells of what has
// happened, and may be late: when it may mean a disk that left lately, what is removed is taken in
// again by the next rescan. Whoever else asks for a removal gets it.
void remove_told_dev(disk_sets* sets, const char* dev_name, bool from_hotplug);

// Unmounts and forgets the partition of that directory name.
void remove_told_dir(disk_sets* sets, const char* dir_name);

// Unmounts and forgets every disk.
void remove_told_all(disk_sets* sets);
