#include "manager/told_removal.h"

#include "disk/pulled.h"
#include "disk/removal.h"
#include "disk/waiting.h"
#include "log/log.h"
#include "manager/rescan.h"
#include "manager/services.h"
#include "util/text.h"

namespace {

// The file services must not hold files open while something is unmounted. A disk that waits for
// its first mount pass is none of the removal's business.
void remove_bracketed(disk_sets* sets, const char* name, int (*remove)(disk_sets*, const char*))
{
    services_stop();
    const waiting_disks waiting = find_waiting_disks(sets, name);
    remove(sets, name);
    services_start();
    bring_back_waiting_disks(sets, waiting);
}

// The device that has the directory, null when nobody knows.
const char* find_dev_of_dir(disk_sets* sets, const char* dir_name)
{
    if (sets == nullptr) {
        return nullptr;
    }
    for (disk_entry& entry : sets->entries) {
        if (const part_info* part = disk_obj_find_part_by_disk_name(&entry.disk, dir_name)) {
            return part->dev_name;
        }
    }
    return nullptr;
}

}  // namespace

void remove_told_dev(disk_sets* sets, const char* dev_name, bool from_hotplug)
{
    const bool may_be_late = may_mean_former_disk(sets, dev_name) && from_hotplug;
    remove_bracketed(sets, dev_name, remove_dev);
    if (may_be_late) {
        log_warn("removal of a former disk, dev = %s\n", dev_name);
        rescan_offer_again(dev_name);
    } else if (!from_hotplug) {
        rescan_drop_offers(dev_name);
    }
}

void remove_told_dir(disk_sets* sets, const char* dir_name)
{
    // The record is cleared by the removal, and with it the name in it.
    char dev_name[PART_DEV_NAME_SIZE];
    text_copy(dev_name, find_dev_of_dir(sets, dir_name));
    remove_bracketed(sets, dir_name, remove_disk);
    // A directory that nobody knows may be that of a device which is to be offered again.
    rescan_drop_offers(dev_name[0] != '\0' ? dev_name : nullptr);
}

void remove_told_all(disk_sets* sets)
{
    services_stop();
    safe_remove_all(sets);
    // That goes through what the kernel lists; nobody looks for the others while parked.
    forget_pulled_disks(sets);
    rescan_drop_offers(nullptr);
    services_start();
}
