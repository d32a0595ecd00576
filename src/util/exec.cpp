#include "util/exec.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "log/log.h"

namespace {

constexpr int DEFAULT_ATTEMPTS = 5;
constexpr int MAX_ATTEMPTS = 9;
constexpr int TERMINATED_BY_SIGNAL_MASK = 0x7F;

}  // namespace

int run_system(const char* command)
{
    const auto previous = signal(SIGCHLD, SIG_DFL);
    const int status = system(command);
    if (previous != SIG_ERR) {
        signal(SIGCHLD, previous);
    }
    return status;
}

int exec_cmd(const char* command, int attempts, const char* file, int line)
{
    const bool in_range = attempts >= 1 && attempts <= MAX_ATTEMPTS;
    const int limit = in_range ? attempts : DEFAULT_ATTEMPTS;

    for (int attempt = 0; attempt < limit; ++attempt) {
        log_print_stdout("%s(%d)exec cmd = %s\n", file, line, command);

        // The exit code is not looked at: callers read the outcome back from the system.
        const int status = run_system(command);
        if ((status & TERMINATED_BY_SIGNAL_MASK) == 0) {
            return 0;
        }

        perror("err:");
        log_print_stdout("%s(%d)exec cmd = %s, ret = %d\n", file, line, command, status);
    }
    return 1;
}
