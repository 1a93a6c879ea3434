# Configures the project as on a machine without the packages of its parts. Each part must be left out
# with a status line or, if its option is ON, stop with the same words. Takes SOURCE, BINARY, GENERATOR,
# MAKE and COMPILER.

cmake_minimum_required(VERSION 3.25)

foreach(package CLI11 ZLIB GTest benchmark Boost Lua SQLite3 LibXml2 Duktape Mruby mimalloc nlohmann_json fmt D3 zstd LibDw LibIberty)
    list(APPEND hidden -DCMAKE_DISABLE_FIND_PACKAGE_${package}=ON)
endforeach()
set(options OBR_MEMPOOL_EXAMPLES OBR_MEMPOOL_TOOLS OBR_MEMPOOL_TESTS OBR_MEMPOOL_BENCH)

# Configures with `arguments`. Sets the output, with single blanks, and the status.
function(configure arguments outputVariable)
    execute_process(
        COMMAND ${CMAKE_COMMAND} -S ${SOURCE} -B ${BINARY} -G ${GENERATOR} -DCMAKE_MAKE_PROGRAM=${MAKE}
                -DCMAKE_CXX_COMPILER=${COMPILER} ${hidden} ${arguments}
        OUTPUT_VARIABLE output ERROR_VARIABLE output RESULT_VARIABLE status)
    string(REGEX REPLACE "[ \n]+" " " output "${output}")
    set(${outputVariable} "${output}" PARENT_SCOPE)
    set(status "${status}" PARENT_SCOPE)
endfunction()

list(TRANSFORM options REPLACE "(.+)" "-D\\1=AUTO" OUTPUT_VARIABLE allAuto)
configure("${allAuto}" auto)
if(NOT status EQUAL 0)
    message(FATAL_ERROR "A missing package ends a configure that did not ask for it:\n${auto}")
endif()
foreach(option ${options})
    set(line "-- ([^ ]+ cannot be built without the Debian packages: [a-z0-9 .-]+ \\(${option}\\))")
    if(NOT auto MATCHES "${line}")
        message(SEND_ERROR "No line says what ${option} lacks:\n${auto}")
        continue()
    endif()
    set(words "${CMAKE_MATCH_1}")
    configure("${allAuto};-D${option}=ON" output)
    string(FIND "${output}" "CMake Error" error)
    string(FIND "${output}" "${words}" place REVERSE)
    if(status EQUAL 0 OR error LESS 0 OR place LESS error)
        message(SEND_ERROR "${option}=ON does not stop with \"${words}\":\n${output}")
    endif()
endforeach()
