#include "fs/fs_probe.h"

#include <unistd.h>

#include <cstring>
#include <iterator>

#include "log/log.h"

namespace {

constexpr int SECTOR_SIZE = 512;
constexpr int SUPERBLOCK_OFFSET = 1024;  // of ext and HFS+
constexpr int EXT_SUPERBLOCK_SIZE = 1024;

constexpr size_t OEM_ID_OFFSET = 3;
constexpr char NTFS_OEM_ID[] = "NTFS    ";
constexpr char EXFAT_OEM_ID[] = "EXFAT";
constexpr char EFI_SIGNATURE[] = "EFI PART";

constexpr size_t BOOT_SIGNATURE_OFFSET = 510;

constexpr size_t EXT_MAGIC_OFFSET = 0x38;
constexpr size_t EXT_COMPAT_OFFSET = 0x5C;
constexpr size_t EXT_INCOMPAT_OFFSET = 0x60;
constexpr size_t EXT_RO_COMPAT_OFFSET = 0x64;
constexpr uint16_t EXT_MAGIC = 0xEF53;
constexpr uint8_t EXT_HAS_JOURNAL = 0x4;
constexpr uint32_t EXT4_FIRST_INCOMPAT = 0x40;  // extents; later features are larger
constexpr uint32_t EXT4_FIRST_RO_COMPAT = 8;    // huge files; later features are larger

constexpr size_t HFSPLUS_ATTRIBUTES_OFFSET = 6;
constexpr uint8_t HFSPLUS_JOURNALED = 0x20;

// A region of the device.
template <int Length>
struct region {
    uint8_t bytes[Length]{};

    bool read(int fd, int offset) { return fs_read_at(fd, bytes, offset, Length) == 0; }
    bool holds(size_t offset, const char* text) const
    {
        return memcmp(bytes + offset, text, strlen(text)) == 0;
    }
};

using sector = region<SECTOR_SIZE>;

uint16_t little_endian_16(const uint8_t* bytes)
{
    return static_cast<uint16_t>(bytes[0] | bytes[1] << 8);
}

uint32_t little_endian_32(const uint8_t* bytes)
{
    return little_endian_16(bytes) | static_cast<uint32_t>(little_endian_16(bytes + 2)) << 16;
}

// A jump over the parameter block, as every FAT boot sector begins.
bool begins_with_jump(const sector& boot)
{
    const bool short_jump = boot.bytes[0] == 0xEB && boot.bytes[2] == 0x90;
    return short_jump || boot.bytes[0] == 0xE9;
}

bool has_boot_signature(const sector& boot)
{
    return boot.bytes[BOOT_SIGNATURE_OFFSET] == 0x55 &&
           boot.bytes[BOOT_SIGNATURE_OFFSET + 1] == 0xAA;
}

fs_code classify_ext(const uint8_t* superblock)
{
    if ((superblock[EXT_COMPAT_OFFSET] & EXT_HAS_JOURNAL) == 0) {
        return FS_EXT2;
    }
    if (little_endian_32(superblock + EXT_INCOMPAT_OFFSET) >= EXT4_FIRST_INCOMPAT) {
        return FS_EXT4;
    }
    if (little_endian_32(superblock + EXT_RO_COMPAT_OFFSET) >= EXT4_FIRST_RO_COMPAT) {
        return FS_EXT4;
    }
    return FS_EXT3;
}

fs_code probe_ntfs(int fd)
{
    sector boot;
    return boot.read(fd, 0) && boot.holds(OEM_ID_OFFSET, NTFS_OEM_ID) ? FS_NTFS : FS_NONE;
}

fs_code probe_exfat(int fd)
{
    sector boot;
    return boot.read(fd, 0) && boot.holds(OEM_ID_OFFSET, EXFAT_OEM_ID) ? FS_EXFAT : FS_NONE;
}

fs_code probe_fat(int fd)
{
    sector boot;
    if (!boot.read(fd, 0) || !begins_with_jump(boot)) {
        return FS_NONE;
    }
    // Sticks are about that lack the second signature byte, so only the first is asked for.
    const bool signed_boot = boot.bytes[BOOT_SIGNATURE_OFFSET] == 0x55;
    return signed_boot && !boot.holds(OEM_ID_OFFSET, NTFS_OEM_ID) ? FS_FAT : FS_NONE;
}

fs_code probe_ext(int fd)
{
    region<EXT_SUPERBLOCK_SIZE> superblock;
    if (!superblock.read(fd, SUPERBLOCK_OFFSET)) {
        return FS_NONE;
    }
    if (little_endian_16(superblock.bytes + EXT_MAGIC_OFFSET) != EXT_MAGIC) {
        return FS_NONE;
    }
    return classify_ext(superblock.bytes);
}

fs_code probe_hfsplus(int fd)
{
    sector header;
    if (!header.read(fd, SUPERBLOCK_OFFSET)) {
        return FS_NONE;
    }
    // "HFS+ with a journal" in docs/limits.md.
    const bool journaled = (header.bytes[HFSPLUS_ATTRIBUTES_OFFSET] & HFSPLUS_JOURNALED) != 0;
    return !journaled && header.holds(0, "H+") ? FS_HFSPLUS : FS_NONE;
}

fs_code probe_extended(int fd)
{
    sector boot;
    if (!boot.read(fd, 0)) {
        return FS_NONE;
    }
    return has_boot_signature(boot) && !begins_with_jump(boot) ? FS_EXTENDED : FS_NONE;
}

fs_code probe_efi(int fd)
{
    sector header;
    return header.read(fd, SECTOR_SIZE) && header.holds(0, EFI_SIGNATURE) ? FS_EFI : FS_NONE;
}

fs_code probe_mbr(int fd)
{
    sector boot;
    return boot.read(fd, 0) && has_boot_signature(boot) ? FS_MBR : FS_NONE;
}

struct probe {
    fs_code (*find)(int fd);
    fs_code codes[3];  // what it can find; FS_NONE fills up
};

// exFAT also looks like FAT, and a GPT disk's first sector like an extended boot record: the order
// decides what such a device is.
constexpr probe PROBES[] = {
    {probe_ntfs, {FS_NTFS}},       {probe_exfat, {FS_EXFAT}},
    {probe_fat, {FS_FAT}},         {probe_ext, {FS_EXT2, FS_EXT3, FS_EXT4}},
    {probe_hfsplus, {FS_HFSPLUS}}, {probe_extended, {FS_EXTENDED}},
    {probe_efi, {FS_EFI}},         {probe_mbr, {FS_MBR}},
};

constexpr const probe* probe_of(fs_code code)
{
    for (const probe& row : PROBES) {
        for (const fs_code found : row.codes) {
            if (found == code && code != FS_NONE) {
                return &row;
            }
        }
    }
    return nullptr;
}

constexpr bool each_filesystem_is_probed()
{
    for (const filesystem& row : FILESYSTEMS) {
        const bool detected = row.code != FS_NONE && row.code != FS_ERR;
        if (detected && probe_of(row.code) == nullptr) {
            return false;
        }
    }
    return true;
}
static_assert(each_filesystem_is_probed(), "each filesystem is in the row of a probe");

constexpr bool each_probe_finds_filesystems()
{
    for (const probe& row : PROBES) {
        for (const fs_code code : row.codes) {
            if (code >= FS_CODE_COUNT) {
                return false;
            }
        }
    }
    return true;
}
static_assert(each_probe_finds_filesystems(), "what a probe finds is in the table of filesystems");

static_assert(probe_of(FS_EXTENDED) == std::end(PROBES) - 3 &&
                  probe_of(FS_EFI) == std::end(PROBES) - 2 &&
                  probe_of(FS_MBR) == std::end(PROBES) - 1,
              "filesystems stand in front of EXTENDED and MBR, which take any signed sector");

}  // namespace

int fs_read_at(int fd, void* buffer, int offset, int length)
{
    if (lseek(fd, offset, SEEK_SET) != offset) {
        log_errno("seek err!\n");
        return -1;
    }
    if (read(fd, buffer, static_cast<size_t>(length)) != length) {
        const auto* text = static_cast<const char*>(buffer);
        log_errno("read err! b = %.*s, len = %d\n", length, text, length);
        return -1;
    }
    return 0;
}

fs_code fs_probe_all(int fd)
{
    for (const probe& row : PROBES) {
        const fs_code code = row.find(fd);
        if (code != FS_NONE) {
            return code;
        }
    }
    return FS_NONE;
}

fs_code fs_probe_one(fs_code code, int fd)
{
    const probe* row = probe_of(code);
    return row != nullptr ? row->find(fd) : FS_NONE;
}
