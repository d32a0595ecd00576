#include "util/mount_cmd.h"

#include <cstddef>

#include "log/log.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t UMOUNT_SIZE = 256;

struct mount_cmd {
    int32_t fs_type;
    const char* format;
};

// FAT and HFS+ know no owners of ours: their files go to the user that the file services run as.
constexpr mount_cmd MOUNT_CMDS[] = {
    {FS_EXFAT, "mount -t exfat %s %s"},
    {FS_FAT, "mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 %s %s"},
    {FS_EXT4, "mount -t ext4 -o rw,defaults %s %s"},
    {FS_EXT3, "mount -t ext3 -o rw,defaults %s %s"},
    {FS_EXT2, "mount -t ext2 -o rw,defaults %s %s"},
    {FS_HFSPLUS, "mount -t hfsplus -o rw,defaults,uid=1000,gid=1000 %s %s"},
    {FS_NTFS, "mount.ntfs-3g -o noatime,big_writes,async,force %s %s"},
};

int run_repair(const char* format, const char* dev_path)
{
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

const char* fs_mount_cmd_format(int32_t fs_type)
{
    for (const mount_cmd& entry : MOUNT_CMDS) {
        if (entry.fs_type == fs_type) {
            return entry.format;
        }
    }
    return nullptr;
}

int fs_repair_ntfs(const char* dev_path)
{
    return run_repair("ntfsfix %s", dev_path);
}

int fs_repair_exfat(const char* dev_path)
{
    return run_repair("fsck.exfat %s", dev_path);
}

int fs_repair_ext2(const char* dev_path)
{
    return run_repair("fsck.ext2 -a %s", dev_path);
}

int fs_repair_ext3(const char* dev_path)
{
    return run_repair("fsck.ext3 -a %s", dev_path);
}

int fs_repair_ext4(const char* dev_path)
{
    return run_repair("fsck.ext4 -a %s", dev_path);
}

int fs_repair_fat(const char* dev_path)
{
    return run_repair("fsck.fat -a %s", dev_path);
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
