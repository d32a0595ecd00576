// Which filesystem a block device carries: superblock probes first, blkid's opinion second.
#pragma once

#include <cstddef>

#include "util/answer.h"
#include "util/fs_code.h"

// Room for a TYPE value of blkid with its terminating zero; longer ones are cut.
constexpr size_t FS_TYPE_TEXT_SIZE = 16;

// The display name of a code; that of FS_NONE for a value that is no code.
[[nodiscard]] const char* fs_type_name(fs_code fs_type);

// The type code of the filesystem on a device node; 0 when nothing is recognised or the device
// cannot be opened. The device is only read.
fs_code fs_detect_type(const char* dev_path);

// The type code that blkid alone gives; 0 when it names nothing usable.
fs_code fs_type_from_blkid(const char* dev_path);

// Copies the first TYPE value of blkid's output into out, cut at size - 1. 0 when there was one.
int fs_blkid_type(const char* dev_path, char* out, size_t size);

// Called after each detection; does nothing. Always 0.
int fs_type_hook(fs_code fs_type, const char* dev_path);

// Nothing in the daemon uses these.

// The display names, indexed by code.
extern const char* const (&fs_type_names)[FS_CODE_COUNT];

// YES when blkid reports a TYPE for a device name, else NO.
int dev_has_fs_type(const char* dev_name);
