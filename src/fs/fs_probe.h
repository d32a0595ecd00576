// Superblock probes: each looks for one published on-disk signature on an open device.
#pragma once

#include <cstdint>

#include "util/fs_code.h"

// A probe returns its type code when the signature is there, else FS_NONE. A read that fails is no
// match.
int32_t fs_probe_ntfs(int fd);
int32_t fs_probe_exfat(int fd);
int32_t fs_probe_fat(int fd);
int32_t fs_probe_ext(int fd);
int32_t fs_probe_hfsplus(int fd);
int32_t fs_probe_extended(int fd);
int32_t fs_probe_efi(int fd);
int32_t fs_probe_mbr(int fd);

// The first match of all probes in the order above, FS_NONE when there is none.
int32_t fs_probe_all(int fd);

// 0 when exactly length bytes were read at the byte offset, else -1. buffer keeps one zero byte
// behind length: a failed read prints it as text.
int fs_read_at(int fd, void* buffer, int offset, int length);
