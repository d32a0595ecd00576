#include "disk/disk_obj.h"

#include <cstring>

#include "log/log.h"
#include "util/block_dev.h"
#include "util/fs_code.h"
#include "util/text.h"

namespace {

void read_root_size(part_info* root)
{
    if (root->sector_number != 0 && root->sector_size != 0) {
        return;
    }
    dev_get_sectors(root->dev_name, root->dev_name, &root->sector_number);
    dev_get_sector_size(root->dev_name, &root->sector_size);
    part_info_set_length(root);
}

void read_part_size(part_info* part, const part_info* root)
{
    part->sector_size = root->sector_size;
    if (part->sector_size == 0) {
        log_err("Not set sector size!\n");
        return;
    }
    dev_get_sectors(root->dev_name, part->dev_name, &part->sector_number);
    part_info_set_length(part);
    log_info("get size, dev = %s, len = %llu\n", part->dev_name,
             static_cast<unsigned long long>(part->total_len));
}

part_slot* first_free_slot(disk_obj* disk)
{
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 0) {
            return &slot;
        }
    }
    return nullptr;
}

void clear_slot(part_slot* slot)
{
    memset(slot, 0, sizeof(*slot));
}

void swap_slots(part_slot* a, part_slot* b)
{
    const part_slot kept = *a;
    *a = *b;
    *b = kept;
}

}  // namespace

int disk_obj_set_root(disk_obj* disk, const char* dev_name)
{
    if (disk == nullptr) {
        return 1;
    }
    disk->root.is_root_part = 1;
    disk->root.ref_root = &disk->root;
    text_copy(disk->root.dev_name, dev_name);
    // Before anything is read: when the disk is replaced meanwhile, what was read is the old one's.
    disk->node_id = dev_node_id(dev_name);
    part_info_fill(&disk->root);
    log_info("=== ===> set root part(%s), ref disk dev name = %s\n", disk->root.dev_name,
             disk->root.ref_root->dev_name);
    return 0;
}

int disk_obj_add_sub_part(disk_obj* disk, const char* dev_name)
{
    if (disk == nullptr) {
        return 1;
    }
    log_info("=== ===> add sub part ==> /dev/%s\n", dev_name);
    part_slot* slot = first_free_slot(disk);
    if (slot == nullptr) {
        log_warn("sub part full, root dev name = %s, sub dev = %s\n", disk->root.dev_name,
                 dev_name);
        return 1;
    }
    slot->part.ref_root = &disk->root;
    slot->in_use = 1;
    text_copy(slot->part.dev_name, dev_name);
    part_info_fill(&slot->part);
    log_info("=== ===> part dev name = %s, ref root dev = %s\n", slot->part.dev_name,
             slot->part.ref_root->dev_name);
    return 0;
}

part_info* disk_obj_get_part(disk_obj* disk, const char* dev_name)
{
    if (disk == nullptr) {
        return nullptr;
    }
    log_info("get part, dev name = %s\n", dev_name);
    if (str_equal_nullsafe(disk->root.dev_name, dev_name) == MATCHES) {
        return &disk->root;
    }
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && str_equal_nullsafe(slot.part.dev_name, dev_name) == MATCHES) {
            return &slot.part;
        }
    }
    return nullptr;
}

part_info* disk_obj_find_part_by_disk_name(disk_obj* disk, const char* dir_name)
{
    if (disk == nullptr) {
        return nullptr;
    }
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && str_equal_nullsafe(slot.part.disk_name, dir_name) == MATCHES) {
            return &slot.part;
        }
    }
    return nullptr;
}

int disk_obj_has_dev(const disk_obj* disk, const char* dev_name)
{
    if (disk == nullptr) {
        log_err("err!\n");
        return NO_MATCH;
    }
    log_info("check dev, name = %s\n", dev_name);
    log_info("root part dev = %s\n", disk->root.dev_name);
    if (str_equal_nullsafe(disk->root.dev_name, dev_name) == MATCHES) {
        log_warn("root dev already exist, name = %s\n", dev_name);
        return MATCHES;
    }
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && str_equal_nullsafe(slot.part.dev_name, dev_name) == MATCHES) {
            log_warn("dev already exist, name = %s\n", dev_name);
            return MATCHES;
        }
    }
    return NO_MATCH;
}

bool disk_obj_holds(const disk_obj* disk, const char* dev_name)
{
    if (disk == nullptr || dev_name == nullptr) {
        return false;
    }
    if (str_equal(disk->root.dev_name, dev_name) == MATCHES) {
        return true;
    }
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && str_equal(slot.part.dev_name, dev_name) == MATCHES) {
            return true;
        }
    }
    return false;
}

int disk_obj_clear_part(disk_obj* disk, const part_info* part)
{
    if (disk == nullptr || part == nullptr) {
        return 1;
    }
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 0) {
            continue;
        }
        log_info("want clear dev = %s, %s\n", slot.part.dev_name, part->dev_name);
        if (str_equal_nullsafe(slot.part.dev_name, part->dev_name) == MATCHES) {
            log_info("clear ok, find dev = %s\n", part->dev_name);
            clear_slot(&slot);
            return 0;
        }
    }
    log_warn("clear err, not find dev = %s\n", part->dev_name);
    return 1;
}

int disk_obj_drop_small_parts(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        part_slot* slot = &disk->parts[i];
        if (slot->in_use == 0 || slot->part.total_len > SMALL_PART_MAX_MIB) {
            continue;
        }
        log_info("=== Delete part[%d], dev name = %s\n", i, slot->part.dev_name);
        log_info("total len = %llu\n", static_cast<unsigned long long>(slot->part.total_len));
        clear_slot(slot);
    }
    return 0;
}

int disk_obj_sort_parts_by_size(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    log_info("sort by size, dev = %s\n", disk->root.dev_name);
    for (int i = 0; i < MAX_SUB_PARTS - 1; ++i) {
        for (int j = i + 1; j < MAX_SUB_PARTS; ++j) {
            if (disk->parts[j].part.total_len > disk->parts[i].part.total_len) {
                swap_slots(&disk->parts[i], &disk->parts[j]);
            }
        }
    }
    return 0;
}

int disk_obj_count_parts(const disk_obj* disk)
{
    if (disk == nullptr) {
        return 0;
    }
    int count = disk->root.fs_type != FS_NONE ? 1 : 0;
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && part_info_is_valid(&slot.part)) {
            ++count;
        }
    }
    return count;
}

int disk_obj_set_ref_root(disk_obj* disk, part_info* root)
{
    if (disk == nullptr) {
        return 1;
    }
    disk->root.ref_root = root;
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            slot.part.ref_root = root;
        }
    }
    return 0;
}

int disk_obj_read_sizes(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    read_root_size(&disk->root);
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            read_part_size(&slot.part, &disk->root);
        }
    }
    return 0;
}

int disk_obj_refresh_sizes(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    read_root_size(&disk->root);
    if (disk->root.fs_type != FS_NONE) {
        part_info_refresh_free(&disk->root);
    }
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            part_info_refresh_free(&slot.part);
        }
    }
    return 0;
}

void disk_obj_dump(const disk_obj* disk)
{
    if (disk == nullptr) {
        return;
    }
    log_info("disk obj:\n");
    part_info_dump(&disk->root);
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            part_info_dump(&slot.part);
        }
    }
}
