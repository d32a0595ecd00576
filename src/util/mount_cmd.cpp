#include "util/mount_cmd.h"

#include <cstddef>

#include "log/log.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t UMOUNT_SIZE = 256;

// Anybody who may mount a userspace filesystem chooses names in the mount table.
bool is_umount_target(const char* target)
{
    if (path_is_shell_safe(target)) {
        return true;
    }
    log_warn("umount err, target = %s\n", target);
    return false;
}

}  // namespace

const char* fs_mount_cmd_format(fs_code fs_type)
{
    return filesystem_of(fs_type).mount;
}

int fs_repair(fs_code fs_type, const char* dev_path)
{
    const char* format = filesystem_of(fs_type).repair;
    if (format == NO_TEXT) {
        return 1;
    }
    if (!path_is_shell_safe(dev_path)) {
        log_warn("repair err, dev = %s\n", dev_path);
        return 0;
    }
    char command[COMMAND_SIZE];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    text_format(command, sizeof(command), format, dev_path);
#pragma GCC diagnostic pop
    exec_cmd(command, 1);
    return 0;
}

int fs_repair_ntfs(const char* dev_path)
{
    return fs_repair(FS_NTFS, dev_path);
}

int fs_repair_exfat(const char* dev_path)
{
    return fs_repair(FS_EXFAT, dev_path);
}

int fs_repair_ext2(const char* dev_path)
{
    return fs_repair(FS_EXT2, dev_path);
}

int fs_repair_ext3(const char* dev_path)
{
    return fs_repair(FS_EXT3, dev_path);
}

int fs_repair_ext4(const char* dev_path)
{
    return fs_repair(FS_EXT4, dev_path);
}

int fs_repair_fat(const char* dev_path)
{
    return fs_repair(FS_FAT, dev_path);
}

void fs_umount(const char* target)
{
    if (!is_umount_target(target)) {
        return;
    }
    char command[UMOUNT_SIZE];
    text_format(command, sizeof(command), "umount %s", target);
    exec_cmd(command, 1);
}

void fs_umount_force(const char* target)
{
    if (!is_umount_target(target)) {
        return;
    }
    char command[UMOUNT_SIZE];
    text_format(command, sizeof(command), "umount -f %s", target);
    exec_cmd(command, 1);
}

int umount_dir_entries(const char* path)
{
    dir_stream dir(path);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", path);
        return 1;
    }
    while (const char* name = dir.next_name()) {
        if (name[0] == '.') {
            continue;
        }
        char target[UMOUNT_SIZE];
        text_format(target, sizeof(target), "%s/%s", path, name);
        fs_umount(target);
    }
    return 0;
}
