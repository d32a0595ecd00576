#include <csignal>
#include <cstdio>

#include "log/log.h"
#include "main/options.h"
#include "main/run.h"

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
    return block_input_mode == 1 ? run_block_input_mode(argc, argv) : run_daemon();
}
