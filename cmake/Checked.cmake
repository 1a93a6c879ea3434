# The checked library, which reports faults of the host: the library's own sources, compiled a second
# time with checks of each block. It has the same name and interface, and a folder of its own, through
# which a host selects it.
#
# A build with a sanitizer leaves it out: it must not be instrumented, since it reads memory that it
# has poisoned for the host.

set(MEMPOOL_HAS_CHECKED OFF)
if(MEMPOOL_IS_SHARED AND NOT CMAKE_CXX_FLAGS MATCHES "-fsanitize")
    set(MEMPOOL_HAS_CHECKED ON)
endif()
set(checkedDir obrmempool-checked)

if(MEMPOOL_HAS_CHECKED)
    mempool_objects(MemPoolCheckedObjects
        ${mempoolSources}
        s/diagnostics/checked/Blocks.cpp
        s/diagnostics/checked/Checkers.cpp
        s/diagnostics/checked/Fault.cpp
        s/diagnostics/checked/Variables.cpp
        s/diagnostics/checked/Use.cpp
        s/diagnostics/checked/Watch.cpp)
    target_compile_definitions(MemPoolCheckedObjects PRIVATE OBR_MEMPOOL_CHECKED)
    find_path(VALGRIND_INCLUDE_DIR valgrind/valgrind.h)
    if(VALGRIND_INCLUDE_DIR)
        target_compile_definitions(MemPoolCheckedObjects PRIVATE OBR_KNOWS_VALGRIND)
    elseif(PROJECT_IS_TOP_LEVEL)
        message(STATUS "The checked library prints no stacks under Valgrind without the Debian package valgrind")
    endif()
    # A checker follows the frames up to the host when it records where a block was allocated.
    target_compile_options(MemPoolCheckedObjects PRIVATE
        -fno-omit-frame-pointer -fno-optimize-sibling-calls)
    mempool_library(MemPoolChecked SHARED MemPoolCheckedObjects)
    mempool_shared(MemPoolChecked ObrMemPool.map)
    set_target_properties(MemPoolChecked PROPERTIES
        LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/${checkedDir})
    if(OBR_MEMPOOL_INSTALL)
        install(TARGETS MemPoolChecked
            LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}/${checkedDir}
                COMPONENT tools NAMELINK_SKIP)
    elseif(NOT PROJECT_IS_TOP_LEVEL)  # Then the other project builds it on demand.
        set_target_properties(MemPoolChecked MemPoolCheckedObjects PROPERTIES EXCLUDE_FROM_ALL ON)
    endif()
endif()
