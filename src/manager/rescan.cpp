#include "manager/rescan.h"

#include <cstddef>
#include <cstring>

#include "disk/discovery.h"
#include "disk/pulled.h"
#include "log/log.h"
#include "util/block_dev.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr int BLOCK_LIST_SIZE = 16;
constexpr size_t BLOCK_NAME_SIZE = 16;
constexpr char DIGITS[] = "0123456789";
constexpr char SCSI_PREFIX[] = "sd";

struct block_slot {
    char name[BLOCK_NAME_SIZE];
    uint64_t node_id;  // dev_node_id
};

struct block_slots {
    block_slot slots[BLOCK_LIST_SIZE];
};

// What lasts as long as the process: the devices seen at the previous rescan. The start-up scan
// leaves it empty, so that the first rescan offers every disk again; the inventory ignores those
// that it holds.
block_slots block_list;

// More than one message about each device of all disks does not come between two rescans; what does
// not fit stays removed.
constexpr int OFFERS_MAX = MAX_DISKS * (1 + MAX_SUB_PARTS);

struct offers {
    char dev_names[OFFERS_MAX][PART_DEV_NAME_SIZE];
    int count;
};

// Lasts as long as the process, too.
offers offered_again;

// Longer names are cut. More names than slots are left for the rescan that finds room:
// docs/limits.md, "Rescans hold 16 block devices".
bool read_block_slots(block_slots* list)
{
    dir_stream dir(SYS_BLOCK);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", SYS_BLOCK);
        return false;
    }
    int used = 0;
    while (const char* name = dir.next_name()) {
        if (dev_name_is_disk(name) == MATCHES && used < BLOCK_LIST_SIZE) {
            block_slot* slot = &list->slots[used++];
            text_copy(slot->name, name);
            slot->node_id = dev_node_id(name);
        }
    }
    // Half a list would take the disks that it lacks for pulled ones.
    return !dir.failed;
}

const block_slot* find_slot(const block_slots& list, const char* name)
{
    for (const block_slot& slot : list.slots) {
        if (str_equal(slot.name, name) == MATCHES) {
            return &slot;
        }
    }
    return nullptr;
}

// Another disk under the name of one that was listed is new. Without its node nobody can tell.
bool is_new(const block_slot& found)
{
    const block_slot* known = find_slot(block_list, found.name);
    return known == nullptr || (found.node_id != 0 && found.node_id != known->node_id);
}

// How much of a device name is its disk's: sda of sda1, mmcblk0 of mmcblk0p1.
size_t root_length(const char* dev_name)
{
    const size_t letters = strcspn(dev_name, DIGITS);
    if (text_has_prefix(dev_name, SCSI_PREFIX)) {
        return letters;
    }
    return letters + strspn(dev_name + letters, DIGITS);
}

bool is_of_one_disk(const char* a, const char* b)
{
    const size_t length = root_length(a);
    return length == root_length(b) && strncmp(a, b, length) == 0;
}

bool offer_again(disk_sets* disks)
{
    const bool any = offered_again.count > 0;
    for (int i = 0; i < offered_again.count; ++i) {
        disk_sets_add_dev(disks, offered_again.dev_names[i]);
    }
    offered_again = {};
    return any;
}

}  // namespace

bool rescan_block_devices(disk_sets* disks, int32_t* changed)
{
    block_slots found{};
    if (!read_block_slots(&found)) {
        return false;
    }
    bool any = false;
    // Empty slots are compared like names on purpose: when a full list shrinks, "" is offered once
    // for each, and no device is called that.
    for (const block_slot& slot : found.slots) {
        if (is_new(slot)) {
            // An old record would make the inventory refuse the new disk of its name.
            forget_replaced_disks(disks);
            disk_sets_add_dev(disks, slot.name);
            any = true;
        }
    }
    for (const block_slot& slot : block_list.slots) {
        if (find_slot(found, slot.name) == nullptr) {
            remove_pulled_disk(disks, slot.name);
            any = true;
        }
    }
    block_list = found;
    any |= offer_again(disks);
    // Those that came and went between two rescans, so that no list ever held them.
    any |= forget_pulled_disks(disks);
    if (any) {
        *changed = 1;
    }
    return true;
}

void rescan_offer_again(const char* dev_name)
{
    if (offered_again.count < OFFERS_MAX) {
        text_copy(offered_again.dev_names[offered_again.count++], dev_name);
    }
}

void rescan_drop_offers(const char* dev_name)
{
    int kept = 0;
    for (int i = 0; i < offered_again.count; ++i) {
        const char* offered = offered_again.dev_names[i];
        if (dev_name != nullptr && !is_of_one_disk(offered, dev_name)) {
            text_copy(offered_again.dev_names[kept++], offered);
        }
    }
    offered_again.count = kept;
}

void rescan_reset()
{
    block_list = {};
    offered_again = {};
}
