// The test program's own time() and nanosleep(): real unless a test says otherwise.
#pragma once

#include <cstdint>
#include <ctime>
#include <functional>

namespace support {

struct clock_control {
    bool fake = false;
    time_t now = 0;
    time_t step = 0;                   // added after every look at the clock
    int looks = 0;                     // calls of time() while the clock is fake
    std::function<void(int)> on_look;  // told the number of the look, from 1
    bool skip_sleeps = false;
    int64_t slept_ms = 0;  // asked for while sleeps are skipped
    std::function<void()> on_sleep;
};

extern clock_control the_clock;

// Freezes the clock and skips sleeps until the end of the scope.
struct fake_clock {
    explicit fake_clock(time_t start);
    ~fake_clock();
    fake_clock(const fake_clock&) = delete;
    fake_clock& operator=(const fake_clock&) = delete;
};

// Skips sleeps alone.
struct skipped_sleeps {
    skipped_sleeps();
    ~skipped_sleeps();
    skipped_sleeps(const skipped_sleeps&) = delete;
    skipped_sleeps& operator=(const skipped_sleeps&) = delete;
};

}  // namespace support
