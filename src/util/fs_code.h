// The filesystems: one row for each type code. A partition's record keeps the code.
#pragma once

#include <cstdint>
#include <iterator>

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

// What the daemon knows of one code. A text that a filesystem does without is NO_TEXT.
struct filesystem {
    fs_code code;
    const char* name;        // on display: log lines and the status file print it as it stands
    const char* blkid_type;  // blkid's TYPE: its first four characters, or all of a shorter one
    const char* mount;       // the command to mount it: device node, directory
    const char* repair;      // the command to repair it: device node
};

inline constexpr const char* NO_TEXT = nullptr;

// A row stands at the place that its code counts. FAT and HFS+ know no owners of ours: their files
// go to the user that the file services run as. HFS+ is taken from its superblock alone, which
// tells a journal; blkid does not.
inline constexpr filesystem FILESYSTEMS[] = {
    {FS_NONE, "ERR FS", NO_TEXT, NO_TEXT, NO_TEXT},
    {FS_ERR, "ERR FS", NO_TEXT, NO_TEXT, NO_TEXT},
    {FS_MBR, "MBR", NO_TEXT, NO_TEXT, NO_TEXT},
    {FS_EXT2, "EXT2", "ext2", "mount -t ext2 -o rw,defaults %s %s", "fsck.ext2 -a %s"},
    {FS_EXT3, "EXT3", "ext3", "mount -t ext3 -o rw,defaults %s %s", "fsck.ext3 -a %s"},
    {FS_FAT, "FAT", "vfat", "mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 %s %s",
     "fsck.fat -a %s"},
    {FS_HFSPLUS, "HFSPLUS", NO_TEXT, "mount -t hfsplus -o rw,defaults,uid=1000,gid=1000 %s %s",
     NO_TEXT},
    {FS_EFI, "EFI", NO_TEXT, NO_TEXT, NO_TEXT},
    {FS_NTFS, "NTFS", "ntfs", "mount.ntfs-3g -o noatime,big_writes,async,force %s %s",
     "ntfsfix %s"},
    {FS_EXTENDED, "EXTENDED", NO_TEXT, NO_TEXT, NO_TEXT},
    {FS_EXFAT, "EXFAT", "exfa", "mount -t exfat %s %s", "fsck.exfat %s"},
    {FS_EXT4, "EXT4", "ext4", "mount -t ext4 -o rw,defaults %s %s", "fsck.ext4 -a %s"},
};

constexpr int32_t FS_CODE_COUNT = std::size(FILESYSTEMS);

// The row of a code; that of FS_NONE for a number that is no code.
[[nodiscard]] const filesystem& filesystem_of(fs_code code);
