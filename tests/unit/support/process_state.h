// What the daemon keeps for the life of its process.
#pragma once

#include <csignal>
#include <cstddef>

namespace support {

// Puts it back at both ends of a test: the states of its modules, and what is done on its signals.
class fresh_process {
public:
    fresh_process();
    ~fresh_process();
    fresh_process(const fresh_process&) = delete;
    fresh_process& operator=(const fresh_process&) = delete;

private:
    static constexpr size_t handled_signals = 8;
    struct sigaction kept[handled_signals] {};
};

}  // namespace support
