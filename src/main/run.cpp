#include "main/run.h"

#include <unistd.h>

#include <cstdint>
#include <cstring>

#include "disk/mount_point.h"
#include "log/log.h"
#include "main/signals.h"
#include "manager/manager.h"
#include "util/claim.h"
#include "util/device.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/scratch.h"
#include "util/text.h"

namespace {

constexpr size_t PID_FILE_TEXT_SIZE = 32 + 1;
constexpr size_t PID_LIST_SIZE = 128 + 1;
constexpr size_t PID_TEXT_SIZE = 16;
constexpr scratch_query PGREP_QUERY{
    .path = SCRATCH_PGREP, .end = SCRATCH_DELETED, .starts_clear = true};

// In what the two kinds of run differ.
struct run_kind {
    int (*prepare)();
    int (*work)(disk_manager* manager);
    bool has_log_file;
};

// A plain substring search on purpose: docs/limits.md, "A stale pid file". An empty one, left by a
// full /tmp, names no process.
bool is_listed(const char* pid_text, const char* list)
{
    return pid_text[0] != '\0' && strstr(list, pid_text) != nullptr;
}

int scan_known_and_loop(disk_manager* manager)
{
    // Without the kernel's list there are still the events.
    manager_scan(manager, 1);
    return manager_event_loop(manager);
}

constexpr run_kind ORDINARY = {init_environment, manager_run, true};
constexpr run_kind BLOCK_INPUT = {init_block_input_environment, scan_known_and_loop, false};

int run(const run_kind& kind)
{
    if (check_single_instance() != 0) {
        return 1;
    }
    setup_signals();
    kind.prepare();

    disk_manager* manager = manager_get();
    if (manager_init(manager) == 0) {
        kind.work(manager);
    }
    manager_free(manager);
    signals_report();
    if (kind.has_log_file) {
        log_file_close();
    }
    file_delete(PID_FILE);
    // After the pid file is gone: the new instance must not take us for a second one.
    if (restart_requested != 0) {
        restart_self();
    }
    return 0;
}

}  // namespace

int check_single_instance()
{
    // A pid file in somebody else's directory says nothing of ours. What cannot be moved aside
    // stops the pid file and the pipes from being made there, which is logged.
    claim_path(RUNTIME_DIR);
    if (!path_exists(PID_FILE)) {
        log_info("===> pid Not exist, file = %s\n", PID_FILE);
        return 0;
    }
    char pid_text[PID_FILE_TEXT_SIZE];
    file_read_text(PID_FILE, pid_text);
    // The pids of all processes whose command line names the daemon, this one included.
    char list[PID_LIST_SIZE];
    const bool listed =
        scratch_read(PGREP_QUERY, list, "pgrep -f tarn_nas_diskmanager > %s", {SCRATCH_PGREP});
    log_info("pid sets = %s\n", list);
    log_info("cur pid = %s\n", pid_text);

    if (listed && is_listed(pid_text, list)) {
        log_info("===> pid exist, file = %s\n", PID_FILE);
        return 1;
    }
    file_delete(PID_FILE);
    log_info("===> pid Not exist, file = %s\n", PID_FILE);
    return 0;
}

void write_pid_file()
{
    if (dir_make_own(RUNTIME_DIR) != 0) {
        return;
    }
    char text[PID_TEXT_SIZE];
    text_format(text, "%d", static_cast<int>(getpid()));
    file_write(PID_FILE, text, static_cast<int32_t>(strlen(text)));
}

int init_environment()
{
    // Nothing is ever written to it: docs/limits.md, "The log is copious".
    log_file_open();
    write_pid_file();
    dir_make_own(MOUNT_BASE);
    dir_make(CONFIG_DIR);
    umount_all_force();
    file_delete(HOTPLUG_MOUNT_HOOK);
    init_hook();
    return 0;
}

int init_block_input_environment()
{
    write_pid_file();
    dir_make_own(MOUNT_BASE);
    init_hook();
    return 0;
}

int run_daemon()
{
    return run(ORDINARY);
}

int run_block_input_mode(int argc, char* argv[])
{
    static_cast<void>(argc);
    static_cast<void>(argv);
    log_info("disk manage run block input\n");
    return run(BLOCK_INPUT);
}

int restart_self()
{
    exec_cmd(RESTART_DAEMON, 1);
    return 0;
}
