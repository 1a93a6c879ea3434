# Compares the manual page PAGE with the help of the program MEMPOOL: it must have a part for each
# subcommand, with an item for each option. Takes GZIP too.

cmake_minimum_required(VERSION 3.25)

# All that `pattern` captures in `text`.
function(words pattern text outputVariable)
    set(found "")
    string(REGEX MATCHALL "${pattern}" matches "${text}")
    foreach(match IN LISTS matches)
        string(REGEX MATCH "${pattern}" match "${match}")
        list(APPEND found "${CMAKE_MATCH_1}")
    endforeach()
    set(${outputVariable} "${found}" PARENT_SCOPE)
endfunction()

# The output of the program, as a string that is not a list.
function(help outputVariable)
    execute_process(COMMAND ${MEMPOOL} ${ARGN} --help
        OUTPUT_VARIABLE output COMMAND_ERROR_IS_FATAL ANY)
    string(REGEX REPLACE "[][;]" " " output "${output}")
    set(${outputVariable} "${output}" PARENT_SCOPE)
endfunction()

execute_process(COMMAND ${GZIP} -dc ${PAGE} OUTPUT_VARIABLE page COMMAND_ERROR_IS_FATAL ANY)
string(REPLACE "\\-" "-" page "${page}")

help(all)
string(REGEX REPLACE ".*\nSubcommands:" "" all "${all}")
words("\n  ([a-z-]+) " "${all}" subcommands)
list(LENGTH subcommands number)
if(number LESS 3)
    message(SEND_ERROR "mempool lists only these subcommands: ${subcommands}")
endif()
foreach(subcommand IN LISTS subcommands)
    string(FIND "${page}" "\n.SS ${subcommand}\n" begin)
    if(begin LESS 0)
        message(SEND_ERROR "The manual has no part for ${subcommand}")
        continue()
    endif()
    string(SUBSTRING "${page}" ${begin} -1 part)
    string(REGEX REPLACE "^(\n[^\n]*\n)" "" part "${part}")
    string(REGEX REPLACE "\n\\.S[SH] .*" "" part "${part}")
    help(output ${subcommand})
    words("\n  (-[^ \n]*)" "${output}" options)
    foreach(option IN LISTS options)
        string(FIND "${part}" "\n.TP\n\\f[B]${option}" place)
        if(place LESS 0)
            message(SEND_ERROR "The manual does not have ${option} of ${subcommand}")
        endif()
    endforeach()
endforeach()
