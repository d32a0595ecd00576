#pragma once

#include <sys/vfs.h>

#include <algorithm>
#include <cstring>

#include "support/clock.h"
#include "support/disk_world.h"
#include "support/records.h"
#include "support/support.h"
#include "util/paths.h"
#include "util/text.h"

namespace support_disk = support;
