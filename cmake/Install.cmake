# Install rules for the libraries, their headers, and the files through which CMake (ObrMemPool) and pkg-config
# (ObrMemPool.pc) find them. These files contain relative paths, so an installed tree can be moved. Users of
# the shared library need no other library, not even a host layer, which it links privately. Users of the
# static library link a host layer themselves.
#
# Each install rule of the project names a component. Packages.cmake makes a package of each but `doc`:
#
#   runtime   the shared library, and the commands that gdb loads with it
#   dev       headers, static library, files for CMake and pkg-config, the library's manual
#   tools     programs, the libraries that they load, and their manual
#   doc       the pages of documentation, which StagePackages.cmake adds to the packages of dev and tools

include(CMakePackageConfigHelpers)

set(libraries MemPool MemPoolC)
if(TARGET MemPoolStatic)
    list(APPEND libraries MemPoolStatic MemPoolCStatic)
endif()
install(TARGETS ${libraries} EXPORT ObrMemPool
    LIBRARY COMPONENT runtime NAMELINK_COMPONENT dev
    ARCHIVE COMPONENT dev)
install(FILES include/MemPool include/MemPoolHeap include/MemPoolHeap.h include/MemPoolSettings
    DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT dev)

set(packageDir ${CMAKE_INSTALL_LIBDIR}/cmake/ObrMemPool)
install(EXPORT ObrMemPool
    NAMESPACE MemPool::
    FILE ObrMemPoolTargets.cmake
    DESTINATION ${packageDir} COMPONENT dev)
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/ObrMemPoolConfig.cmake.in
    ObrMemPoolConfig.cmake
    INSTALL_DESTINATION ${packageDir}
    NO_SET_AND_CHECK_MACRO)
write_basic_package_version_file(ObrMemPoolConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES
    ${CMAKE_CURRENT_BINARY_DIR}/ObrMemPoolConfig.cmake
    ${CMAKE_CURRENT_BINARY_DIR}/ObrMemPoolConfigVersion.cmake
    DESTINATION ${packageDir} COMPONENT dev)

# A folder below the prefix gets a relative path, any other an absolute one.
set(pkgConfigDir ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
cmake_path(ABSOLUTE_PATH pkgConfigDir BASE_DIRECTORY ${CMAKE_INSTALL_PREFIX}
    OUTPUT_VARIABLE fullPkgConfigDir)
cmake_path(RELATIVE_PATH CMAKE_INSTALL_PREFIX BASE_DIRECTORY ${fullPkgConfigDir}
    OUTPUT_VARIABLE pkgConfigDirToPrefix)
cmake_path(APPEND pkgConfigLibDir "\${prefix}" ${CMAKE_INSTALL_LIBDIR})
cmake_path(APPEND pkgConfigIncludeDir "\${prefix}" ${CMAKE_INSTALL_INCLUDEDIR})
foreach(package ObrMemPool ObrMemPoolC)
    configure_file(${CMAKE_CURRENT_LIST_DIR}/${package}.pc.in ${package}.pc @ONLY)
    install(FILES ${CMAKE_CURRENT_BINARY_DIR}/${package}.pc
        DESTINATION ${pkgConfigDir} COMPONENT dev)
endforeach()

if(PROJECT_IS_TOP_LEVEL)
    install(FILES README.md CHANGELOG.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT doc)
    install(DIRECTORY docs DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT doc FILES_MATCHING
        PATTERN *.md PATTERN *.svg PATTERN *.png
        PATTERN man EXCLUDE PATTERN reference.md EXCLUDE)
endif()
