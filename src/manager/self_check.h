// Whether what is mounted is what the inventory can explain.
#pragma once

#include <cstdint>

#include "disk/disk_sets.h"

// False when two mounts share a directory or a mount has lost its device, and no pulled disk
// explains it: the memory of places cannot be trusted. Disks that were pulled since the last look
// are forgotten, which sets changed.
[[nodiscard]] bool self_check(disk_sets* disks, int32_t* changed);
