# cpack runs this when each component of Packages.cmake lies in a folder of its own, before it packs them.
# It adds what Debian wants in every package: a changelog, from the newest part of CHANGELOG.md; a
# copyright file, from the licence in README.md; and the known findings of lintian. It strips binaries.
# All files get the time of the sources, SOURCE_DATE_EPOCH, so that packages are reproducible.

cmake_minimum_required(VERSION 3.25)

if(NOT CPACK_INSTALL_PREFIX STREQUAL "/usr")
    message(FATAL_ERROR "Packages are for /usr: configure with -DCMAKE_INSTALL_PREFIX=/usr, "
        "as the preset \"package\" does.")
endif()
cmake_path(GET CMAKE_CURRENT_LIST_DIR PARENT_PATH sources)

function(run)
    execute_process(COMMAND ${ARGN} COMMAND_ERROR_IS_FATAL ANY)
endfunction()

file(STRINGS ${sources}/README.md licence REGEX "licence has been granted")
if(NOT licence)
    message(FATAL_ERROR "README.md has no line about the licence.")
endif()
set(time "")
if(DEFINED ENV{SOURCE_DATE_EPOCH})
    set(time --date=@$ENV{SOURCE_DATE_EPOCH})
endif()
execute_process(COMMAND date --utc --rfc-email ${time}
    OUTPUT_VARIABLE date OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
execute_process(COMMAND awk -v version=${CPACK_PACKAGE_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE}
        -v "maintainer=${CPACK_DEBIAN_PACKAGE_MAINTAINER}" -v "date=${date}"
        -f ${CMAKE_CURRENT_LIST_DIR}/changelog.awk ${sources}/CHANGELOG.md
    OUTPUT_VARIABLE changelog COMMAND_ERROR_IS_FATAL ANY)

# Debian packages with code that is compiled into a component.
set(others_tools libcli11-dev libfmt-dev nlohmann-json3-dev libjs-d3)

foreach(component IN LISTS CPACK_COMPONENTS_ALL)
    string(TOUPPER ${component} upper)
    set(package ${CPACK_DEBIAN_${upper}_PACKAGE_NAME})
    set(root ${CPACK_TEMPORARY_DIRECTORY}/${component})
    set(doc ${root}/usr/share/doc/${package})

    file(WRITE ${doc}/copyright "libObrMemPool\n\nCopyright: the owner of the repository.\n\n"
        "${licence}\n")
    foreach(other IN LISTS others_${component})
        set(notice /usr/share/doc/${other}/copyright)
        if(EXISTS ${notice})
            file(READ ${notice} notice)
            file(APPEND ${doc}/copyright "\nIt contains code of ${other}, under this licence:\n\n${notice}")
        endif()
    endforeach()
    file(WRITE ${doc}/changelog.Debian "${changelog}")
    run(gzip -9nf ${doc}/changelog.Debian)
    if(NOT component STREQUAL "runtime")  # A page links to others, so each package has all of them.
        file(COPY ${sources}/README.md DESTINATION ${doc})
        file(COPY ${sources}/docs DESTINATION ${doc} FILES_MATCHING
            PATTERN *.md PATTERN *.svg PATTERN *.png
            PATTERN man EXCLUDE PATTERN reference.md EXCLUDE)
    endif()
    if(component STREQUAL "dev")  # What the pages link to besides.
        file(COPY ${sources}/examples ${sources}/CHANGELOG.md DESTINATION ${doc})
        file(COPY ${sources}/s/README.md DESTINATION ${doc}/s)
        file(COPY ${sources}/s/MemPool/Record.hpp DESTINATION ${doc}/s/MemPool)
        file(COPY ${sources}/tools/README.md DESTINATION ${doc}/tools)
        file(CREATE_LINK ../../../include ${doc}/include SYMBOLIC)
    endif()
    set(overrides ${CMAKE_CURRENT_LIST_DIR}/lintian/${package})
    if(EXISTS ${overrides})
        file(COPY ${overrides} DESTINATION ${root}/usr/share/lintian/overrides)
    endif()

    # The library keeps its symbol table, which gdb's commands read.
    file(GLOB_RECURSE files LIST_DIRECTORIES false ${root}/*)
    foreach(file IN LISTS files)
        if(IS_SYMLINK ${file})
            continue()
        endif()
        file(READ ${file} magic LIMIT 4 HEX)
        if(file MATCHES "\\.a$|/libObrMemPool\\.so")
            run(${CPACK_STRIP} --strip-debug --remove-section=.comment --enable-deterministic-archives ${file})
        elseif(magic STREQUAL "7f454c46")
            run(${CPACK_STRIP} --strip-unneeded --remove-section=.comment ${file})
        endif()
    endforeach()
    run(find ${root} -type d -exec chmod 0755 {} +)
    if(time)
        run(find ${root} -exec touch --no-dereference ${time} {} +)
    endif()
endforeach()
