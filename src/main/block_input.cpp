#include "main/block_input.h"

#include "log/log.h"
#include "main/environment.h"
#include "main/signals.h"
#include "main/single_instance.h"
#include "manager/manager.h"
#include "manager/signal_inbox.h"
#include "util/file.h"
#include "util/paths.h"

int run_block_input_mode(int argc, char* argv[])
{
    static_cast<void>(argc);
    static_cast<void>(argv);
    log_info("disk manage run block input\n");
    if (check_single_instance() != 0) {
        return 1;
    }
    setup_signals();
    init_block_input_environment();

    disk_manager* manager = manager_get();
    if (manager_init(manager) == 0) {
        manager_scan(manager, 1);
        manager_event_loop(manager);
    }
    manager_free(manager);
    signal_inbox_report();
    file_delete(PID_FILE);
    if (restart_requested != 0) {
        restart_self();
    }
    return 0;
}
