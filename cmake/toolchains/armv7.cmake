# 32-bit ARMv7-A with the hard-float calling convention; no NEON, which some router processors lack.

set(cross_arch armv7)
set(cross_target arm-linux-musleabihf)
set(cross_cpu generic+v7a+vfp3d16+thumb2)
include("${CMAKE_CURRENT_LIST_DIR}/zig.cmake")
