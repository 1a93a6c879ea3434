# The commands and printers for gdb, which loads them with the library. gdb looks for a file with the
# name of the library's real file and "-gdb.py", in the library's folder and, under the library's whole
# path, in gdb's own folders. That file is a link to the script, which has its package beside it.
# gdb loads only files from folders that it trusts; in Debian these are below
# /usr/share/gdb/auto-load. An install under /usr therefore has the link there. Every other one has it
# beside the library, and gdb prints what to add to ~/.gdbinit.

set(gdbDir ${PROJECT_SOURCE_DIR}/tools/gdb)
set(gdbLinkName $<TARGET_FILE_NAME:MemPool>-gdb.py)
set(gdbLibraries "")  # The libraries with a link, and the folders they are installed in.
set(gdbLibraryDirs "")
set(gdbComponents "")
if(MEMPOOL_IS_SHARED)
    list(APPEND gdbLibraries MemPool)
    list(APPEND gdbLibraryDirs ${CMAKE_INSTALL_LIBDIR})
    list(APPEND gdbComponents runtime)
endif()
if(MEMPOOL_HAS_CHECKED)
    list(APPEND gdbLibraries MemPoolChecked)
    list(APPEND gdbLibraryDirs ${CMAKE_INSTALL_LIBDIR}/${checkedDir})
    list(APPEND gdbComponents tools)
endif()
foreach(library IN LISTS gdbLibraries)
    add_custom_command(TARGET ${library} POST_BUILD
        COMMAND ${CMAKE_COMMAND} -E create_symlink
            ${gdbDir}/autoload.py $<TARGET_FILE_DIR:${library}>/${gdbLinkName})
endforeach()

if(OBR_MEMPOOL_INSTALL)
    # Two major versions of the library can be installed at once, each with its own script.
    set(installedGdbDir ${CMAKE_INSTALL_DATADIR}/ObrMemPool-${PROJECT_VERSION_MAJOR}/gdb)
    install(FILES ${gdbDir}/autoload.py DESTINATION ${installedGdbDir} COMPONENT runtime)
    install(DIRECTORY ${gdbDir}/obrmempool DESTINATION ${installedGdbDir} COMPONENT runtime
        FILES_MATCHING PATTERN *.py PATTERN __pycache__ EXCLUDE)
endif()
if(OBR_MEMPOOL_INSTALL AND MEMPOOL_IS_SHARED)
    # The prefix is known only at the install. A folder with an absolute path ignores it.
    foreach(dir component IN ZIP_LISTS gdbLibraryDirs gdbComponents)
        install(CODE "
            set(prefix \"\${CMAKE_INSTALL_PREFIX}\")
            set(script \"${installedGdbDir}/autoload.py\")
            set(linkDir \"${dir}\")
            set(linkName \"${gdbLinkName}\")
            include(\"${CMAKE_CURRENT_LIST_DIR}/InstallGdbLink.cmake\")"
            COMPONENT ${component})
    endforeach()
endif()
