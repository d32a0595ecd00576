#include "manager/signal_inbox.h"

#include <atomic>
#include <csignal>
#include <cstdint>
#include <iterator>

#include "log/log.h"

namespace {

using counter = std::atomic<uint32_t>;

static_assert(counter::is_always_lock_free, "a handler must never wait for what it interrupted");

void log_sigpipe(int sig)
{
    static_cast<void>(sig);
    log_info("get sig = SIGPIPE\n");
}

// Counts from the first one in the life of the process.
void log_sigint(int sig)
{
    static_cast<void>(sig);
    static int32_t told = 0;
    log_info("get sig = SIGINT, c = %d\n", told++);
}

void log_other(int sig)
{
    log_warn("*** *** get sig = %d\n", sig);
}

struct noted_kind {
    int sig;
    void (*tell)(int sig);
};

constexpr noted_kind KINDS[] = {
    {SIGPIPE, log_sigpipe}, {SIGUSR1, log_other}, {SIGALRM, log_other},
    {SIGHUP, log_other},    {SIGCHLD, log_other}, {SIGINT, log_sigint},
};

counter noted[std::size(KINDS)];

}  // namespace

void signal_inbox_note(int sig)
{
    for (size_t i = 0; i < std::size(KINDS); ++i) {
        if (KINDS[i].sig == sig) {
            noted[i].fetch_add(1, std::memory_order_relaxed);
        }
    }
}

void signal_inbox_report()
{
    for (size_t i = 0; i < std::size(KINDS); ++i) {
        const uint32_t count = noted[i].exchange(0, std::memory_order_relaxed);
        for (uint32_t told = 0; told < count; ++told) {
            KINDS[i].tell(KINDS[i].sig);
        }
    }
}
