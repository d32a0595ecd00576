#include "disk/part_info.h"

#include <cstring>

#include "fs/fs_type.h"
#include "log/log.h"
#include "util/block_dev.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr int FAT_LABEL_DASHES = 3;
constexpr char RULE[] = "=======================\n";
constexpr char DUMP_RULE[] = "================================\n";

unsigned long long printable(uint64_t number)
{
    return number;
}

void fill_uid(part_info* part)
{
    blkid_get_value(part->dev_name, "UUID=", part->uid);
    if (part->uid[0] == '\0') {
        blkid_get_value(part->dev_name, "PARTUUID=", part->uid);
    }
}

// Some FAT sticks come from the factory with a serial number for a label; nobody knows theirs.
bool is_factory_label(const part_info* part)
{
    return part->fs_type == FS_FAT && str_count_char_at_least(part->label, FAT_LABEL_DASHES) == YES;
}

void fill_label(part_info* part)
{
    blkid_get_value(part->dev_name, "LABEL=", part->label);
    if (strlen(part->label) <= 1 || is_factory_label(part)) {
        text_copy(part->label, part->dev_name);
        return;
    }
    // blkid's value is cut at a space; the script's is not.
    text_clear(part->label);
    if (script_get_label(part->dev_name, part->label) != 0) {
        text_clear(part->label);
        blkid_get_label(part->dev_name, part->label);
    }
    if (part->label[0] == '\0') {
        text_copy(part->label, part->dev_name);
    }
}

void fill_partition(part_info* part, const char* dev_path)
{
    part->fs_type = fs_detect_type(dev_path);
    if (part->fs_type == FS_EXTENDED) {
        log_info("%s", RULE);
        log_err("dev = %s, get err fs type = %s\n", dev_path, fs_type_name(part->fs_type));
        log_info("%s", RULE);
    }
    fill_label(part);
    fill_uid(part);
}

// A whole disk is asked through blkid alone: its first sector looks like a filesystem's when it
// holds a partition table.
void fill_whole_disk(part_info* part, const char* dev_path)
{
    part->fs_type = fs_type_from_blkid(dev_path);
    log_info("dev %s fs = %s\n", dev_path, fs_type_name(part->fs_type));
    fill_uid(part);
}

}  // namespace

int part_info_fill(part_info* part)
{
    if (part == nullptr) {
        return 1;
    }
    char dev_path[PATH_SIZE];
    path_dev_node(dev_path, part->dev_name);
    if (part->is_root_part == 1) {
        fill_whole_disk(part, dev_path);
    } else {
        fill_partition(part, dev_path);
    }
    return 0;
}

void part_info_set_length(part_info* part)
{
    // The hardware sector is the unit, though the kernel counts in 512 bytes: "Sizes on disks whose
    // hardware sector is not 512 bytes" in docs/limits.md.
    part->total_len = (part->sector_number * part->sector_size) >> MIB_SHIFT;
}

void part_info_refresh_free(part_info* part)
{
    uint64_t free_bytes = 0;
    const bool known =
        part->mount_path[0] != '\0' && path_get_space(part->mount_path, nullptr, &free_bytes) == 0;
    part->free_size = known ? free_bytes >> MIB_SHIFT : 0;
}

bool part_info_is_valid(const part_info* part)
{
    return part != nullptr && part->dev_name[0] != '\0' && part->disk_name[0] != '\0' &&
           part->total_len != 0 && part->free_size <= part->total_len;
}

void part_info_dump(const part_info* part)
{
    if (part == nullptr) {
        return;
    }
    log_info("%s", DUMP_RULE);
    log_info("uid = %s\n", part->uid);
    log_info("dev name = %s\n", part->dev_name);
    if (part->ref_root != nullptr) {
        log_info("ref root dev name = %s\n", part->ref_root->dev_name);
    }
    log_info("disk name = %s\n", part->disk_name);
    log_info("label name = %s\n", part->label);
    log_info("total len = %llu\n", printable(part->total_len));
    log_info("free size = %llu\n", printable(part->free_size));
    log_info("used len = %llu\n", printable(part->used_len));
    log_info("is root part = %d\n", part->is_root_part);
    log_info("sector number = %llu\n", printable(part->sector_number));
    log_info("sector size = %llu\n", printable(part->sector_size));
    log_info("fs type = %s\n", fs_type_name(part->fs_type));
    log_info("mount path = %s\n", part->mount_path);
    log_info("mount point num = %d\n", part->mount_point_num);
    log_info("mount status = %d\n", part->mount_status);
    log_info("%s", DUMP_RULE);
}
