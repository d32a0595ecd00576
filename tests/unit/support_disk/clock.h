#pragma once

#include "support/clock.h"
#include "support/support.h"

namespace support_disk = support;
