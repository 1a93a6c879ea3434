# What an install consists of: the shared library with its links, the archive, the headers, and the
# packages by which CMake (ObrMemPool) and pkg-config (ObrMemPool.pc) find them. An install may be
# moved: the packages find the rest from where they lie themselves. The library depends on nothing
# that its users would have to find, not even with a host layer, which it links privately; only the
# archive leaves such a layer to them.
#
# Every rule of the project names its component, which Packages.cmake makes a package of:
#
#   runtime   the shared library, and what gdb loads with it
#   dev       headers, archive, the packages for CMake and pkg-config, manual of the library
#   tools     programs, what they load, and their manuals

include(CMakePackageConfigHelpers)

set(libraries MemPool)
if(TARGET MemPoolStatic)
    list(APPEND libraries MemPoolStatic)
endif()
install(TARGETS ${libraries} EXPORT ObrMemPool
    LIBRARY COMPONENT runtime NAMELINK_COMPONENT dev
    ARCHIVE COMPONENT dev)
install(FILES include/MemPool include/MemPoolHeap include/MemPoolSettings
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

# A folder below the prefix is told from the prefix, one elsewhere by its whole path.
set(pkgConfigDir ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
cmake_path(ABSOLUTE_PATH pkgConfigDir BASE_DIRECTORY ${CMAKE_INSTALL_PREFIX}
    OUTPUT_VARIABLE fullPkgConfigDir)
cmake_path(RELATIVE_PATH CMAKE_INSTALL_PREFIX BASE_DIRECTORY ${fullPkgConfigDir}
    OUTPUT_VARIABLE pkgConfigDirToPrefix)
cmake_path(APPEND pkgConfigLibDir "\${prefix}" ${CMAKE_INSTALL_LIBDIR})
cmake_path(APPEND pkgConfigIncludeDir "\${prefix}" ${CMAKE_INSTALL_INCLUDEDIR})
configure_file(${CMAKE_CURRENT_LIST_DIR}/ObrMemPool.pc.in ObrMemPool.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/ObrMemPool.pc DESTINATION ${pkgConfigDir} COMPONENT dev)
