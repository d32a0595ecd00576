// The record of one partition, or of a whole disk: what it is, where it goes, whether it is there.
#pragma once

#include <cstddef>
#include <cstdint>

#include "util/fs_code.h"
#include "util/paths.h"

// Text sizes, terminating zero included.
constexpr size_t PART_UID_SIZE = 128;
constexpr size_t PART_DEV_NAME_SIZE = 16;
constexpr size_t PART_DISK_NAME_SIZE = MOUNT_NAME_SIZE;
constexpr size_t PART_LABEL_SIZE = 128;
constexpr size_t PART_MOUNT_PATH_SIZE = 128;

constexpr int MIB_SHIFT = 20;  // bytes to MiB

// Behind each field: what it stands for; who writes it, and when.
struct part_info {
    // Filesystem UUID, else partition UUID, may be empty; part_info_fill, once.
    char uid[PART_UID_SIZE];
    // Kernel device name; disk_obj_set_root or disk_obj_add_sub_part, when the record is claimed.
    char dev_name[PART_DEV_NAME_SIZE];
    // Directory name, "disk%d_part%d"; mount_part at each try, check_part_mounted for what it
    // finds mounted.
    char disk_name[PART_DISK_NAME_SIZE];
    // Volume label; part_info_fill, once. An empty one becomes dev_name, at publication at last.
    char label[PART_LABEL_SIZE];
    // Mount base and disk_name; written with disk_name. Empty until a mount was planned.
    char mount_path[PART_MOUNT_PATH_SIZE];
    // MiB; disk_obj_read_sizes when the disk is added, a root's again while it is not known.
    uint64_t total_len;
    // MiB, with the blocks reserved for the superuser; each refresh of sizes.
    uint64_t free_size;
    // Nobody writes it; the dump prints it.
    uint64_t used_len;
    // 1 on the record of a whole disk; disk_obj_set_root.
    int32_t is_root_part;
    // The kernel's "size" value, and the disk's hardware sector size in bytes; with total_len.
    uint64_t sector_number;
    uint64_t sector_size;
    // The owning disk's root record, a root's is itself; when the record is claimed, and
    // disk_obj_set_ref_root when the disk moves in the table.
    part_info* ref_root;
    // part_info_fill, once.
    fs_code fs_type;
    // Disk number on a root record: set_all_mount_point_num, or disk_sets_add_disk after it. Part
    // number on a partition: number_sub_parts, in each mount pass.
    int32_t mount_point_num;
    // 1 when known to be mounted; mount_part after a confirmed mount, check_disks_mounted.
    int32_t mount_status;
};

// Fills fs_type, uid and, on a partition, label from the device of dev_name. Always 0.
int part_info_fill(part_info* part);

// Sets total_len from sector_number and sector_size.
void part_info_set_length(part_info* part);

// Sets free_size from the mounted filesystem: 0 without a mount path or when it cannot be asked.
void part_info_refresh_free(part_info* part);

// True when the record may be counted and published: it has both names and a size, and no more free
// space than size.
bool part_info_is_valid(const part_info* part);

void part_info_dump(const part_info* part);
