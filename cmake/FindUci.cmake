# Finds libuci with the libubox that it needs and defines the imported target uci::uci. Include it as <uci.h>.
#
# An installed libuci comes first (a router SDK has one); after it the one that scripts/setup has built below
# build/deps. The latter is for this machine and is never taken for another.

set(uci_deps_dir "${CMAKE_CURRENT_LIST_DIR}/../build/deps/root")
cmake_path(NORMAL_PATH uci_deps_dir)

# The three are looked for in one place at a time: a header must not meet the library of another build.
macro(uci_look_in)
    find_path(Uci_INCLUDE_DIR uci.h ${ARGN})
    find_library(Uci_LIBRARY uci ${ARGN})
    find_library(Uci_UBOX_LIBRARY ubox ${ARGN})
    if(NOT (Uci_INCLUDE_DIR AND Uci_LIBRARY AND Uci_UBOX_LIBRARY))
        unset(Uci_INCLUDE_DIR CACHE)
        unset(Uci_LIBRARY CACHE)
        unset(Uci_UBOX_LIBRARY CACHE)
    endif()
endmacro()

uci_look_in()
if(NOT Uci_LIBRARY AND NOT CMAKE_CROSSCOMPILING)
    uci_look_in(PATHS "${uci_deps_dir}" PATH_SUFFIXES include lib NO_DEFAULT_PATH)
endif()
mark_as_advanced(Uci_INCLUDE_DIR Uci_LIBRARY Uci_UBOX_LIBRARY)

include(FindPackageHandleStandardArgs)
find_package_handle_standard_args(Uci
    REQUIRED_VARS Uci_LIBRARY Uci_UBOX_LIBRARY Uci_INCLUDE_DIR
    REASON_FAILURE_MESSAGE "run scripts/setup, or name the place of libuci in CMAKE_PREFIX_PATH")

if(Uci_FOUND AND NOT TARGET uci::uci)
    add_library(uci::ubox UNKNOWN IMPORTED)
    set_target_properties(uci::ubox PROPERTIES IMPORTED_LOCATION "${Uci_UBOX_LIBRARY}")

    add_library(uci::uci UNKNOWN IMPORTED)
    set_target_properties(uci::uci PROPERTIES
        IMPORTED_LOCATION "${Uci_LIBRARY}"
        INTERFACE_INCLUDE_DIRECTORIES "${Uci_INCLUDE_DIR}"
        INTERFACE_LINK_LIBRARIES uci::ubox)
endif()
