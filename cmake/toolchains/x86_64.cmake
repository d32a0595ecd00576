# 64-bit x86, its first instruction set.

set(cross_arch x86_64)
set(cross_target x86_64-linux-musl)
set(cross_cpu x86_64)
include("${CMAKE_CURRENT_LIST_DIR}/zig.cmake")
