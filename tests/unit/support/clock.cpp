#include "support/clock.h"

#include <cerrno>

namespace support {

clock_control the_clock;

fake_clock::fake_clock(time_t start)
{
    the_clock = {};
    the_clock.fake = true;
    the_clock.now = start;
    the_clock.skip_sleeps = true;
}

fake_clock::~fake_clock()
{
    the_clock = {};
}

skipped_sleeps::skipped_sleeps()
{
    the_clock = {};
    the_clock.skip_sleeps = true;
}

skipped_sleeps::~skipped_sleeps()
{
    the_clock = {};
}

}  // namespace support

using support::the_clock;

// Both stand in front of the C library's.
extern "C" time_t time(time_t* timer)
{
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    time_t result = now.tv_sec;
    if (the_clock.fake) {
        ++the_clock.looks;
        if (the_clock.on_look) {
            the_clock.on_look(the_clock.looks);
        }
        result = the_clock.now;
        the_clock.now += the_clock.step;
    }
    if (timer != nullptr) {
        *timer = result;
    }
    return result;
}

extern "C" int nanosleep(const timespec* requested_time, timespec* remaining)
{
    if (!the_clock.skip_sleeps) {
        errno = clock_nanosleep(CLOCK_MONOTONIC, 0, requested_time, remaining);
        return errno == 0 ? 0 : -1;
    }
    the_clock.slept_ms += requested_time->tv_sec * 1000 + requested_time->tv_nsec / 1000000;
    if (the_clock.on_sleep) {
        the_clock.on_sleep();
    }
    return 0;
}
