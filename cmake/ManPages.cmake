# The manuals, which pandoc builds from docs/man/NAME.SECTION.md and from what that file includes: other
# pages, and the help of a program. manual.lua describes the form of an include.

find_program(PANDOC pandoc)
find_program(GZIP gzip)
mark_as_advanced(PANDOC GZIP)

# manual(NAME COMPONENT [PROGRAM])
function(manual name component)
    set(source ${PROJECT_SOURCE_DIR}/docs/man/${name}.md)
    set(page ${PROJECT_BINARY_DIR}/man/${name}.gz)
    set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${source})
    file(STRINGS ${source} pages REGEX "^<!-- .*\\.md")
    list(TRANSFORM pages REPLACE "^<!-- ([^ :]*).*" "${PROJECT_SOURCE_DIR}/\\1")
    set(scripts ${PROJECT_SOURCE_DIR}/cmake/MakeManual.cmake ${PROJECT_SOURCE_DIR}/cmake/manual.lua)
    set(program ${ARGN})
    set(programOption "")
    if(program)
        set(programOption -DPROGRAM=$<TARGET_FILE:${program}>)
    endif()
    add_custom_command(OUTPUT ${page}
        COMMAND ${CMAKE_COMMAND} -DPANDOC=${PANDOC} -DGZIP=${GZIP} -DSOURCE=${source} -DPAGE=${page}
            -DSOURCES=${PROJECT_SOURCE_DIR} -DVERSION=${PROJECT_VERSION}
            ${programOption} -P ${PROJECT_SOURCE_DIR}/cmake/MakeManual.cmake
        DEPENDS ${source} ${pages} ${scripts} ${program}
        VERBATIM)
    add_custom_target(manual-${name} ALL DEPENDS ${page})
    string(REGEX REPLACE ".*\\." "" section ${name})
    install(FILES ${page} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT ${component})
endfunction()

if(PANDOC AND GZIP)
    manual(ObrMemPool.7 dev)
    if(TARGET mempool AND NOT CMAKE_CROSSCOMPILING)  # The program must run to print its help.
        manual(mempool.1 tools mempool)
    endif()
else()
    message(STATUS "The manuals cannot be built without the Debian packages: pandoc gzip")
endif()
