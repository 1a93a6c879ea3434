# gdb's commands and printers, which it loads by itself with the library: it looks for the library's
# real file name and "-gdb.py" beside the library and, in the folders that it is set up for, under
# the library's whole path. What it finds there is a link to the script, which has its package
# beside it. gdb trusts what its own set-up names: for Debian's gdb that is below
# /usr/share/gdb/auto-load. So the link of an install under /usr stands there, and every other one
# beside the library, where gdb itself says what to add to one's ~/.gdbinit.

set(gdbDir ${PROJECT_SOURCE_DIR}/tools/gdb)
set(gdbLinkName $<TARGET_FILE_NAME:MemPool>-gdb.py)
set(gdbLibraries "")  # Those that gdb finds its script with, and the folders they are installed in.
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
    # Two major versions of the library can be installed at once, each with its script.
    set(installedGdbDir ${CMAKE_INSTALL_DATADIR}/ObrMemPool-${PROJECT_VERSION_MAJOR}/gdb)
    install(FILES ${gdbDir}/autoload.py DESTINATION ${installedGdbDir} COMPONENT runtime)
    install(DIRECTORY ${gdbDir}/obrmempool DESTINATION ${installedGdbDir} COMPONENT runtime
        FILES_MATCHING PATTERN *.py PATTERN __pycache__ EXCLUDE)
endif()
if(OBR_MEMPOOL_INSTALL AND MEMPOOL_IS_SHARED)
    # The prefix is known when it is installed. A folder that is given by its whole path stays.
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
