// How long the daemon waits for what, in milliseconds: a table for each choice of
// DISKMANAGER_WAITS.
#pragma once

#include <span>

struct wait_table {
    // Before each look at the mount table after a mount command.
    std::span<const int> mount;
    // Before each look after a further umount command; the look after the last one comes with the
    // next such command.
    std::span<const int> umount;
    // The silence that ends a cycle of the loop: while something is to be mounted or published, and
    // otherwise.
    int work_due;
    int idle;
};

namespace waits {

inline constexpr int STEADY_MOUNT[] = {2000, 2000, 2000, 2000, 2000, 2000, 2000, 2000, 2000};
inline constexpr int STEADY_UMOUNT[] = {1000};
inline constexpr wait_table steady = {STEADY_MOUNT, STEADY_UMOUNT, 3000, 3000};

// The same in all: a command that has done its work is not waited for, one that needs its time gets
// it. The messages of one plugged disk come within a few milliseconds of each other.
inline constexpr int PROMPT_MOUNT[] = {0, 50, 100, 200, 400, 800, 1600, 3200, 6400, 5250};
inline constexpr int PROMPT_UMOUNT[] = {0, 50, 100, 200, 400, 250};
inline constexpr wait_table prompt = {PROMPT_MOUNT, PROMPT_UMOUNT, 100, 3000};

}  // namespace waits

// Those of this build. CMake names one of the two.
inline constexpr const wait_table& WAITS = waits::DISKMANAGER_WAITS;
