# Two interface targets carry the compiler settings of all our targets:
#   diskmanager_warnings  the warnings alone, for code that needs exceptions or RTTI (the unit tests)
#   diskmanager_flags     the warnings and the dialect of the product: what a router has no room for is off

add_library(diskmanager_warnings INTERFACE)
target_compile_options(diskmanager_warnings INTERFACE
    -Wall
    -Wextra
    -Wconversion
    # clang has this one in -Wconversion, gcc has not; both shall judge alike.
    -Wno-sign-conversion
    -Wshadow
    -Wformat=2
    -Wmissing-declarations
    # The same check under the name that clang gives it.
    $<$<CXX_COMPILER_ID:Clang>:-Wmissing-prototypes>
    $<$<BOOL:${DISKMANAGER_WERROR}>:-Werror>
    # Log lines show "src/disk/mount.cpp" wherever the checkout lies.
    "-fmacro-prefix-map=${PROJECT_SOURCE_DIR}/=")

# On 32-bit routers a disk or database file past 2 GiB must not fail, nor the clock in 2038.
target_compile_definitions(diskmanager_warnings INTERFACE _FILE_OFFSET_BITS=64 _TIME_BITS=64)

if(DISKMANAGER_SANITIZE)
    # The vptr check needs the run-time type information that the product does without.
    set(sanitize_options
        "-fsanitize=${DISKMANAGER_SANITIZE}"
        -fno-sanitize=vptr
        -fno-sanitize-recover=all
        -fno-omit-frame-pointer)
    target_compile_options(diskmanager_warnings INTERFACE ${sanitize_options})
    target_link_options(diskmanager_warnings INTERFACE ${sanitize_options})
endif()

add_library(diskmanager_flags INTERFACE)
target_link_libraries(diskmanager_flags INTERFACE diskmanager_warnings)
target_compile_options(diskmanager_flags INTERFACE
    $<$<COMPILE_LANGUAGE:CXX>:-fno-exceptions>
    $<$<COMPILE_LANGUAGE:CXX>:-fno-rtti>
    $<$<COMPILE_LANGUAGE:CXX>:-fno-threadsafe-statics>
    -ffunction-sections
    -fdata-sections)
target_link_options(diskmanager_flags INTERFACE
    LINKER:--gc-sections
    LINKER:--as-needed)
