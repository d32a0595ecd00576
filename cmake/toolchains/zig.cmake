# The common part of the cross builds: static programs for a router with musl, made by the clang, musl and libc++ that
# one zig carries. The file of an architecture sets before it includes this one:
#   cross_arch     the architecture's name here, also the folder below build/cross
#   cross_target   zig's name of the target
#   cross_cpu      the processor's instruction set, in zig's words
# scripts/cross installs zig; CROSS_ZIG in the environment names another one.

cmake_path(SET cross_root NORMALIZE "${CMAKE_CURRENT_LIST_DIR}/../../build/cross")
set(cross_tools "${cross_root}/${cross_arch}/tools")
set(cross_zig "${cross_root}/zig/zig")
if(DEFINED ENV{CROSS_ZIG})
    set(cross_zig "$ENV{CROSS_ZIG}")
endif()
if(NOT EXISTS "${cross_zig}")
    message(FATAL_ERROR "no zig at ${cross_zig}: run scripts/cross")
endif()

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ${cross_arch})

# CMake wants one program for each tool, zig is one program for all.
function(cross_write_tool name command)
    file(CONFIGURE OUTPUT "${cross_tools}/${name}" @ONLY CONTENT [=[#!/bin/sh
export ZIG_GLOBAL_CACHE_DIR='@cross_root@/zig-cache' ZIG_LOCAL_CACHE_DIR='@cross_root@/zig-cache'
# zig knows more linker options behind "-Wl," than behind "-Xlinker", which CMake uses. It knows none for one exported
# symbol, and a static program has no table to export into; "-u" keeps the symbol.
previous=
linker=
for arg do
    shift
    case $previous$arg in
        -Xlinker | -Xlinker--export-dynamic-symbol=*) ;;
        -Xlinker*) linker=$linker,$arg ;;
        *) set -- "$@" "$arg" ;;
    esac
    previous=
    [ "$arg" != -Xlinker ] || previous=$arg
done
exec '@cross_zig@' @command@ "$@" ${linker:+"-Wl$linker"}
]=])
    file(CHMOD "${cross_tools}/${name}" PERMISSIONS
        OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
endfunction()

# Without an -O option zig would switch the undefined-behaviour sanitizer on.
set(cross_compile "-target ${cross_target} -mcpu=${cross_cpu} -fno-sanitize=undefined")
cross_write_tool(cc "cc ${cross_compile}")
cross_write_tool(c++ "c++ ${cross_compile}")
cross_write_tool(ar ar)
cross_write_tool(ranlib ranlib)

set(CMAKE_C_COMPILER "${cross_tools}/cc")
set(CMAKE_CXX_COMPILER "${cross_tools}/c++")
foreach(language IN ITEMS C CXX)
    set(CMAKE_${language}_COMPILER_AR "${cross_tools}/ar")
    set(CMAKE_${language}_COMPILER_RANLIB "${cross_tools}/ranlib")
    # The linker drops what nothing uses only from sections of their own. Nobody unwinds the stack of a program without
    # exceptions; where a C++ program has them (the unit tests), the compiler keeps its tables all the same.
    set(CMAKE_${language}_FLAGS_INIT
        "-ffunction-sections -fdata-sections -fno-asynchronous-unwind-tables -fno-unwind-tables")
endforeach()
set(CMAKE_AR "${cross_tools}/ar" CACHE FILEPATH "")
set(CMAKE_RANLIB "${cross_tools}/ranlib" CACHE FILEPATH "")
set(CMAKE_EXE_LINKER_FLAGS_INIT "-static -s -Wl,--gc-sections")

# Headers and libraries are the target's only, programs are this machine's.
set(CMAKE_FIND_ROOT_PATH "${cross_root}/${cross_arch}/deps/root")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(CMAKE_FIND_LIBRARY_SUFFIXES .a)
