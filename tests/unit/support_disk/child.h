#pragma once

#include "support/child.h"
#include "support/support.h"

namespace support_disk = support;
