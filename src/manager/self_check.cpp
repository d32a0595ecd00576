#include "manager/self_check.h"

#include "disk/mount_point.h"
#include "disk/pulled.h"
#include "util/answer.h"

namespace {

// Both are looked for, since each logs what it finds.
bool mounts_are_sound()
{
    const bool path_twice = check_mount_path_dup() == YES;
    const bool dev_gone = check_mount_dev_exist() == YES;
    return !path_twice && !dev_gone;
}

}  // namespace

bool self_check(disk_sets* disks, int32_t* changed)
{
    // Several disks may leave one after the other; each is forgotten once.
    while (!mounts_are_sound()) {
        if (!forget_leaving_disks(disks)) {
            return false;
        }
        *changed = 1;
    }
    return true;
}
