#include "main/signals.h"

#include <unistd.h>

#include <csignal>
#include <iterator>

#include "log/log.h"
#include "manager/manager.h"

namespace {

void on_sigint();
void log_sigpipe(int sig);
void log_sigint(int sig);
void log_other(int sig);

struct signal_kind {
    int sig;
    void (*act)();         // in the handler, which may interrupt anything: sets flags, nothing else
    void (*log)(int sig);  // from the loop, once for each that arrived; null when nothing is said
};

// In the order in which they are installed and logged.
constexpr signal_kind KINDS[] = {
    {SIGPIPE, nullptr, log_sigpipe},       {SIGUSR1, nullptr, log_other},
    {SIGUSR2, log_enable_syslog, nullptr}, {SIGALRM, nullptr, log_other},
    {SIGHUP, nullptr, log_other},          {SIGCHLD, nullptr, log_other},
    {SIGINT, on_sigint, log_sigint},
};

struct signal_state {
    std::atomic<int32_t> sigint_count{0};
    std::atomic<uint32_t> arrived[std::size(KINDS)];  // and not logged yet
    int32_t sigints_logged = 0;
};

static_assert(std::atomic<uint32_t>::is_always_lock_free &&
                  std::atomic<int32_t>::is_always_lock_free,
              "a handler must never wait for what it interrupted");

constinit signal_state state;

// The first SIGINT only shows in the log, so that a stray one does not take the disks away.
void on_sigint()
{
    if (state.sigint_count.fetch_add(1) > 0) {
        loop_run_stop();
    }
}

void log_sigpipe(int sig)
{
    static_cast<void>(sig);
    log_info("get sig = SIGPIPE\n");
}

// Counts from the first one in the life of the process.
void log_sigint(int sig)
{
    static_cast<void>(sig);
    log_info("get sig = SIGINT, c = %d\n", state.sigints_logged++);
}

void log_other(int sig)
{
    log_warn("*** *** get sig = %d\n", sig);
}

// A reader of our output that went away raises SIGPIPE at every line of ours. A message about it
// would raise the next one, for ever.
bool is_of_our_own_writing(const siginfo_t* info)
{
    return info->si_signo == SIGPIPE && info->si_code == SI_USER && info->si_pid == getpid();
}

// No lock, no memory, errno untouched.
void on_signal(int sig, siginfo_t* info, void* context)
{
    static_cast<void>(context);
    if (is_of_our_own_writing(info)) {
        return;
    }
    for (size_t i = 0; i < std::size(KINDS); ++i) {
        if (KINDS[i].sig != sig) {
            continue;
        }
        state.arrived[i].fetch_add(1);
        if (KINDS[i].act != nullptr) {
            KINDS[i].act();
        }
    }
}

}  // namespace

constinit std::atomic<int32_t>& sigint_count = state.sigint_count;

int setup_signals()
{
    // On purpose, and commands inherit it: docs/limits.md, "One SIGINT can be lost". Neither this
    // nor sigaction can fail for these signals.
    signal(SIGTERM, SIG_IGN);
    struct sigaction action {};
    action.sa_sigaction = on_signal;
    action.sa_flags = SA_SIGINFO | SA_RESTART;
    for (const signal_kind& kind : KINDS) {
        sigaction(kind.sig, &action, nullptr);
    }
    manager_set_signal_report(signals_report);
    return 0;
}

void signals_report()
{
    for (size_t i = 0; i < std::size(KINDS); ++i) {
        const uint32_t count = state.arrived[i].exchange(0);
        for (uint32_t logged = 0; logged < count && KINDS[i].log != nullptr; ++logged) {
            KINDS[i].log(KINDS[i].sig);
        }
    }
}

void signals_reset()
{
    state.sigint_count = 0;
    for (std::atomic<uint32_t>& count : state.arrived) {
        count = 0;
    }
    state.sigints_logged = 0;
}
