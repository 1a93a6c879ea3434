# Run by cpack when each component of Packages.cmake lies in a folder of its own, before these become
# packages. Adds what Debian wants in every package: its changelog, made of the newest part of
# CHANGELOG.md; its copyright file, made of what README.md says; and what is known of lintian's
# findings. Takes from binaries what nobody needs. All files get the time of the sources, which
# SOURCE_DATE_EPOCH tells, so that packages that are made twice are the same.

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
    message(FATAL_ERROR "README.md tells nothing of a licence.")
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

# What of others is compiled into a component, each told by the Debian package that it comes from.
set(others_tools libcli11-dev libfmt-dev nlohmann-json3-dev libjs-d3)

# What there is to read.
set(texts_dev README.md docs/moving.md)
set(texts_tools docs/report.md)

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
            file(APPEND ${doc}/copyright "\nIt has code of ${other} in it, which says:\n\n${notice}")
        endif()
    endforeach()
    file(WRITE ${doc}/changelog.Debian "${changelog}")
    run(gzip -9nf ${doc}/changelog.Debian)
    foreach(text IN LISTS texts_${component})
        file(COPY ${sources}/${text} DESTINATION ${doc})
    endforeach()
    set(overrides ${CMAKE_CURRENT_LIST_DIR}/lintian/${package})
    if(EXISTS ${overrides})
        file(COPY ${overrides} DESTINATION ${root}/usr/share/lintian/overrides)
    endif()

    # gdb's commands read the library's symbol table, which is therefore kept.
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
