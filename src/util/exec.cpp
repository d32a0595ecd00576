#include "util/exec.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "log/log.h"
#include "util/claim.h"

namespace {

constexpr int DEFAULT_ATTEMPTS = 5;
constexpr int MAX_ATTEMPTS = 9;
constexpr int TERMINATED_BY_SIGNAL_MASK = 0x7F;

}  // namespace

int run_system(const char* command)
{
    struct sigaction standard {};
    struct sigaction previous {};
    standard.sa_handler = SIG_DFL;
    const bool changed = sigaction(SIGCHLD, &standard, &previous) == 0;
    // A SIGINT that arrives meanwhile is lost: "One SIGINT can be lost" in docs/limits.md.
    const int status = system(command);
    if (changed) {
        sigaction(SIGCHLD, &previous, nullptr);
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

int exec_cmd_into(const char* command, const char* path, const char* file, int line)
{
    if (claim_file(path) != 0) {
        return -1;
    }
    return exec_cmd(command, 1, file, line);
}
