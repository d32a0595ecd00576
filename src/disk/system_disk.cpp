#include "disk/system_disk.h"

#include <sys/stat.h>

#include <cerrno>

#include "util/block_dev.h"
#include "util/file.h"
#include "util/paths.h"

namespace {

bool is_system_device(const char* dev_name)
{
    char dev_path[PATH_SIZE];
    path_dev_node(dev_path, dev_name);
    struct stat node {};
    if (stat(dev_path, &node) != 0 || !S_ISBLK(node.st_mode)) {
        return false;
    }
    for (const char* dir : SYSTEM_DIRS) {
        struct stat info {};
        if (stat(dir, &info) == 0 && info.st_dev == node.st_rdev) {
            return true;
        }
    }
    return false;
}

}  // namespace

bool is_system_disk(const char* root_dev)
{
    if (is_system_device(root_dev)) {
        return true;
    }
    char path[PATH_SIZE];
    path_sys_disk(path, root_dev);
    for (int walk = 0; walk < DIR_WALKS; ++walk) {
        dir_stream dir(path);
        if (dir.stream == nullptr) {
            return errno != ENOENT && errno != ENOTDIR;
        }
        while (const char* name = dir.next_name()) {
            if (dev_name_is_disk(name) == MATCHES && is_system_device(name)) {
                return true;
            }
        }
        if (!dir.failed) {
            return false;
        }
    }
    // A user's disk that is left alone for once is the smaller harm.
    return true;
}
