// The record of one partition, or of a whole disk.
#pragma once

#include <cstddef>
#include <cstdint>

#include "util/paths.h"

// Text sizes, terminating zero included.
constexpr size_t PART_UID_SIZE = 128;
constexpr size_t PART_DEV_NAME_SIZE = 16;
constexpr size_t PART_DISK_NAME_SIZE = MOUNT_NAME_SIZE;
constexpr size_t PART_LABEL_SIZE = 128;
constexpr size_t PART_MOUNT_PATH_SIZE = 128;

constexpr int MIB_SHIFT = 20;  // bytes to MiB

struct part_info {
    char uid[PART_UID_SIZE];                // filesystem UUID, else partition UUID; may be empty
    char dev_name[PART_DEV_NAME_SIZE];      // kernel name without "/dev/"
    char disk_name[PART_DISK_NAME_SIZE];    // mount directory name, "disk%d_part%d"
    char label[PART_LABEL_SIZE];            // volume label, or dev_name
    char mount_path[PART_MOUNT_PATH_SIZE];  // empty until a mount was planned
    uint64_t total_len;                     // MiB
    uint64_t free_size;                     // MiB, with the blocks reserved for the superuser
    uint64_t used_len;                      // never filled, printed by the dump
    int32_t is_root_part;                   // 1 on the record of a whole disk
    uint64_t sector_number;                 // the kernel's "size" value
    uint64_t sector_size;                   // bytes, the disk's hardware sector size
    part_info* ref_root;                    // the owning disk's root record; a root's is itself
    int32_t fs_type;                        // an fs_code
    int32_t mount_point_num;                // disk number on a root record, else part number
    int32_t mount_status;                   // 1 when known to be mounted
};

// Fills fs_type, uid and, on a partition, label from the device. Always 0.
int part_info_fill(part_info* part);

// Sets total_len from sector_number and sector_size.
void part_info_set_length(part_info* part);

// Sets free_size from the mounted filesystem: 0 without a mount path or when it cannot be asked.
void part_info_refresh_free(part_info* part);

// True when the record may be counted and published: it has both names and a size, and no more free
// space than size.
bool part_info_is_valid(const part_info* part);

void part_info_dump(const part_info* part);
