#include "disk/pulled.h"

#include <ctime>

#include "disk/removal.h"
#include "log/log.h"
#include "util/answer.h"
#include "util/block_dev.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/text.h"

namespace {

constexpr int LEAVING_SECONDS = 1;

struct departure {
    char root_dev[PART_DEV_NAME_SIZE];
    time_t when;
};

// What lasts as long as the process: who left last. Messages about them may still come.
departure departures[MAX_DISKS];

void note_departure(const char* root_dev)
{
    departure* place = &departures[0];
    for (departure& each : departures) {
        if (str_equal(each.root_dev, root_dev) == MATCHES) {
            place = &each;
            break;
        }
        if (each.when < place->when) {
            place = &each;
        }
    }
    text_copy(place->root_dev, root_dev);
    place->when = time(nullptr);
}

bool has_left_lately(const char* root_dev)
{
    for (const departure& each : departures) {
        const time_t since = time(nullptr) - each.when;
        if (str_equal(each.root_dev, root_dev) == MATCHES) {
            return since >= 0 && since < FORMER_DISK_SECONDS;
        }
    }
    return false;
}

// Another disk has the name by now. A node that cannot be looked at proves nothing.
bool is_replaced(const disk_obj* disk)
{
    const uint64_t node_now = dev_node_id(disk->root.dev_name);
    return disk->node_id != 0 && node_now != 0 && node_now != disk->node_id;
}

struct disk_flags {
    bool set[MAX_DISKS];
};

// Which entries the kernel still lists. False when its list cannot be read whole.
bool find_listed(const disk_sets* sets, disk_flags* listed)
{
    dir_stream dir(SYS_BLOCK);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", SYS_BLOCK);
        return false;
    }
    while (const char* name = dir.next_name()) {
        for (int i = 0; i < MAX_DISKS; ++i) {
            if (str_equal(sets->entries[i].disk.root.dev_name, name) == MATCHES) {
                listed->set[i] = true;
            }
        }
    }
    return !dir.failed;
}

// The entry is cleared, and with it the name in it.
void forget(disk_sets* sets, const disk_entry* entry)
{
    char root_dev[PART_DEV_NAME_SIZE];
    text_copy(root_dev, entry->disk.root.dev_name);
    remove_pulled_disk(sets, root_dev);
}

bool forget_unlisted_disks(disk_sets* sets)
{
    disk_flags listed{};
    if (!find_listed(sets, &listed)) {
        return false;
    }
    bool any = false;
    for (int i = 0; i < MAX_DISKS; ++i) {
        const disk_entry* entry = &sets->entries[i];
        if (entry->in_use == 1 && !listed.set[i]) {
            log_warn("disk was pulled, dev = %s\n", entry->disk.root.dev_name);
            forget(sets, entry);
            any = true;
        }
    }
    return any;
}

bool node_is_gone(const char* dev_name)
{
    char dev_path[DEV_PATH_SIZE];
    path_dev_node(dev_path, dev_name);
    return path_is_gone(dev_path);
}

bool lacks_a_node(const disk_obj* disk)
{
    if (node_is_gone(disk->root.dev_name)) {
        return true;
    }
    for (const part_slot& slot : disk->parts) {
        if (slot.in_use == 1 && node_is_gone(slot.part.dev_name)) {
            return true;
        }
    }
    return false;
}

bool any_disk_lacks_a_node(const disk_sets* sets)
{
    for (const disk_entry& entry : sets->entries) {
        if (entry.in_use == 1 && lacks_a_node(&entry.disk)) {
            return true;
        }
    }
    return false;
}

// The place of the disk that holds the device, -1 when none does. Tells the log nothing.
int find_owner(const disk_sets* sets, const char* dev_name)
{
    for (int i = 0; i < MAX_DISKS; ++i) {
        if (sets->entries[i].in_use == 1 && disk_obj_holds(&sets->entries[i].disk, dev_name)) {
            return i;
        }
    }
    return -1;
}

bool has_left(const disk_sets* sets, int place)
{
    disk_flags listed{};
    return is_replaced(&sets->entries[place].disk) ||
           (find_listed(sets, &listed) && !listed.set[place]);
}

}  // namespace

bool forget_pulled_disks(disk_sets* sets)
{
    if (sets == nullptr) {
        return false;
    }
    const bool replaced = forget_replaced_disks(sets);
    return forget_unlisted_disks(sets) || replaced;
}

bool forget_replaced_disks(disk_sets* sets)
{
    bool any = false;
    for (int i = 0; sets != nullptr && i < MAX_DISKS; ++i) {
        const disk_entry* entry = &sets->entries[i];
        if (entry->in_use == 1 && is_replaced(&entry->disk)) {
            log_warn("disk was replaced, dev = %s\n", entry->disk.root.dev_name);
            forget(sets, entry);
            any = true;
        }
    }
    return any;
}

bool forget_leaving_disks(disk_sets* sets)
{
    if (sets == nullptr) {
        return false;
    }
    if (forget_pulled_disks(sets)) {
        return true;
    }
    if (!any_disk_lacks_a_node(sets)) {
        return false;
    }
    pause_seconds(LEAVING_SECONDS);
    return forget_pulled_disks(sets);
}

int remove_pulled_disk(disk_sets* sets, const char* root_dev)
{
    if (remove_root_part(sets, root_dev) != 0) {
        return 1;
    }
    note_departure(root_dev);
    return 0;
}

bool may_mean_former_disk(const disk_sets* sets, const char* dev_name)
{
    const int place = sets != nullptr ? find_owner(sets, dev_name) : -1;
    if (place < 0) {
        return false;
    }
    const char* root_dev = sets->entries[place].disk.root.dev_name;
    if (has_left(sets, place)) {
        note_departure(root_dev);
        return false;
    }
    return has_left_lately(root_dev) && !node_is_gone(dev_name);
}

void pulled_reset()
{
    for (departure& each : departures) {
        each = {};
    }
}
