// The filesystem type codes: what a partition carries, kept in its record.
#pragma once

#include <cstdint>

enum fs_code : int32_t {
    FS_NONE = 0,  // nothing recognised, or the device could not be opened
    FS_ERR = 1,   // reserved, never detected
    FS_MBR = 2,   // only a DOS partition table
    FS_EXT2 = 3,
    FS_EXT3 = 4,
    FS_FAT = 5,      // FAT12, FAT16 and FAT32
    FS_HFSPLUS = 6,  // without a journal
    FS_EFI = 7,      // a GPT header
    FS_NTFS = 8,
    FS_EXTENDED = 9,  // the container of a DOS extended partition
    FS_EXFAT = 10,
    FS_EXT4 = 11,
};

constexpr int32_t FS_CODE_COUNT = 12;
