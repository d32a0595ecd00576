#include <csignal>
#include <cstdio>

#include "log/log.h"
#include "main/block_input.h"
#include "main/environment.h"
#include "main/options.h"
#include "main/signals.h"
#include "main/single_instance.h"
#include "manager/manager.h"
#include "manager/signal_inbox.h"
#include "util/file.h"
#include "util/paths.h"

namespace {

void run_daemon()
{
    setup_signals();
    init_environment();

    disk_manager* manager = manager_get();
    if (manager_init(manager) == 0) {
        manager_run(manager);
    }
    manager_free(manager);
    signal_inbox_report();
    log_file_close();
    file_delete(PID_FILE);
    // After the pid file is gone: the new instance must not take us for a second one.
    if (restart_requested != 0) {
        restart_self();
    }
}

}  // namespace

int main(int argc, char* argv[])
{
    // A supervisor that reads our output sees each line at once, in order with the commands'.
    setvbuf(stdout, nullptr, _IOLBF, 0);
    // Nor does a reader that went away end us before the handlers are in place.
    signal(SIGPIPE, SIG_IGN);
    log_set_debug();
    if (parse_options(argc, argv) != 0) {
        return 1;
    }
    if (block_input_mode == 1) {
        return run_block_input_mode(argc, argv);
    }
    if (check_single_instance() != 0) {
        return 1;
    }
    run_daemon();
    return 0;
}
