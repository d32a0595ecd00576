#include "util/pause.h"

#include <gtest/gtest.h>

#include "support/clock.h"

TEST(Pause, each_asks_for_its_whole_time)
{
    const support::skipped_sleeps no_sleep;
    pause_seconds(2);
    EXPECT_EQ(support::the_clock.slept_ms, 2000);
    for (const int milliseconds : {0, 1, 999, 1000, 5250}) {
        support::the_clock.slept_ms = 0;
        pause_milliseconds(milliseconds);
        EXPECT_EQ(support::the_clock.slept_ms, milliseconds);
    }
}
