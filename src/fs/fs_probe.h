// Superblock probes: each looks for one published on-disk signature on an open device.
#pragma once

#include "util/fs_code.h"

// The code of the first probe that matches, FS_NONE when none does. A read that fails is no match.
[[nodiscard]] fs_code fs_probe_all(int fd);

// 0 when exactly length bytes were read at the byte offset, else -1. A failed read prints the
// buffer as text.
int fs_read_at(int fd, void* buffer, int offset, int length);

// For tests: what the one probe says that looks for a code.
[[nodiscard]] fs_code fs_probe_one(fs_code code, int fd);
