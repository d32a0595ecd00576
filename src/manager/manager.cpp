#include "manager/manager.h"

#include <cstring>

#include "disk/discovery.h"
#include "disk/disk_status.h"
#include "disk/mount.h"
#include "disk/mount_point.h"
#include "disk/pulled.h"
#include "log/log.h"
#include "manager/rescan.h"
#include "manager/self_check.h"
#include "manager/start_scan.h"
#include "manager/told_removal.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/process.h"
#include "util/text.h"
#include "util/waits.h"

namespace {

// What lasts as long as the process, however often the manager is set up again.
struct manager_life {
    std::atomic<int32_t> running{1};
    int32_t restart_requested = 0;
    int32_t sys_timeout = 60;  // seconds of silence that the loop bears
    void (*report_signals)() = nullptr;
};

static_assert(std::atomic<int32_t>::is_always_lock_free, "a signal handler writes running");

constinit manager_life life;
disk_manager the_manager;

constexpr int32_t SYS_TIMEOUT_FACTOR = 5;

constexpr time_t REFRESH_AFTER_SECONDS = 4;
constexpr time_t UPDATE_EVERY_SECONDS = 3;
constexpr time_t PUBLISH_AFTER_SECONDS = 29;
constexpr time_t RESCAN_EVERY_SECONDS = 8;

// False when no event came for too long and the companion process is gone: docs/limits.md, "It ends
// when nobody needs it".
bool is_needed(time_t* last, time_t now)
{
    const time_t silence = now - *last;
    if (silence <= life.sys_timeout) {
        return true;
    }
    log_warn("sys timeout, %d > %d\n", static_cast<int>(silence), life.sys_timeout);
    if (proc_exists(COMPANION_PROCESS) != YES) {
        return false;
    }
    *last = now;
    return true;
}

void report_signals()
{
    if (life.report_signals != nullptr) {
        life.report_signals();
    }
}

// With the messages of the signals that arrived during the last cycle's work, and of those that end
// the wait.
bool receive_event(disk_manager* manager)
{
    report_signals();
    // Only an active manager works off what is due: any other would find it due for ever.
    const bool is_due = manager->update_due == 1 || manager->changed == 1;
    manager->pipes.wait_ms =
        is_due && manager->state == MANAGER_ACTIVE ? WAITS.work_due : WAITS.idle;
    const bool received = event_receive(&manager->pipes) == EVENT_RECEIVED;
    report_signals();
    return received;
}

int on_add(disk_manager* manager, const char* dev_name)
{
    const time_t now = time(nullptr);
    manager->t_refresh = now;
    manager->t_update = now;
    manager->state = MANAGER_ACTIVE;
    manager->changed = 1;
    manager->update_due = 1;
    // An old record would make the inventory refuse the new disk of its name.
    forget_replaced_disks(&manager->disks);
    return disk_sets_add_dev(&manager->disks, dev_name);
}

int on_remove_dev(disk_manager* manager, const char* dev_name)
{
    const event_pipes* pipes = &manager->pipes;
    manager->changed = 1;
    remove_told_dev(&manager->disks, dev_name, pipes->event_fd == pipes->fd_add_remove);
    return 0;
}

int on_remove_disk(disk_manager* manager, const char* dir_name)
{
    manager->changed = 1;
    remove_told_dir(&manager->disks, dir_name);
    return 0;
}

// For the rest of the process's life: docs/limits.md, "It ends when nobody needs it".
void lengthen_sys_timeout()
{
    int32_t* seconds = &life.sys_timeout;
    if (*seconds <= INT32_MAX / SYS_TIMEOUT_FACTOR) {
        *seconds *= SYS_TIMEOUT_FACTOR;
    }
}

int on_safe_remove(disk_manager* manager)
{
    log_info("===> safe remove disk\n");
    remove_told_all(&manager->disks);
    disk_sets_publish(&manager->disks);
    // docs/limits.md, "After a safe removal only disks that are plugged or announced again come
    // back".
    manager->state = MANAGER_SAFE_REMOVED;
    lengthen_sys_timeout();
    return 0;
}

void publish_when_due(disk_manager* manager, time_t now)
{
    log_info("=== === ===> update = %d\n", manager->changed);
    if (manager->changed == 1) {
        manager->t_publish = now;
        manager->changed = 0;
        disk_sets_publish(&manager->disks);
    } else if (now - manager->t_publish > PUBLISH_AFTER_SECONDS) {
        // t_publish stays on purpose: with no change for so long the files are written in every
        // idle cycle, which keeps the free space in them fresh.
        disk_sets_publish(&manager->disks);
    }
}

void rescan(disk_manager* manager)
{
    int32_t came_or_went = 0;
    // A list that could not be read is tried again next time. The mounts can be checked without it.
    static_cast<void>(rescan_block_devices(&manager->disks, &came_or_went));
    if (came_or_went == 1) {
        manager->changed = 1;
        // A publication before its first mount pass would drop a new disk as empty.
        manager->update_due = 1;
    }
}

// The memory of places cannot be trusted: the daemon starts again with a fresh database.
void start_afresh()
{
    file_delete(DISK_DB_FILE);
    running = 0;
    restart_requested = 1;
}

void do_periodic_work(disk_manager* manager)
{
    const time_t now = time(nullptr);
    if (!path_exists(DISK_JSON_FILE)) {
        manager->changed = 1;
    }
    if (now - manager->t_refresh > REFRESH_AFTER_SECONDS) {
        manager->t_refresh = now;
        disk_sets_refresh_sizes(&manager->disks);
    }
    if (now - manager->t_update >= UPDATE_EVERY_SECONDS || manager->update_due == 1) {
        manager->t_update = now;
        manager->update_due = 0;
        const int before = disk_sets_count(&manager->disks);
        mount_all_present(&manager->disks);
        // The pass forgets disks that were pulled.
        manager->changed |= disk_sets_count(&manager->disks) != before ? 1 : 0;
    }
    publish_when_due(manager, now);
    if (now - manager->t_rescan < RESCAN_EVERY_SECONDS) {
        return;
    }
    manager->t_rescan = now;
    rescan(manager);
    if (!self_check(&manager->disks, &manager->changed)) {
        start_afresh();
    }
}

// The first mount pass, of what a start-up scan has found.
void activate(disk_manager* manager, bool mount_known)
{
    manager->state = MANAGER_ACTIVE;
    disk_sets_refresh_sizes(&manager->disks);
    if (mount_known) {
        check_disks_mounted(&manager->disks);
    }
    mount_all_present(&manager->disks);
    disk_sets_publish(&manager->disks);
}

}  // namespace

constinit std::atomic<int32_t>& running = life.running;
constinit int32_t& restart_requested = life.restart_requested;

disk_manager* manager_get()
{
    return &the_manager;
}

int manager_init(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    memset(manager, 0, sizeof(*manager));
    if (disk_sets_init(&manager->disks) != 0 || event_pipes_open(&manager->pipes) != 0) {
        return 1;
    }
    manager->state = MANAGER_INITIALISED;
    return 0;
}

int manager_free(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    event_pipes_close(&manager->pipes);
    disk_sets_free(&manager->disks);
    return 0;
}

int manager_scan(disk_manager* manager, int32_t mount_known)
{
    if (manager == nullptr) {
        return 1;
    }
    switch (add_all_disks(&manager->disks)) {
        case SCAN_FAILED:
            return 1;
        case SCAN_NO_DISK:
            // The state stays: docs/limits.md, "Nothing is rescanned before the first disk".
            disk_status_write_empty_json();
            return 0;
        case SCAN_HAS_DISK:
            activate(manager, mount_known == 1);
            return 0;
    }
    return 1;
}

int manager_run(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    // Without the kernel's list there are still the events.
    manager_scan(manager, 0);
    while (running == 1) {
        manager_event_loop(manager);
        // The loop ends only when running is 0: this tear-down and rebuild happens once, at the
        // end. Its messages mark the end of the run, and the caller frees the rebuilt manager.
        manager_free(manager);
        if (manager_init(manager) != 0) {
            return 0;
        }
        log_info("manager work again!\n");
    }
    return 0;
}

int manager_event_loop(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    // The system's clock, for this and for all timers: docs/limits.md, "A clock that jumps".
    time_t last = time(nullptr);
    while (running == 1) {
        const time_t now = time(nullptr);
        if (!is_needed(&last, now)) {
            running = 0;
        } else if (receive_event(manager)) {
            last = now;
            manager_dispatch(manager);
        } else {
            // A warning although nothing is wrong: people who read the log expect the line.
            log_warn("no event ...\n");
            manager_idle(manager);
        }
    }
    // What ended the loop is logged before what follows it.
    report_signals();
    return 0;
}

int manager_dispatch(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    const disk_event* event = &manager->pipes.event;
    log_info("===> get event = %s\n", event_name(event->type));
    char name[EVENT_NAME_SIZE + 1];
    text_copy_n(name, event->dev_name, EVENT_NAME_SIZE);

    switch (event->type) {
        case EVENT_DISK_ADD:
            return on_add(manager, name);
        case EVENT_DISK_REMOVE_DEV:
            return on_remove_dev(manager, name);
        case EVENT_DISK_REMOVE_DISK:
            return on_remove_disk(manager, name);
        case EVENT_DISK_SAFE_REMOVE:
            return on_safe_remove(manager);
        case EVENT_DISK_HEART_BEAT:
            return 0;
        case EVENT_NONE:
        case EVENT_CODE_END:
            break;
    }
    log_err("err event type = %d\n", event->type);
    return 1;
}

int manager_idle(disk_manager* manager)
{
    if (manager == nullptr) {
        return 1;
    }
    switch (static_cast<manager_state>(manager->state)) {
        case MANAGER_NOT_SET_UP:
        case MANAGER_INITIALISED:
            return 0;
        case MANAGER_ACTIVE:
            do_periodic_work(manager);
            return 0;
        case MANAGER_SAFE_REMOVED:
            log_warn("disk safe remove ...\n");
            pause_seconds(1);
            return 0;
    }
    return 0;
}

void loop_run_stop()
{
    running = 0;
}

void manager_set_signal_report(void (*report)())
{
    life.report_signals = report;
}

void manager_life_reset()
{
    life.running = 1;
    life.restart_requested = 0;
    life.sys_timeout = manager_life{}.sys_timeout;
    life.report_signals = nullptr;
}
