#include "manager/start_scan.h"

#include "disk/discovery.h"
#include "log/log.h"
#include "util/block_dev.h"
#include "util/file.h"
#include "util/paths.h"

scan_result add_all_disks(disk_sets* disks)
{
    dir_stream dir(SYS_BLOCK);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", SYS_BLOCK);
        return SCAN_FAILED;
    }
    log_info("scan path = %s\n", SYS_BLOCK);
    bool have_disk = false;
    while (const char* name = dir.next_name()) {
        log_info("d_name = %s\n", name);
        if (dev_name_is_disk(name) == MATCHES) {
            disk_sets_add_dev(disks, name);
            have_disk = true;
        }
    }
    // Who knows what comes behind the place where reading broke off. The rescans, which wait for a
    // first disk, shall find it.
    if (dir.failed) {
        have_disk = true;
    }
    log_info("have disk = %d\n", have_disk ? 1 : 0);
    return have_disk ? SCAN_HAS_DISK : SCAN_NO_DISK;
}
