#include "fs/fs_type.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "fs/fs_probe.h"
#include "log/log.h"
#include "util/blkid.h"
#include "util/guard.h"
#include "util/paths.h"
#include "util/scratch.h"
#include "util/text.h"

namespace {

constexpr size_t TYPE_PREFIX_LENGTH = 4;
constexpr scratch_query TYPE_QUERY{SCRATCH_BLKID_TYPE, SCRATCH_DELETED_WHEN_READ};
constexpr char RULE[] = "==========================\n";

struct name_list {
    const char* names[FS_CODE_COUNT];
};

constexpr name_list names_of_table()
{
    name_list list{};
    for (const filesystem& row : FILESYSTEMS) {
        list.names[row.code] = row.name;
    }
    return list;
}

constexpr name_list NAMES = names_of_table();

// Four characters decide, so that ntfs3 and ext4dev count as what they are.
fs_code code_of_blkid_type(const char* type)
{
    for (const filesystem& row : FILESYSTEMS) {
        if (row.blkid_type != NO_TEXT && strncmp(type, row.blkid_type, TYPE_PREFIX_LENGTH) == 0) {
            return row.code;
        }
    }
    return FS_NONE;
}

bool is_ext(fs_code fs_type)
{
    return fs_type == FS_EXT2 || fs_type == FS_EXT3 || fs_type == FS_EXT4;
}

void log_heading(const char* dev_path)
{
    log_info("%s", RULE);
    log_info("check dev fs, dev = %s\n", dev_path);
    log_info("%s", RULE);
}

}  // namespace

const char* const (&fs_type_names)[FS_CODE_COUNT] = NAMES.names;

const char* fs_type_name(fs_code fs_type)
{
    return filesystem_of(fs_type).name;
}

fs_code fs_detect_type(const char* dev_path)
{
    log_heading(dev_path);
    fd_guard fd(open(dev_path, O_RDONLY | O_CLOEXEC));
    if (fd < 0) {
        perror("open device err!\n");
        log_info("err, open dev = %s\n", dev_path);
        return FS_NONE;
    }
    fs_code fs_type = fs_probe_all(fd);
    fd.reset(-1);

    // The ext superblock only tells that blkid is to be asked which member of the family it is.
    const bool ask_blkid = fs_type == FS_NONE || is_ext(fs_type);
    if (ask_blkid) {
        fs_type = fs_type_from_blkid(dev_path);
    }
    log_info("===> dev type = %d\n", fs_type);
    fs_type_hook(fs_type, dev_path);
    if (fs_type == FS_NONE) {
        log_info("check fs, dev = %s, fs = FS_NONE\n", dev_path);
    } else {
        log_info("check fs, dev = %s, fs = %s\n", dev_path, fs_type_name(fs_type));
    }
    return fs_type;
}

fs_code fs_type_from_blkid(const char* dev_path)
{
    char type[FS_TYPE_TEXT_SIZE]{};
    if (fs_blkid_type(dev_path, type, sizeof(type)) != 0) {
        return FS_NONE;
    }
    const fs_code fs_type = code_of_blkid_type(type);
    fs_type_hook(fs_type, dev_path);
    return fs_type;
}

int fs_blkid_type(const char* dev_path, char* out, size_t size)
{
    const scratch_text answer(TYPE_QUERY, "blkid %s > %s", {dev_path, SCRATCH_BLKID_TYPE});
    if (answer.text == nullptr) {
        return 1;
    }
    // The first TYPE may be that of SEC_TYPE: "ext3 and some ext4 volumes" and "FAT recognised by
    // blkid alone" in docs/limits.md.
    const blkid_value type = blkid_find(answer.text, "TYPE=", BLKID_QUOTE);
    if (type.text == nullptr) {
        return 1;
    }
    text_copy_n({out, size}, type.text, type.length);
    log_info("dev = %s, get type = %s\n", dev_path, out);
    return 0;
}

int dev_has_fs_type(const char* dev_name)
{
    char dev_path[DEV_PATH_SIZE];
    path_dev_node(dev_path, dev_name);
    char type[FS_TYPE_TEXT_SIZE]{};
    return fs_blkid_type(dev_path, type, sizeof(type)) == 0 ? YES : NO;
}

int fs_type_hook(fs_code fs_type, const char* dev_path)
{
    static_cast<void>(fs_type);
    static_cast<void>(dev_path);
    return 0;
}
