#include "main/signals.h"

#include <unistd.h>

#include <csignal>
#include <initializer_list>

#include "log/log.h"
#include "manager/manager.h"
#include "manager/signal_inbox.h"

volatile int32_t sigint_count = 0;

namespace {

// A reader of our output that went away raises SIGPIPE at every line of ours. Telling of it would
// raise the next one, for ever.
bool is_of_our_own_writing(const siginfo_t* info)
{
    return info->si_signo == SIGPIPE && info->si_code == SI_USER && info->si_pid == getpid();
}

// May interrupt anything: counts and sets flags, nothing else.
void on_signal(int sig, siginfo_t* info, void* context)
{
    static_cast<void>(context);
    if (sig == SIGUSR2) {
        log_enable_syslog();
        return;
    }
    if (is_of_our_own_writing(info)) {
        return;
    }
    signal_inbox_note(sig);
    // The first SIGINT only shows in the log, so that a stray one does not take the disks away.
    if (sig == SIGINT) {
        sigint_count = sigint_count + 1;
        if (sigint_count > 1) {
            loop_run_stop();
        }
    }
}

}  // namespace

int setup_signals()
{
    signal(SIGTERM, SIG_IGN);
    struct sigaction action {};
    action.sa_sigaction = on_signal;
    action.sa_flags = SA_SIGINFO | SA_RESTART;
    for (const int sig : {SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT}) {
        sigaction(sig, &action, nullptr);
    }
    return 0;
}
