// What the kernel, blkid and the label script tell of a block device. Device names are bare kernel
// names (sda, sda1, mmcblk0p1).
#pragma once

#include <cstddef>
#include <cstdint>

#include "util/answer.h"

// MATCHES when the daemon handles devices of that name: at least 3 characters, beginning with "sd",
// "hd" or "mmcblk", and plain (util/paths).
int dev_name_is_disk(const char* name);

// MATCHES when name is a whole disk, that is an entry of /sys/block.
int sys_block_has_dev(const char* name);

// Finds the disk whose directory holds the partition. MATCHES and the disk's name in out, else
// NO_MATCH.
int sys_block_find_parent(const char* part_name, char* out, size_t size);

// Tells one device from the next that gets its name: the inode number of its node, which is made
// anew for each. (The kernel hands out device numbers again with the names.) 0 when the node cannot
// be looked at.
uint64_t dev_node_id(const char* dev_name);

// The kernel's sector count; written to sectors only on success.
void dev_get_sectors(const char* disk_name, const char* dev_name, uint64_t* sectors);

// The hardware sector size in bytes; written to bytes only on success.
void dev_get_sector_size(const char* disk_name, uint64_t* bytes);

// Total and free bytes of the filesystem mounted at path (either may be null). The free count
// includes the blocks reserved for the superuser. 0 or 1.
int path_get_space(const char* path, uint64_t* total, uint64_t* free_bytes);

// The value behind the first occurrence of key (with its "=") in blkid's output, up to a quote or
// a space. Zero-fills out and copies at most size characters: a value that long leaves no
// terminating zero.
void blkid_get_value(const char* dev_name, const char* key, char* out, size_t size);

// The label as stored on the volume, without blkid's encoding; otherwise like blkid_get_value.
void blkid_get_label(const char* dev_name, char* out, size_t size);

// The label script's first output line, spaces kept, at most size characters, zero-filled.
// 0 when the script ran and its output was read, else 1.
int script_get_label(const char* dev_name, char* out, size_t size);

// The same three into a whole array, which always ends with a zero.
template <size_t N>
void blkid_get_value(const char* dev_name, const char* key, char (&out)[N])
{
    out[N - 1] = '\0';
    blkid_get_value(dev_name, key, out, N - 1);
}

template <size_t N>
void blkid_get_label(const char* dev_name, char (&out)[N])
{
    out[N - 1] = '\0';
    blkid_get_label(dev_name, out, N - 1);
}

template <size_t N>
[[nodiscard]] int script_get_label(const char* dev_name, char (&out)[N])
{
    out[N - 1] = '\0';
    return script_get_label(dev_name, out, N - 1);
}
