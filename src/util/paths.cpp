#include "util/paths.h"

#include <cstring>

#include "log/log.h"
#include "util/text.h"

namespace {

constexpr size_t MOUNT_BASE_LENGTH = sizeof(MOUNT_BASE) - 1;

}  // namespace

void path_dev_node(std::span<char> out, const char* dev_name)
{
    text_format(out, "/dev/%s", dev_name);
}

void path_sys_disk(std::span<char> out, const char* disk_name)
{
    text_format(out, "%s/%s", SYS_BLOCK, disk_name);
}

void path_sys_size(std::span<char> out, const char* dev_name)
{
    text_format(out, "/sys/class/block/%s/size", dev_name);
}

void path_sys_part_size(std::span<char> out, const char* disk_name, const char* dev_name)
{
    text_format(out, "/sys/block/%s/%s/size", disk_name, dev_name);
}

void path_sys_sector_size(std::span<char> out, const char* disk_name)
{
    text_format(out, "/sys/block/%s/queue/hw_sector_size", disk_name);
}

void path_mount_name(std::span<char> out, int32_t disk_number, int32_t part_number)
{
    text_format(out, "disk%d_part%d", disk_number, part_number);
}

void path_mount_dir(std::span<char> out, const char* mount_name)
{
    text_format(out, "%s/%s", MOUNT_BASE, mount_name);
}

int mount_path_to_name(const char* mount_path, char* out, size_t size)
{
    if (mount_path == nullptr || out == nullptr) {
        log_err("err!\n");
        return 1;
    }
    if (strlen(mount_path) < MOUNT_BASE_LENGTH) {
        log_err("err mount = %s\n", mount_path);
        return 1;
    }
    const char* name = mount_path + MOUNT_BASE_LENGTH;
    text_copy({out, size}, *name == '/' ? name + 1 : name);
    return 0;
}

bool mount_path_is_usable(const char* path)
{
    if (!text_has_prefix(path, MOUNT_BASE) || path[MOUNT_BASE_LENGTH] != '/') {
        return false;
    }
    const char* name = path + MOUNT_BASE_LENGTH + 1;
    return name[0] != '\0' && name[0] != '.' && strlen(name) < MOUNT_NAME_SIZE &&
           name_is_plain(name);
}

bool name_is_plain(const char* name)
{
    return name[strspn(name, NAME_CHARACTERS)] == '\0';
}
