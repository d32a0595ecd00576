#include "disk/disk_sets.h"

#include <cstring>

#include "log/log.h"
#include "util/fs_code.h"
#include "util/text.h"

namespace {

void place_entry(disk_entry* place, const disk_entry& entry)
{
    *place = entry;
    if (place->in_use == 1) {
        disk_obj_set_ref_root(&place->disk, &place->disk.root);
    }
}

void swap_entries(disk_entry* a, disk_entry* b)
{
    const disk_entry kept = *a;
    place_entry(a, *b);
    place_entry(b, kept);
}

}  // namespace

int disk_sets_init(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    memset(sets, 0, sizeof(*sets));
    return 0;
}

int disk_sets_free(disk_sets* sets)
{
    return disk_sets_init(sets);
}

disk_entry* disk_sets_get_free_entry(disk_sets* sets)
{
    if (sets == nullptr) {
        return nullptr;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 0) {
            entry.in_use = 1;
            return &entry;
        }
    }
    log_warn("disk sets is full\n");
    return nullptr;
}

disk_entry* disk_sets_find_disk(disk_sets* sets, const char* root_dev)
{
    if (sets == nullptr) {
        return nullptr;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1 &&
            str_equal_nullsafe(entry.disk.root.dev_name, root_dev) == MATCHES) {
            log_info("get disk, root name = %s\n", root_dev);
            disk_obj_dump(&entry.disk);
            return &entry;
        }
    }
    return nullptr;
}

part_info* disk_sets_find_part(disk_sets* sets, const char* dev_name)
{
    if (sets == nullptr) {
        return nullptr;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 0) {
            continue;
        }
        part_info* part = disk_obj_get_part(&entry.disk, dev_name);
        if (part != nullptr) {
            return part;
        }
    }
    return nullptr;
}

void disk_entry_clear(disk_entry* entry)
{
    memset(entry, 0, sizeof(*entry));
}

int disk_sets_count(const disk_sets* sets)
{
    if (sets == nullptr) {
        return 0;
    }
    int count = 0;
    for (const disk_entry& entry : sets->entries) {
        count += entry.in_use;
    }
    return count;
}

int disk_sets_refresh_sizes(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1) {
            disk_obj_refresh_sizes(&entry.disk);
        }
    }
    return 0;
}

int disk_sets_drop_small_parts(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1) {
            disk_obj_drop_small_parts(&entry.disk);
        }
    }
    return 0;
}

void disk_sets_dump(const disk_sets* sets)
{
    if (sets == nullptr) {
        return;
    }
    for (const disk_entry& entry : sets->entries) {
        if (entry.in_use == 1) {
            disk_obj_dump(&entry.disk);
        }
    }
}

int disk_sets_sort_by_size(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    for (int i = 0; i < MAX_DISKS - 1; ++i) {
        for (int j = i + 1; j < MAX_DISKS; ++j) {
            const uint64_t largest = sets->entries[i].disk.root.total_len;
            if (sets->entries[j].disk.root.total_len > largest) {
                swap_entries(&sets->entries[i], &sets->entries[j]);
            }
        }
    }
    return 0;
}

int disk_sets_clear_empty(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    log_warn("clear empty disk\n");
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 0) {
            continue;
        }
        const disk_obj* disk = &entry.disk;
        if (disk_obj_count_parts(disk) < 1 && disk->root.fs_type == FS_NONE) {
            log_info("clear dev = %s\n", disk->root.dev_name);
            disk_entry_clear(&entry);
        }
    }
    return 0;
}
