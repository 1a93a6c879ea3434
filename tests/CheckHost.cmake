# Runs HOST on FILE, if any, with pools, with pools off and, if there is a STOCK program, with --heap.
# The output, the exit status and, except for the figures, the errors must be the same. The STOCK
# program, which reads FILE from its standard input, must have the same output and exit status. The
# texts in comments of the file, "-- expect: TEXT" or "-- expect-error: TEXT", must be in the output or
# the errors.

cmake_minimum_required(VERSION 3.25)

set(arguments ${FILE})
if(NOT FILE)
    set(arguments --definitions 1000)
endif()
function(run name)
    execute_process(COMMAND ${HOST} ${ARGN} ${arguments}
        OUTPUT_VARIABLE output ERROR_VARIABLE errors RESULT_VARIABLE status)
    if(NOT errors MATCHES "[0-9.]+ s")
        message(FATAL_ERROR "${name}: no figures in: ${errors}")
    endif()
    string(REGEX REPLACE "[0-9.]+ (s|MB)" "" errors "${errors}")
    foreach(variable output errors status)
        set(${name}_${variable} "${${variable}}" PARENT_SCOPE)
    endforeach()
endfunction()
run(pools)
run(off --off)
set(others off)
if(STOCK OR NOT FILE)
    run(heap --heap)
    list(APPEND others heap)
endif()

foreach(variable output errors status)
    foreach(other IN LISTS others)
        if(NOT "${pools_${variable}}" STREQUAL "${${other}_${variable}}")
            message(SEND_ERROR "${variable} with pools:\n${pools_${variable}}\nbut ${other}:\n"
                    "${${other}_${variable}}")
        endif()
    endforeach()
endforeach()

if(STOCK)
    execute_process(COMMAND ${STOCK} INPUT_FILE ${FILE}
        OUTPUT_VARIABLE output ERROR_VARIABLE errors RESULT_VARIABLE status)
    if(NOT "${output}" STREQUAL "${pools_output}")
        message(SEND_ERROR "The stock program prints:\n${output}\nand the host:\n${pools_output}")
    endif()
    if(NOT status EQUAL pools_status)
        message(SEND_ERROR "The stock program exits with ${status} and the host with ${pools_status}")
    endif()
endif()

if(FILE)
    file(STRINGS ${FILE} lines REGEX "^-- expect")
    foreach(line IN LISTS lines)
        string(REGEX MATCH "^-- expect(-error)?: (.*)" match "${line}")
        set(where pools_output)
        if(CMAKE_MATCH_1)
            set(where pools_errors)
        endif()
        string(FIND "${${where}}" "${CMAKE_MATCH_2}" place)
        if(place LESS 0)
            message(SEND_ERROR "\"${CMAKE_MATCH_2}\" is not in:\n${${where}}")
        endif()
    endforeach()
endif()
