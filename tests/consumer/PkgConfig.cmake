# Builds the consumer with one command of the compiler and what pkg-config knows, and runs it.
# Takes PREFIX, LIBDIR, COMPILER, FLAGS and, for the program, OUTPUT.

find_program(pkgConfig pkg-config)
if(NOT pkgConfig)
    message("SKIPPED: there is no pkg-config here (Debian package pkg-config)")
    return()
endif()

cmake_path(APPEND libDir ${PREFIX} ${LIBDIR})
set(ENV{PKG_CONFIG_PATH} ${libDir}/pkgconfig)
execute_process(COMMAND ${pkgConfig} --cflags --libs "ObrMemPool >= 1"
    OUTPUT_VARIABLE found COMMAND_ERROR_IS_FATAL ANY)
separate_arguments(arguments UNIX_COMMAND "${FLAGS} ${found}")
execute_process(COMMAND ${COMPILER} ${CMAKE_CURRENT_LIST_DIR}/main.cpp -o ${OUTPUT} ${arguments}
    COMMAND_ERROR_IS_FATAL ANY)
set(ENV{LD_LIBRARY_PATH} ${libDir})
execute_process(COMMAND ${OUTPUT} COMMAND_ERROR_IS_FATAL ANY)
