// The daemon's one long-lived object: owns the event pipes and the inventory, acts on events and
// keeps mounts and status files up to date between them.
#pragma once

#include <atomic>
#include <cstdint>
#include <ctime>

#include "disk/disk_sets.h"
#include "manager/event_pipes.h"

enum manager_state : int32_t {
    MANAGER_NOT_SET_UP = 0,
    MANAGER_INITIALISED = 1,   // no disk seen yet: no timer work
    MANAGER_ACTIVE = 3,        // disks known
    MANAGER_SAFE_REMOVED = 4,  // parked until the next "add"
};

struct disk_manager {
    int32_t state;  // a manager_state
    event_pipes pipes;
    disk_sets disks;
    time_t t_refresh;    // last size refresh
    time_t t_update;     // last mount pass
    int32_t changed;     // the status files must be written
    int32_t update_due;  // a mount pass must run in the next idle cycle
    time_t t_publish;    // last publication of a change
    time_t t_rescan;     // last look at /sys/block
};

// 0 asks the loop to stop, also from the signal handler. At first 1.
extern std::atomic<int32_t>& running;

// 1 when the daemon is to be started again after its end.
extern int32_t& restart_requested;

// The one manager, never null.
disk_manager* manager_get();

// Results are 0 or 1; a null manager gives 1.

// Zeroes the manager, then sets up inventory and pipes.
int manager_init(disk_manager* manager);
int manager_free(disk_manager* manager);

// The start-up scan of /sys/block: adds, mounts and publishes every disk. With mount_known 1 it
// first takes over what is mounted already. 1 when /sys/block cannot be opened.
int manager_scan(disk_manager* manager, int32_t mount_known);

// Scan and loop, until the loop is asked to stop.
int manager_run(disk_manager* manager);

// The loop alone: one event or one idle cycle at a time, until running is 0. Then 0.
int manager_event_loop(disk_manager* manager);

// Acts on the current event of the manager's pipes. Its result; 1 for a code that is no event.
int manager_dispatch(disk_manager* manager);

// The work of a cycle without an event.
int manager_idle(disk_manager* manager);

// Asks the loop to end after its current cycle.
void loop_run_stop();

// The loop calls report before and after each wait and at its end, when nothing of its work is half
// done: there the messages of signals may be printed. Null, as at first, for none.
void manager_set_signal_report(void (*report)());

// Puts what lasts as long as the process back to its beginning: the two flags above, the limit of
// silence and the report. For tests.
void manager_life_reset();
