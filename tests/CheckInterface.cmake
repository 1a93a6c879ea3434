# Compares the exports of the shared library with the committed list of symbols, which the variable
# OBR_MEMPOOL_APPROVE rewrites, and the libraries that it needs with the standard libraries. Takes NM,
# READELF, LIBRARY, SONAME, EXPECTED, and ALLOWED: the names of further libraries that a build may need,
# each after a "|".

cmake_minimum_required(VERSION 3.25)

execute_process(COMMAND ${NM} -D --defined-only ${LIBRARY}
                OUTPUT_VARIABLE symbols COMMAND_ERROR_IS_FATAL ANY)
string(REGEX MATCHALL "[A-Za-z] [^ \n]+\n" symbols "${symbols}")
list(TRANSFORM symbols STRIP)
list(TRANSFORM symbols REPLACE "^V " "u ")  # clang++ does not make a static of an inline function unique.
list(FILTER symbols EXCLUDE REGEX "^A ")  # The version, which not every linker writes.
list(JOIN symbols "\n" symbols)
if(DEFINED ENV{OBR_MEMPOOL_APPROVE})
    file(WRITE ${EXPECTED} "${symbols}\n")
endif()
file(READ ${EXPECTED} expected)
if(NOT "${symbols}\n" STREQUAL expected)
    message(SEND_ERROR "The exported symbols are not those of ${EXPECTED}:\n${symbols}")
endif()

execute_process(COMMAND ${READELF} -d -W ${LIBRARY}
                OUTPUT_VARIABLE dynamic COMMAND_ERROR_IS_FATAL ANY)
if(NOT dynamic MATCHES "\\(SONAME\\) +Library soname: \\[${SONAME}\\.so\\.1\\]")
    message(SEND_ERROR "The library's name is not ${SONAME}.so.1:\n${dynamic}")
endif()
string(REGEX MATCHALL "Shared library: \\[[^]]+" needed "${dynamic}")
list(FILTER needed EXCLUDE REGEX
     "\\[(libstdc\\+\\+|libgcc_s|libc|libm|ld-linux-x86-64${ALLOWED})\\.so\\.")
if(needed)
    message(SEND_ERROR "The library needs more than the standard libraries: ${needed}")
endif()
