#include "disk/waiting.h"

#include "disk/discovery.h"
#include "util/fs_code.h"
#include "util/text.h"

namespace {

bool awaits_mount_pass(const disk_obj* disk)
{
    bool has_part = false;
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && slot.part.mount_path[0] != '\0') {
            return false;
        }
        has_part |= slot.in_use == 1;
    }
    return has_part && disk->root.fs_type == FS_NONE;
}

bool has_disk(const disk_sets* sets, const char* root_dev)
{
    for (const disk_entry& entry : sets->entries) {
        if (entry.in_use == 1 && str_equal(entry.disk.root.dev_name, root_dev) == MATCHES) {
            return true;
        }
    }
    return false;
}

}  // namespace

waiting_disks find_waiting_disks(const disk_sets* sets, const char* removed_dev)
{
    waiting_disks found{};
    if (sets == nullptr || removed_dev == nullptr) {
        return found;
    }
    for (const disk_entry& entry : sets->entries) {
        const disk_obj* disk = &entry.disk;
        if (entry.in_use == 1 && awaits_mount_pass(disk) && !disk_obj_holds(disk, removed_dev)) {
            text_copy(found.root_devs[found.count++], disk->root.dev_name);
        }
    }
    return found;
}

void bring_back_waiting_disks(disk_sets* sets, const waiting_disks& waiting)
{
    for (int i = 0; sets != nullptr && i < waiting.count; ++i) {
        if (!has_disk(sets, waiting.root_devs[i])) {
            disk_sets_add_dev(sets, waiting.root_devs[i]);
        }
    }
}
