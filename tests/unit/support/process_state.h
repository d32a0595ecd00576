// What the daemon keeps for the life of its process, put back at both ends of a test: its modules'
// states, and what is done on its signals.
#pragma once

#include <csignal>
#include <cstddef>
#include <iterator>

#include "log/log.h"
#include "main/options.h"
#include "main/signals.h"
#include "manager/manager.h"
#include "manager/rescan.h"
#include "manager/services.h"

namespace support {

class fresh_process {
public:
    fresh_process()
    {
        for (size_t i = 0; i < std::size(handled); ++i) {
            sigaction(handled[i], nullptr, &kept[i]);
        }
        forget();
    }

    ~fresh_process()
    {
        for (size_t i = 0; i < std::size(handled); ++i) {
            sigaction(handled[i], &kept[i], nullptr);
        }
        forget();
    }

    fresh_process(const fresh_process&) = delete;
    fresh_process& operator=(const fresh_process&) = delete;

private:
    static constexpr int handled[] = {SIGTERM, SIGPIPE, SIGUSR1, SIGUSR2,
                                      SIGALRM, SIGHUP,  SIGCHLD, SIGINT};
    struct sigaction kept[std::size(handled)]{};

    static void forget()
    {
        log_reset();
        signals_reset();
        manager_life_reset();
        rescan_reset();
        firewall_rule_reset();
        block_input_mode = 0;
    }
};

}  // namespace support
