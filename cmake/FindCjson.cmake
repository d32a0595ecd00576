# Finds cJSON and defines the imported target cjson::cjson. Include it as <cjson/cJSON.h>. Version 1.7.13 or later: only
# these tell when an item could not be added.

find_path(Cjson_INCLUDE_DIR cjson/cJSON.h)
find_library(Cjson_LIBRARY cjson)
mark_as_advanced(Cjson_INCLUDE_DIR Cjson_LIBRARY)

include(FindPackageHandleStandardArgs)
find_package_handle_standard_args(Cjson
    REQUIRED_VARS Cjson_LIBRARY Cjson_INCLUDE_DIR
    REASON_FAILURE_MESSAGE "run scripts/setup, or name the place of cJSON in CMAKE_PREFIX_PATH")

if(Cjson_FOUND AND NOT TARGET cjson::cjson)
    add_library(cjson::cjson UNKNOWN IMPORTED)
    set_target_properties(cjson::cjson PROPERTIES
        IMPORTED_LOCATION "${Cjson_LIBRARY}"
        INTERFACE_INCLUDE_DIRECTORIES "${Cjson_INCLUDE_DIR}")
endif()
