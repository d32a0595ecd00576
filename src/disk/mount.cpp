#include "disk/mount.h"

#include "disk/disk_db.h"
#include "disk/mount_point.h"
#include "disk/mount_table.h"
#include "disk/pulled.h"
#include "fs/fs_type.h"
#include "log/log.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/mount_cmd.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/text.h"
#include "util/waits.h"

namespace {

// Forgets the disks that have left; null to believe the table.
using forget_operation = bool (*)(disk_sets* sets);

constexpr int32_t ROOT_PART_NUMBER = 1;

// A look at once waits for nothing and is no try.
static_assert(WAITS.mount.size() == MOUNT_WAIT_TRIES + (WAITS.mount[0] == 0 ? 1 : 0));

// Proposes the directory that the part's numbers stand for.
void plan_mount_path(part_info* part)
{
    const int32_t disk_number = part->ref_root != nullptr ? part->ref_root->mount_point_num : 0;
    const int32_t part_number = part->is_root_part == 1 ? ROOT_PART_NUMBER : part->mount_point_num;
    path_mount_name(part->disk_name, disk_number, part_number);
    path_mount_dir(part->mount_path, part->disk_name);
    log_info("mout path = %s\n", part->mount_path);
}

void make_mount_dir(const char* mount_path)
{
    dir_make(mount_path);
    char command[COMMAND_SIZE];
    if (command_format(command, "chmod a+wr %s", {mount_path})) {
        exec_cmd(command, 1);
    }
}

// False when there is no such command and nothing to wait for.
bool run_mount(const char* format, const char* dev_path, const char* mount_path)
{
    char command[COMMAND_SIZE];
    if (!command_format(command, format, {dev_path, mount_path})) {
        return false;
    }
    exec_cmd(command, 1);
    return true;
}

// A userspace filesystem takes its time to appear in the mount table.
bool wait_until_mounted(const char* dev_path)
{
    for (const int milliseconds : WAITS.mount) {
        pause_milliseconds(milliseconds);
        if (is_dev_mounted(dev_path) == YES) {
            return true;
        }
    }
    return false;
}

bool is_to_be_mounted(const part_info* part)
{
    return part->mount_status == 0 && fs_mount_cmd_format(part->fs_type) != nullptr;
}

bool has_part_to_mount(const disk_obj* disk)
{
    if (disk->root.fs_type != FS_NONE && is_to_be_mounted(&disk->root)) {
        return true;
    }
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && is_to_be_mounted(&slot.part)) {
            return true;
        }
    }
    return false;
}

void fill_record(disk_db_record* record, const part_info* part)
{
    text_copy(record->uid, part->uid);
    text_copy(record->dev_name, part->dev_name);
    text_copy(record->disk_name, part->disk_name);
    text_copy(record->mount_path, part->mount_path);
    record->mountd = 1;
}

void store_new_row(const part_info* part)
{
    disk_db_record record{};
    fill_record(&record, part);
    disk_db_add(&record);
}

// Another device sits in the remembered directory, or no directory of ours is remembered: the part
// keeps its new one.
void overwrite_row(disk_db_record* record, const part_info* part)
{
    log_info("=== ===> update uid = %s, mount = %s\n", part->uid, part->mount_path);
    text_copy(record->dev_name, part->dev_name);
    text_copy(record->disk_name, part->disk_name);
    text_copy(record->mount_path, part->mount_path);
    record->mountd = 1;
    disk_db_update_all(record);
}

void take_remembered_path(part_info* part, disk_db_record* record)
{
    if (str_equal_nullsafe(part->mount_path, record->mount_path) != MATCHES) {
        log_info("===> update mount path %s --> %s\n", part->mount_path, record->mount_path);
        text_copy(part->mount_path, record->mount_path);
    }
    if (str_equal_nullsafe(part->disk_name, record->disk_name) != MATCHES) {
        log_info("===> update disk name %s --> %s\n", part->disk_name, record->disk_name);
        text_copy(part->disk_name, record->disk_name);
    }
    record->mountd = 1;
    disk_db_set_mountd(record);
}

void mount_disk(disk_obj* disk)
{
    number_sub_parts(disk);
    mount_root_part(disk);
    mount_sub_parts(disk);
}

int mount_each(disk_sets* sets, forget_operation forget)
{
    if (sets == nullptr) {
        return 1;
    }
    log_info("*** *** *** mount path\n");
    for (disk_entry& entry : sets->entries) {
        // The disk before may have been waited for long enough for others to leave. A directory
        // that a pulled disk still occupies would look taken to the same disk under another name.
        if (forget != nullptr && entry.in_use == 1 && has_part_to_mount(&entry.disk)) {
            forget(sets);
        }
        if (entry.in_use == 1) {
            mount_disk(&entry.disk);
        }
    }
    return 0;
}

int run_pass(disk_sets* sets, forget_operation forget)
{
    if (sets == nullptr) {
        log_err("err!\n");
        return 1;
    }
    disk_sets_drop_small_parts(sets);
    if (sets->sorted_once == 0) {
        sets->sorted_once = 1;
        disk_sets_sort_by_size(sets);
        set_all_mount_point_num(sets);
    }
    mount_each(sets, forget);
    disk_sets_refresh_sizes(sets);
    return 0;
}

}  // namespace

int mount_all(disk_sets* sets)
{
    return run_pass(sets, nullptr);
}

int mount_all_present(disk_sets* sets)
{
    return run_pass(sets, forget_pulled_disks);
}

int mount_disk_sets(disk_sets* sets)
{
    return mount_each(sets, nullptr);
}

int mount_root_part(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    log_info("*** *** *** mount root path\n");
    if (disk->root.fs_type == FS_NONE) {
        log_warn("root path fs type err\n");
        return 0;
    }
    log_info("=== ===> mount root part, dev name = %s\n", disk->root.dev_name);
    mount_part(&disk->root);
    return 0;
}

int mount_sub_parts(disk_obj* disk)
{
    if (disk == nullptr) {
        return 1;
    }
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        part_slot* slot = &disk->parts[i];
        if (slot->in_use == 1) {
            log_info("=== ===> mount sub part, i = %d, name = %s\n", i, slot->part.dev_name);
            mount_part(&slot->part);
        }
    }
    return 0;
}

void mount_part(part_info* part)
{
    if (part == nullptr) {
        return;
    }
    log_info("*** *** *** mount part, status = %d\n", part->mount_status);
    if (part->mount_status == 1) {
        log_warn("already mount %s ==> %s\n", part->dev_name, part->mount_path);
        return;
    }
    char dev_path[DEV_PATH_SIZE];
    path_dev_node(dev_path, part->dev_name);
    // Without a name it is not published: what somebody else has mounted is not ours to offer. See
    // "A device that is mounted already" in docs/limits.md.
    text_clear(part->disk_name);
    if (is_dev_mounted(dev_path) == YES) {
        log_warn("already mounted, dev = %s\n", dev_path);
        return;
    }
    plan_mount_path(part);
    // The row is written before anybody knows whether the mount will come about, also for a type
    // that is never mounted: "A failed mount is remembered like a good one" in docs/limits.md.
    sync_part_with_db(part);

    const char* format = fs_mount_cmd_format(part->fs_type);
    if (format == nullptr) {
        log_err("err fs type = %s\n", fs_type_name(part->fs_type));
        return;
    }
    log_info("mout path = %s\n", part->mount_path);
    make_mount_dir(part->mount_path);
    if (!run_mount(format, dev_path, part->mount_path) || !wait_until_mounted(dev_path)) {
        log_warn("=== === === mount ERROR, %s ==> %s\n", dev_path, part->mount_path);
        return;
    }
    log_info("mount OK, %s ==> %s\n", dev_path, part->mount_path);
    part->mount_status = 1;
}

void sync_part_with_db(part_info* part)
{
    if (part == nullptr) {
        return;
    }
    disk_db_record record{};
    const int ret = disk_db_get(part->uid, &record);
    log_info("=== === ===> db ret = %d\n", ret);
    if (ret != 0) {
        store_new_row(part);
        return;
    }
    if (!mount_path_is_usable(record.mount_path)) {
        log_warn("remembered path err, uid = %s, mount = %s\n", record.uid, record.mount_path);
        overwrite_row(&record, part);
        return;
    }
    if (is_path_mounted(record.mount_path) == YES) {
        overwrite_row(&record, part);
        return;
    }
    take_remembered_path(part, &record);
}
