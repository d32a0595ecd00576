#include "main/signals.h"

#include <cerrno>
#include <csignal>
#include <initializer_list>

#include "log/log.h"
#include "manager/manager.h"

volatile int32_t sigint_count = 0;

namespace {

// The first SIGINT is only logged, so that a stray one does not take the disks away.
void on_sigint()
{
    const int32_t count = sigint_count;
    log_info("get sig = SIGINT, c = %d\n", count);
    sigint_count = count + 1;
    if (sigint_count > 1) {
        loop_run_stop();
    }
}

void on_signal(int sig)
{
    const int saved_errno = errno;
    switch (sig) {
        case SIGUSR2:
            log_enable_syslog();
            break;
        case SIGPIPE:
            log_info("get sig = SIGPIPE\n");
            break;
        case SIGINT:
            on_sigint();
            break;
        default:
            log_warn("*** *** get sig = %d\n", sig);
            break;
    }
    errno = saved_errno;
}

}  // namespace

int setup_signals()
{
    signal(SIGTERM, SIG_IGN);
    for (const int sig : {SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT}) {
        signal(sig, on_signal);
    }
    return 0;
}
