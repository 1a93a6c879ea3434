# Builds the compressed manual PAGE from SOURCE, from pages of the project, whose folder is SOURCES, and
# from the help of PROGRAM, if any. Also takes PANDOC, GZIP and VERSION.
cmake_minimum_required(VERSION 3.25)

cmake_path(REMOVE_EXTENSION PAGE LAST_ONLY OUTPUT_VARIABLE page)
cmake_path(GET page PARENT_PATH folder)
file(MAKE_DIRECTORY ${folder})
set(ENV{SOURCES} ${SOURCES})
set(ENV{PROGRAM} ${PROGRAM})
execute_process(
    COMMAND ${PANDOC} --standalone --from markdown-smart --to man --metadata hyphenate=false
        --lua-filter ${CMAKE_CURRENT_LIST_DIR}/manual.lua
        --variable "footer=libObrMemPool ${VERSION}" --output ${page} ${SOURCE}
    COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND ${GZIP} -9nf ${page} COMMAND_ERROR_IS_FATAL ANY)
