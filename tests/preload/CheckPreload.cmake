# Runs PROGRAM (with its arguments, and INPUT as its standard input) alone and on the preloaded pools of
# LIBRARY. Output, errors and exit status must be the same, and the pool's report, in the file REPORT,
# must count blocks.

cmake_minimum_required(VERSION 3.25)

function(run name)
    execute_process(COMMAND ${CMAKE_COMMAND} -E env ${ARGN} ${PROGRAM}
        INPUT_FILE ${INPUT}
        OUTPUT_VARIABLE output ERROR_VARIABLE errors RESULT_VARIABLE status)
    set(${name} "${status}: ${output}${errors}" PARENT_SCOPE)
endfunction()

run(expected LC_ALL=C)
if(expected STREQUAL "0: ")
    message(SEND_ERROR "${PROGRAM} prints nothing")
endif()
set(keep NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS=1)  # So that the report counts them after all blocks are freed.
foreach(settings NUV_OBR_MEMPOOL_BUCKET_SIZE=1004
        "NUV_OBR_MEMPOOL_BUCKET_SIZE=65535;NUV_OBR_MEMPOOL_MAX_RECORD_SIZE=4200")
    file(REMOVE ${REPORT})
    run(onPools LC_ALL=C LD_PRELOAD=${LIBRARY} MALLOC_ON_POOLS_REPORT=${REPORT} ${keep} ${settings})
    if(NOT onPools STREQUAL expected)
        message(SEND_ERROR "${PROGRAM} says ${expected}\nand on pools ${onPools}")
    endif()
    file(STRINGS ${REPORT} numBuckets REGEX "Num Buckets +: +[1-9]")
    if(NOT numBuckets)
        message(SEND_ERROR "${PROGRAM}: the pool has served nothing")
    endif()
endforeach()

file(REMOVE ${REPORT})
run(off LC_ALL=C LD_PRELOAD=${LIBRARY} MALLOC_ON_POOLS_REPORT=${REPORT} NUV_OBR_MEMPOOL_ON=0)
if(NOT off STREQUAL expected OR EXISTS ${REPORT})
    message(SEND_ERROR "Disabled, ${PROGRAM} says ${off}")
endif()
run(refused LD_PRELOAD=${LIBRARY} NUV_OBR_MEMPOOL_BUCKET_SIZE=900)
if(NOT refused MATCHES "^1: MallocOnPools: .*maximum record size of 1000")
    message(SEND_ERROR "With invalid settings, ${PROGRAM} says ${refused}")
endif()
