#include "disk/discovery.h"

#include <unistd.h>

#include <cstring>

#include "disk/mount_point.h"
#include "disk/system_disk.h"
#include "fs/fs_type.h"
#include "log/log.h"
#include "util/blkid.h"
#include "util/block_dev.h"
#include "util/device.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/scratch.h"
#include "util/text.h"

namespace {

constexpr size_t ROOT_DEV_SIZE = 64;
constexpr size_t BLKID_TEXT_SIZE = 512 + 1;
constexpr size_t LINK_TARGET_SIZE = 256;
constexpr int SDCARD_POINT_SIZE = 16;

constexpr scratch_query CHECK_QUERY{SCRATCH_DEV_CHECK, SCRATCH_DELETED};

// The disk of the inventory that owns a partition, added when it is missing; null when there is
// none.
disk_obj* find_or_add_owner(disk_sets* sets, const char* root_dev)
{
    if (disk_sets_find_disk(sets, root_dev) == nullptr) {
        // An error by its level, and ordinary: a new disk's first message is often a partition's.
        log_err("not find disk obj, root dev name = %s\n", root_dev);
        if (disk_sets_add_disk(sets, root_dev) != 0) {
            log_err("err!\n");
            return nullptr;
        }
    }
    disk_entry* entry = disk_sets_find_disk(sets, root_dev);
    if (entry == nullptr) {
        log_err("Not find root part, dev = %s\n", root_dev);
        return nullptr;
    }
    return &entry->disk;
}

void log_root_fs(const disk_obj* disk)
{
    log_info("root part fs = %s\n", fs_type_name(disk->root.fs_type));
}

// True, which is logged, when the disk is none for users.
bool is_kept_out(const char* root_dev)
{
    if (!is_system_disk(root_dev)) {
        return false;
    }
    log_warn("router's own disk, dev = %s\n", root_dev);
    return true;
}

// True when the disk hangs on the router's SD card reader.
bool is_at_sdcard_point(const char* link_target)
{
    char point[SDCARD_POINT_SIZE + 1]{};
    if (device_get_sdcard_point(point, SDCARD_POINT_SIZE) != 0) {
        return false;
    }
    return point[0] != '\0' && strstr(link_target, point) != nullptr;
}

}  // namespace

int disk_sets_add_dev(disk_sets* sets, const char* dev_name)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("add dev name = %s\n", dev_name);
    if (dev_check_blkid(dev_name) != MATCHES) {
        return 0;
    }
    if (disk_sets_find_part(sets, dev_name) != nullptr) {
        // On every ordinary plug: adding a disk takes in its partitions, whose own messages follow.
        log_warn("=== ===> dev is already add! dev name = %s\n", dev_name);
        return 0;
    }
    if (sys_block_has_dev(dev_name) != MATCHES) {
        disk_sets_add_part(sets, dev_name);
    } else if (dev_name_is_disk(dev_name) == MATCHES && !is_kept_out(dev_name)) {
        disk_sets_add_disk(sets, dev_name);
    }
    return 0;
}

int disk_sets_add_disk(disk_sets* sets, const char* root_dev)
{
    disk_entry* entry = disk_sets_get_free_entry(sets);
    if (entry == nullptr) {
        return 1;
    }
    disk_obj* disk = &entry->disk;
    disk_obj_set_root(disk, root_dev);
    disk_obj_detect_sd_card(disk);
    disk_obj_scan_parts(disk);
    log_root_fs(disk);
    disk_obj_read_sizes(disk);
    log_root_fs(disk);
    disk_obj_drop_small_parts(disk);
    disk_obj_sort_parts_by_size(disk);
    log_root_fs(disk);

    // Before the first mount pass the disks wait to be sorted and numbered together.
    if (sets->sorted_once == 0) {
        return 0;
    }
    disk->root.mount_point_num = get_mount_point_num(sets);
    log_info("=== ===> set mount point num = %d\n", disk->root.mount_point_num);
    number_sub_parts(disk);
    return 0;
}

void disk_sets_add_part(disk_sets* sets, const char* dev_name)
{
    char root_dev[ROOT_DEV_SIZE]{};
    if (sys_block_find_parent(dev_name, root_dev, sizeof(root_dev)) != MATCHES) {
        log_err("not find dev name = %s\n", dev_name);
        return;
    }
    if (is_kept_out(root_dev)) {
        return;
    }
    disk_obj* disk = find_or_add_owner(sets, root_dev);
    // Adding the owner has scanned all its partitions, this one included as a rule.
    if (disk == nullptr || disk_obj_has_dev(disk, dev_name) == MATCHES) {
        return;
    }
    if (disk_obj_add_sub_part(disk, dev_name) == 0) {
        // A partition without a size would be dropped as small by the next mount pass. The slots
        // are not sorted: those that are mounted must keep their numbers.
        disk_obj_read_sizes(disk);
    }
}

int dev_check_blkid(const char* dev_name)
{
    if (dev_name == nullptr) {
        return 1;
    }
    char dev_path[PATH_SIZE];
    path_dev_node(dev_path, dev_name);
    char text[BLKID_TEXT_SIZE]{};
    const bool known =
        name_is_plain(dev_name) &&
        scratch_read(CHECK_QUERY, text, "blkid %s > %s", {dev_path, SCRATCH_DEV_CHECK}) &&
        blkid_knows(text, dev_path);
    log_info("buf = %s\n", text);
    log_info("dev = %s\n", dev_path);

    if (!known) {
        log_info("=== ===> dev err, dev = %s\n", dev_path);
        return 1;
    }
    log_info("=== ===> dev ok, dev = %s\n", dev_path);
    return 0;
}

void disk_obj_scan_parts(disk_obj* disk)
{
    if (disk == nullptr) {
        return;
    }
    char path[PATH_SIZE];
    path_sys_disk(path, disk->root.dev_name);
    log_info("check path = %s\n", path);
    for (int walk = 0; walk < DIR_WALKS; ++walk) {
        dir_stream dir(path);
        if (dir.stream == nullptr) {
            log_err("open dir err, dir = %s\n", SYS_BLOCK);
            return;
        }
        while (const char* name = dir.next_name()) {
            // An earlier walk that broke off may have taken the partition in.
            if (dev_name_is_disk(name) == MATCHES && !disk_obj_holds(disk, name)) {
                disk_obj_add_sub_part(disk, name);
            }
        }
        if (!dir.failed) {
            return;
        }
    }
}

void disk_obj_detect_sd_card(disk_obj* disk)
{
    if (disk == nullptr) {
        return;
    }
    if (text_has_prefix(disk->root.dev_name, "mmcblk")) {
        disk->sd_card = 1;
        return;
    }
    char path[PATH_SIZE];
    path_sys_disk(path, disk->root.dev_name);
    char target[LINK_TARGET_SIZE + 1]{};
    if (readlink(path, target, LINK_TARGET_SIZE) < 0) {
        text_clear(target);
    }
    log_info("read link path = %s\n", target);

    disk->sd_card = is_at_sdcard_point(target) ? 1 : 0;
    if (disk->sd_card == 1) {
        log_info("find sd card ok, dev = %s\n", path);
    }
}
