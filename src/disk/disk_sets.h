// The inventory: a fixed table of disks. Adding claims a free entry, removing zeroes it; nothing is
// allocated. Results are 0 for success and 1 for failure unless a line says otherwise; a null table
// gives 1.
#pragma once

#include <cstdint>

#include "disk/disk_obj.h"

constexpr int MAX_DISKS = 16;

// A place for one disk; all zero bytes when free.
struct disk_entry {
    disk_obj disk;
    int32_t in_use;
};

// Device names are unique across the table.
struct disk_sets {
    disk_entry entries[MAX_DISKS];
    int32_t sorted_once;  // 1 from the first mount pass on: disks are numbered as they are added
};

int disk_sets_init(disk_sets* sets);
int disk_sets_free(disk_sets* sets);

// Claims the first free entry; null when all are taken.
disk_entry* disk_sets_get_free_entry(disk_sets* sets);

// The entry whose root has that device name, null when none. Dumps the disk it finds.
disk_entry* disk_sets_find_disk(disk_sets* sets, const char* root_dev);

// The root or slot of that device name on any disk, null when none.
part_info* disk_sets_find_part(disk_sets* sets, const char* dev_name);

// Zeroes an entry.
void disk_entry_clear(disk_entry* entry);

// Number of entries in use.
int disk_sets_count(const disk_sets* sets);

// The operations of disk_obj on every entry in use.
int disk_sets_refresh_sizes(disk_sets* sets);
int disk_sets_drop_small_parts(disk_sets* sets);
void disk_sets_dump(const disk_sets* sets);

// Exchange sort by the roots' sizes, largest first, free entries last; every ref_root follows.
int disk_sets_sort_by_size(disk_sets* sets);

// Frees the entries of disks that hold neither a valid partition nor a filesystem of their own. A
// disk that waits for its first mount pass has no valid partition either: whoever removes another
// one sees to it that it comes back (disk/waiting.h).
int disk_sets_clear_empty(disk_sets* sets);
