# Little-endian MIPS 24kc: MIPS32 release 2 without a floating-point unit.

set(cross_arch mipsel)
set(cross_target mipsel-linux-musleabi)
set(cross_cpu mips32r2+soft_float)
include("${CMAKE_CURRENT_LIST_DIR}/zig.cmake")
