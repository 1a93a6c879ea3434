# libObrMemPoolC: the heaps of MemPoolHeap.h, for C, over libObrMemPool. MemPoolC is the default form,
# MemPoolCStatic the static library.

mempool_objects(MemPoolCObjects s/MemPoolC/Heap.cpp)

# mempool_c_library(NAME SHARED|STATIC LIBRARY)
function(mempool_c_library name form library)
    add_library(${name} ${form} $<TARGET_OBJECTS:MemPoolCObjects>)
    add_library(MemPool::${name} ALIAS ${name})
    set_target_properties(${name} PROPERTIES OUTPUT_NAME ObrMemPoolC LINKER_LANGUAGE CXX)
    target_include_directories(${name} INTERFACE
        $<BUILD_INTERFACE:${CMAKE_CURRENT_SOURCE_DIR}/include>
        $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
    target_link_libraries(${name} PRIVATE ${library})
endfunction()

if(MEMPOOL_IS_SHARED)
    mempool_c_library(MemPoolC SHARED MemPool)
    mempool_shared(MemPoolC ObrMemPoolC.map)
    if(NOT CMAKE_INSTALL_PREFIX STREQUAL "/usr")  # Where the loader looks anyway.
        set_target_properties(MemPoolC PROPERTIES INSTALL_RPATH $ORIGIN)
    endif()
    mempool_c_library(MemPoolCStatic STATIC MemPoolStatic)
    if(NOT OBR_MEMPOOL_INSTALL)
        set_target_properties(MemPoolCStatic PROPERTIES EXCLUDE_FROM_ALL ON)
    endif()
else()
    mempool_c_library(MemPoolC STATIC MemPool)
    add_library(MemPool::MemPoolCStatic ALIAS MemPoolC)
endif()
