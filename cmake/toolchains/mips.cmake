# Big-endian MIPS 24kc: MIPS32 release 2 without a floating-point unit.

set(cross_arch mips)
set(cross_target mips-linux-musleabi)
set(cross_cpu mips32r2+soft_float)
include("${CMAKE_CURRENT_LIST_DIR}/zig.cmake")
