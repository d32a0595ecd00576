#include "disk/mount_point.h"

#include "disk/mount_table.h"
#include "log/log.h"
#include "util/file.h"
#include "util/fs_code.h"
#include "util/mount_cmd.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr int32_t NUMBER_CANDIDATES = 16;

static_assert(PART_MOUNT_PATH_SIZE == MOUNT_PATH_SIZE, "a listed path fits the record");

bool number_is_mounted(const mount_table* table, int32_t number)
{
    for (int i = 0; i < table->num; ++i) {
        if (table->entries[i].main == number) {
            return true;
        }
    }
    return false;
}

// The first number from candidate on under which nothing is mounted; gives up after so many.
int32_t first_unmounted_number(const mount_table* table, int32_t candidate)
{
    const int32_t limit = candidate + NUMBER_CANDIDATES;
    int32_t number = candidate;
    while (number < limit && number_is_mounted(table, number)) {
        ++number;
    }
    return number;
}

void check_root_part(part_info* root)
{
    if (check_part_mounted(root) == YES) {
        root->mount_status = 1;
        log_warn("root part already mounted, dev = %s\n", root->dev_name);
    } else {
        log_warn("root part Not mounted, dev = %s\n", root->dev_name);
    }
}

void check_sub_parts(disk_obj* disk)
{
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        part_slot* slot = &disk->parts[i];
        if (slot->in_use == 0) {
            continue;
        }
        log_info("=== ===> check mount sub part, i = %d, name = %s\n", i, slot->part.dev_name);
        if (check_part_mounted(&slot->part) == YES) {
            log_info("===> is already mountd\n");
            slot->part.mount_status = 1;
        } else {
            log_info("===> Not mountd\n");
        }
    }
}

// A snapshot under the heading that both consistency checks print. False when there is nothing to
// check.
bool read_for_check(mount_table* table)
{
    if (read_mount_table(table) != 0) {
        return false;
    }
    log_info("=== check mount path err\n");
    log_info("mount dev num = %d\n", table->num);
    return table->num > 0;
}

void log_mount(const mount_entry* entry)
{
    log_info("%s ===> %s\n", entry->dev, entry->path);
}

}  // namespace

int32_t get_mount_point_num(const disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    // A table that cannot be read counts as empty: the disk needs a number now, and mount_part
    // looks again before it mounts.
    mount_table table;
    read_mount_table(&table);

    int32_t expected = 1;
    int32_t max = 0;
    for (const disk_entry& entry : sets->entries) {
        if (entry.in_use == 0) {
            continue;
        }
        const int32_t number = entry.disk.root.mount_point_num;
        if (number > max) {
            max = number;
        }
        // The entry that is being added carries 0 and ends the walk at the latest.
        if (number != expected) {
            break;
        }
        ++expected;
    }
    const int32_t candidate = expected == max ? max + 1 : expected;
    const int32_t number = first_unmounted_number(&table, candidate);
    log_info("max = %d, point num = %d\n", max, number);
    return number;
}

int set_all_mount_point_num(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    // One that cannot be read counts as empty, as above.
    mount_table table;
    read_mount_table(&table);

    int32_t number = 0;
    for (int i = 0; i < MAX_DISKS; ++i) {
        if (sets->entries[i].in_use == 0) {
            continue;
        }
        disk_obj* disk = &sets->entries[i].disk;
        number = first_unmounted_number(&table, number + 1);
        disk->root.mount_point_num = number;
        log_info("=== ===> set[%d] mount point num = %d\n", i, number);
        number_sub_parts(disk);
    }
    return 0;
}

void number_sub_parts(disk_obj* disk)
{
    if (disk == nullptr) {
        return;
    }
    const int32_t first = disk->root.fs_type != FS_NONE ? 2 : 1;
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        if (disk->parts[i].in_use == 1) {
            disk->parts[i].part.mount_point_num = first + i;
        }
    }
}

int check_part_mounted(part_info* part)
{
    if (part == nullptr) {
        return YES;
    }
    char dev_path[PATH_SIZE];
    path_dev_node(dev_path, part->dev_name);
    if (get_dev_mount_path(dev_path, part->mount_path) != YES) {
        return NO;
    }
    log_warn("already mounted, dev = %s\n", dev_path);
    mount_path_to_name(part->mount_path, part->disk_name, sizeof(part->disk_name));
    log_info("get disk name = %s\n", part->disk_name);
    return YES;
}

int check_disks_mounted(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("=== === ===> check disk is alread mountd\n");
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1) {
            check_root_part(&entry.disk.root);
            check_sub_parts(&entry.disk);
        }
    }
    return 0;
}

int check_mount_path_dup()
{
    mount_table table;
    if (!read_for_check(&table)) {
        return NO;
    }
    for (int i = 0; i < table.num; ++i) {
        for (int j = 0; j < table.num; ++j) {
            const mount_entry* a = &table.entries[i];
            const mount_entry* b = &table.entries[j];
            if (i == j || str_equal(a->path, b->path) != MATCHES) {
                continue;
            }
            log_info("mount path err:\n");
            log_mount(a);
            log_mount(b);
            return YES;
        }
    }
    return NO;
}

int check_mount_dev_exist()
{
    mount_table table;
    if (!read_for_check(&table)) {
        return NO;
    }
    for (int i = 0; i < table.num; ++i) {
        const char* dev_path = table.entries[i].dev;
        log_info("check mount dev err, dev[%d] = %s\n", i, dev_path);
        // One that cannot be looked at must not cost the database.
        if (path_is_gone(dev_path)) {
            log_warn("dev not find, dev = %s\n", dev_path);
            return YES;
        }
    }
    return NO;
}

void umount_all_force()
{
    // What cannot be listed stays mounted: its device then counts as mounted already.
    mount_table table;
    read_mount_table(&table);
    for (int i = 0; i < table.num; ++i) {
        fs_umount_force(table.entries[i].dev);
        fs_umount_force(table.entries[i].path);
    }
}
