#include "util/mount_cmd.h"

#include "log/log.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/text.h"

namespace {

// Anybody who may mount a userspace filesystem chooses names in the mount table.
void run_umount(const char* format, const char* target)
{
    char command[LONG_COMMAND_SIZE];
    if (command_format(command, format, {target})) {
        exec_cmd(command, 1);
    } else {
        log_warn("umount err, target = %s\n", target);
    }
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
    char command[COMMAND_SIZE];
    if (command_format(command, format, {dev_path})) {
        exec_cmd(command, 1);
    } else {
        log_warn("repair err, dev = %s\n", dev_path);
    }
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
    run_umount("umount %s", target);
}

void fs_umount_force(const char* target)
{
    run_umount("umount -f %s", target);
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
        char target[LONG_COMMAND_SIZE];
        text_format(target, "%s/%s", path, name);
        fs_umount(target);
    }
    return 0;
}
