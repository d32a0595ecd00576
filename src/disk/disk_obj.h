// One disk: the whole-disk record and its partition slots. Names are kernel device names. Results
// are 0 for success and 1 for failure unless a line says otherwise; a null disk gives 1.
#pragma once

#include <cstdint>

#include "disk/part_info.h"

constexpr int MAX_SUB_PARTS = 8;
constexpr uint64_t SMALL_PART_MAX_MIB = 999;  // partitions up to this size are ignored

// A place for one partition; all zero bytes when free.
struct part_slot {
    part_info part;
    int32_t in_use;
};

// ref_root of every in-use slot points to the root of the disk that holds it.
struct disk_obj {
    part_info root;                  // the whole disk
    part_slot parts[MAX_SUB_PARTS];  // its partitions
    int32_t sd_card;                 // 1 when it is the router's SD card
    uint64_t node_id;                // dev_node_id when it was taken in: which disk had the name
};

// Makes the root record of a disk and fills it from the device.
int disk_obj_set_root(disk_obj* disk, const char* dev_name);

// Puts a partition into the first free slot and fills it from the device; 1 when all are taken.
int disk_obj_add_sub_part(disk_obj* disk, const char* dev_name);

// The root or the in-use slot of that device name, null when none.
part_info* disk_obj_get_part(disk_obj* disk, const char* dev_name);

// The in-use slot of that directory name, null when none.
part_info* disk_obj_find_part_by_disk_name(disk_obj* disk, const char* dir_name);

// MATCHES when the root or a slot has that device name, NO_MATCH when none has.
int disk_obj_has_dev(const disk_obj* disk, const char* dev_name);

// The same, and the log is told nothing.
[[nodiscard]] bool disk_obj_holds(const disk_obj* disk, const char* dev_name);

// Frees the slot that has the part's device name.
int disk_obj_clear_part(disk_obj* disk, const part_info* part);

// Frees the slots of partitions of at most SMALL_PART_MAX_MIB.
int disk_obj_drop_small_parts(disk_obj* disk);

// Exchange sort by size, largest first, free slots last; not stable.
int disk_obj_sort_parts_by_size(disk_obj* disk);

// Valid partitions, and one more when the whole disk carries a filesystem.
int disk_obj_count_parts(const disk_obj* disk);

// Points the ref_root of the root and of every in-use slot to root.
int disk_obj_set_ref_root(disk_obj* disk, part_info* root);

// Reads the sizes of the root, unless known already, and of every in-use slot.
int disk_obj_read_sizes(disk_obj* disk);

// Reads the root's size unless known already, then the free space of the root (when it carries a
// filesystem) and of every in-use slot.
int disk_obj_refresh_sizes(disk_obj* disk);

void disk_obj_dump(const disk_obj* disk);
