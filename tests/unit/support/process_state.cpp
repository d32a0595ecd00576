#include "support/process_state.h"

#include <iterator>

#include "disk/pulled.h"
#include "log/log.h"
#include "main/options.h"
#include "main/signals.h"
#include "manager/manager.h"
#include "manager/rescan.h"
#include "manager/services.h"

namespace support {
namespace {

constexpr int HANDLED[] = {SIGTERM, SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT};

void forget()
{
    log_reset();
    signals_reset();
    manager_life_reset();
    pulled_reset();
    rescan_reset();
    firewall_rule_reset();
    block_input_mode = 0;
}

}  // namespace

fresh_process::fresh_process()
{
    static_assert(std::size(HANDLED) == handled_signals);
    for (size_t i = 0; i < handled_signals; ++i) {
        sigaction(HANDLED[i], nullptr, &kept[i]);
    }
    forget();
}

fresh_process::~fresh_process()
{
    for (size_t i = 0; i < handled_signals; ++i) {
        sigaction(HANDLED[i], &kept[i], nullptr);
    }
    forget();
}

}  // namespace support
