# The manuals: docs/man/NAME.SECTION.md, made manual pages by pandoc. Each is in the component named,
# and may be about a program. MakeManual.cmake and manual.lua tell what they take from elsewhere.

find_program(PANDOC pandoc)
find_program(GZIP gzip)
mark_as_advanced(PANDOC GZIP)

function(manual name component)
    set(source ${PROJECT_SOURCE_DIR}/docs/man/${name}.md)
    set(page ${PROJECT_BINARY_DIR}/man/${name}.gz)
    set(scripts ${PROJECT_SOURCE_DIR}/cmake/MakeManual.cmake ${PROJECT_SOURCE_DIR}/cmake/manual.lua)
    set(program ${ARGN})
    set(programOption "")
    if(program)
        set(programOption -DPROGRAM=$<TARGET_FILE:${program}>)
    endif()
    add_custom_command(OUTPUT ${page}
        COMMAND ${CMAKE_COMMAND} -DPANDOC=${PANDOC} -DGZIP=${GZIP} -DSOURCE=${source} -DPAGE=${page}
            -DREADME=${PROJECT_SOURCE_DIR}/README.md -DVERSION=${PROJECT_VERSION}
            ${programOption} -P ${PROJECT_SOURCE_DIR}/cmake/MakeManual.cmake
        DEPENDS ${source} ${PROJECT_SOURCE_DIR}/README.md ${scripts} ${program}
        VERBATIM)
    add_custom_target(manual-${name} ALL DEPENDS ${page})
    string(REGEX REPLACE ".*\\." "" section ${name})
    install(FILES ${page} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT ${component})
endfunction()

if(PANDOC AND GZIP)
    manual(ObrMemPool.7 dev)
    if(TARGET mempool AND NOT CMAKE_CROSSCOMPILING)  # The program tells its own help.
        manual(mempool.1 tools mempool)
    endif()
else()
    message(STATUS "The manuals cannot be built without the Debian packages: pandoc gzip")
endif()
