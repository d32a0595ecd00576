#include "manager/rescan.h"

#include <cstddef>

#include "disk/discovery.h"
#include "disk/removal.h"
#include "log/log.h"
#include "util/block_dev.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr int BLOCK_LIST_SIZE = 16;
constexpr size_t BLOCK_NAME_SIZE = 16;

struct block_names {
    char names[BLOCK_LIST_SIZE][BLOCK_NAME_SIZE];
};

// What lasts as long as the process: the devices seen at the previous rescan. The start-up scan
// leaves it empty, so that the first rescan offers every disk again; the inventory ignores those
// that it holds.
block_names block_list;

// Longer names are cut. More names than slots are left for the rescan that finds room:
// docs/limits.md, "Rescans hold 16 block devices".
bool read_block_names(block_names* list)
{
    dir_stream dir(SYS_BLOCK);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", SYS_BLOCK);
        return false;
    }
    int used = 0;
    while (const char* name = dir.next_name()) {
        if (dev_name_is_disk(name) == MATCHES && used < BLOCK_LIST_SIZE) {
            text_copy(list->names[used++], name);
        }
    }
    // Half a list would take the disks that it lacks for pulled ones.
    return !dir.failed;
}

bool holds(const block_names& list, const char* name)
{
    for (const auto& slot : list.names) {
        if (str_equal(slot, name) == MATCHES) {
            return true;
        }
    }
    return false;
}

}  // namespace

bool rescan_block_devices(disk_sets* disks, int32_t* changed)
{
    block_names found{};
    if (!read_block_names(&found)) {
        return false;
    }
    // Empty slots are compared like names on purpose: when a full list shrinks, "" is offered once,
    // and no device is called that.
    for (const auto& name : found.names) {
        if (!holds(block_list, name)) {
            disk_sets_add_dev(disks, name);
            *changed = 1;
        }
    }
    for (const auto& name : block_list.names) {
        if (!holds(found, name)) {
            remove_root_part(disks, name);
            *changed = 1;
        }
    }
    block_list = found;
    return true;
}

void rescan_reset()
{
    block_list = {};
}
