#include "disk/removal.h"

#include "disk/disk_db.h"
#include "disk/mount_table.h"
#include "log/log.h"
#include "util/block_dev.h"
#include "util/file.h"
#include "util/mount_cmd.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/text.h"
#include "util/waits.h"

namespace {

// True when the device left the mount table after an umount command. False when it is time for the
// next one, which begins with a look of its own.
bool wait_until_gone(const char* dev_path)
{
    char mounted_at[MOUNT_PATH_SIZE]{};
    for (const int milliseconds : WAITS.umount.first(WAITS.umount.size() - 1)) {
        pause_milliseconds(milliseconds);
        if (get_dev_mount_path(dev_path, mounted_at) != YES) {
            return true;
        }
    }
    pause_milliseconds(WAITS.umount.back());
    return false;
}

void umount_until_gone(const char* dev_path)
{
    char mounted_at[MOUNT_PATH_SIZE]{};
    for (int i = 0; i < UMOUNT_TRIES; ++i) {
        if (get_dev_mount_path(dev_path, mounted_at) != YES) {
            return;
        }
        fs_umount(mounted_at);
        if (wait_until_gone(dev_path)) {
            return;
        }
    }
}

void note_unmounted(const char* uid)
{
    disk_db_record record{};
    text_copy(record.uid, uid);
    disk_db_set_mountd(&record);
}

// The disk that holds a partition record.
disk_obj* owner_of(disk_sets* sets, const part_info* part)
{
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1 && part->ref_root == &entry.disk.root) {
            return &entry.disk;
        }
    }
    return nullptr;
}

}  // namespace

void umount_part(const part_info* part)
{
    if (part == nullptr) {
        return;
    }
    log_warn("==> umount dev = %s\n", part->dev_name);
    char dev_path[DEV_PATH_SIZE];
    path_dev_node(dev_path, part->dev_name);
    if (part->dev_name[0] != '\0') {
        fs_umount(dev_path);
    }
    if (part->mount_path[0] != '\0') {
        fs_umount(part->mount_path);
    }
    umount_until_gone(dev_path);
    note_unmounted(part->uid);
}

int umount_disk_parts(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    log_warn("remove disk, root dev = %s\n", disk->root.dev_name);
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            umount_part(&slot.part);
        }
    }
    log_warn("=== === ===> remove root path:\n");
    umount_part(&disk->root);
    return 0;
}

int remove_root_part(disk_sets* sets, const char* root_dev)
{
    disk_entry* entry = disk_sets_find_disk(sets, root_dev);
    if (entry == nullptr) {
        log_warn("remove root part[%s] err!\n", root_dev);
        return 1;
    }
    umount_disk_parts(&entry->disk);
    disk_entry_clear(entry);
    return 0;
}

int remove_sub_part(disk_sets* sets, const char* dev_name)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("remove dev name = %s\n", dev_name);
    part_info* part = disk_sets_find_part(sets, dev_name);
    if (part == nullptr) {
        log_warn("want remove dev(%s) not exist!\n", dev_name);
        return 0;
    }
    log_info("want to remove:\n");
    part_info_dump(part);
    umount_part(part);
    disk_obj_clear_part(owner_of(sets, part), part);
    return 0;
}

int remove_dev(disk_sets* sets, const char* dev_name)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("remove dev name = %s\n", dev_name);
    if (disk_sets_find_part(sets, dev_name) == nullptr) {
        log_warn("want remove dev(%s) not exist!\n", dev_name);
        return 0;
    }
    // A disk that the kernel no longer lists goes the partition's way, which leaves its entry: "A
    // pulled disk stays until its partitions are told" in docs/limits.md.
    if (sys_block_has_dev(dev_name) != MATCHES) {
        log_warn("remove sub dev = %s\n", dev_name);
        remove_sub_part(sets, dev_name);
    } else {
        log_warn("remove root dev = %s\n", dev_name);
        remove_root_part(sets, dev_name);
    }
    disk_sets_clear_empty(sets);
    return 0;
}

int remove_disk(disk_sets* sets, const char* dir_name)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("remove disk name = %s\n", dir_name);
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 0) {
            continue;
        }
        part_info* part = disk_obj_find_part_by_disk_name(&entry.disk, dir_name);
        if (part != nullptr) {
            umount_part(part);
            disk_obj_clear_part(&entry.disk, part);
            disk_sets_clear_empty(sets);
            return 0;
        }
    }
    return 0;
}

int safe_remove_all(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    for (int walk = 0; walk < DIR_WALKS; ++walk) {
        dir_stream dir(SYS_BLOCK);
        if (dir.stream == nullptr) {
            log_err("open dir err, dir = %s\n", SYS_BLOCK);
            return 1;
        }
        while (const char* name = dir.next_name()) {
            if (dev_name_is_disk(name) == MATCHES) {
                remove_dev(sets, name);
            }
        }
        if (!dir.failed) {
            return 0;
        }
    }
    return 1;
}
