# 64-bit ARM, any ARMv8-A processor.

set(cross_arch aarch64)
set(cross_target aarch64-linux-musl)
set(cross_cpu generic)
include("${CMAKE_CURRENT_LIST_DIR}/zig.cmake")
