# diskmanager_link_without_cxx_runtime(<target>)
#
# Links <target> with the C driver and without the C++ runtime library, so that code which needs something from it
# (exceptions, operator new, a container out of line) fails at the link and not on a router that has no such library.
# Must be called in the directory that defines <target>; it holds for every target of that directory that is linked
# as C.
function(diskmanager_link_without_cxx_runtime target)
    set_target_properties(${target} PROPERTIES LINKER_LANGUAGE C)
    # CMake adds these for C++ objects whatever the linker language; the generator reads them per directory.
    set(CMAKE_CXX_IMPLICIT_LINK_LIBRARIES "" PARENT_SCOPE)
    set(CMAKE_CXX_IMPLICIT_LINK_DIRECTORIES "" PARENT_SCOPE)
    if(NOT DISKMANAGER_SANITIZE)
        # A shared library would otherwise leave the missing symbols to whoever loads it.
        target_link_options(${target} PRIVATE LINKER:--no-undefined)
    endif()
endfunction()

# diskmanager_export_symbols(<target> <symbol>...)
#
# Keeps each C symbol in the executable <target> although nothing in it calls the symbol, and puts it into the dynamic
# symbol table, where a program that loads or inspects the daemon finds it.
function(diskmanager_export_symbols target)
    foreach(symbol IN LISTS ARGN)
        # -u pulls the object out of a static library; the export also protects it from --gc-sections.
        target_link_options(${target} PRIVATE
            LINKER:-u,${symbol}
            LINKER:--export-dynamic-symbol=${symbol})
    endforeach()
endfunction()
