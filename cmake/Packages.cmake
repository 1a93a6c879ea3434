# Debian packages, one a component (see Install.cmake): `cpack -G DEB` in a build folder that was
# configured for /usr, as the preset `package` does. scripts/packages.sh makes and tests them.
#
# What CPack has no words for is done by StagePackages.cmake between the install and the packing.

set(CPACK_PACKAGE_NAME obrmempool)
set(CPACK_PACKAGE_VENDOR "the libObrMemPool maintainers")
set(CPACK_PACKAGE_FILE_NAME obrmempool-${PROJECT_VERSION})
set(CPACK_VERBATIM_VARIABLES ON)
# The install rules run with DESTDIR set and with the prefix of the configure, so that one that looks
# at the prefix finds it.
set(CPACK_SET_DESTDIR ON)
set(CPACK_STRIP_FILES OFF)
set(CPACK_STRIP ${CMAKE_STRIP})
set(CPACK_COMPONENTS_ALL runtime dev)
if(CAN_BUILD_mempool)
    list(APPEND CPACK_COMPONENTS_ALL tools)
endif()
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_GROUPING ONE_PER_GROUP)
set(CPACK_PRE_BUILD_SCRIPTS ${CMAKE_CURRENT_LIST_DIR}/StagePackages.cmake)

# The names that the packages have, and their sources as Debian would call them. The owner's address
# is not known here: cpack takes another with -D CPACK_DEBIAN_PACKAGE_MAINTAINER="Name <address>".
set(packageVersion ${PROJECT_VERSION}-1)
set(runtimePackage libobrmempool${PROJECT_VERSION_MAJOR})
set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME ${runtimePackage})
set(CPACK_DEBIAN_DEV_PACKAGE_NAME libobrmempool-dev)
set(CPACK_DEBIAN_TOOLS_PACKAGE_NAME mempool-tools)
set(CPACK_DEBIAN_PACKAGE_SOURCE obrmempool)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_MAINTAINER "libObrMemPool maintainers <maintainers@obrmempool.invalid>")
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SECTION devel)

# The libraries' own dependencies come from dpkg-shlibdeps. The packages of one build belong together:
# the tools bring a second build of the library and read what the first one writes.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_CURRENT_BINARY_DIR})
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS "${runtimePackage} (= ${packageVersion})")
set(CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS "${runtimePackage} (= ${packageVersion})")
set(CPACK_DEBIAN_DEV_PACKAGE_SUGGESTS mempool-tools)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SUGGESTS gdb)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SUGGESTS "gdb, valgrind")

# What other packages that link the library depend on, and that the loader is to look again. A change
# of what is exported since then raises the version here.
file(CONFIGURE OUTPUT packages/shlibs
    CONTENT "libObrMemPool ${PROJECT_VERSION_MAJOR} ${runtimePackage} (>= 1.0.0)\n")
file(CONFIGURE OUTPUT packages/triggers CONTENT "activate-noawait ldconfig\n")
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA
    ${CMAKE_CURRENT_BINARY_DIR}/packages/shlibs
    ${CMAKE_CURRENT_BINARY_DIR}/packages/triggers)

# Each description begins with a summary of its own, ahead of which CPack would put the project's.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
string(JOIN "\n" about
    "libObrMemPool gives C++ programs named pools for millions of small objects"
    "that are dropped a group at a time: 4 bytes of overhead a block, blocks found"
    "and freed in constant time, and reports of where the memory is."
    "" "")
string(JOIN "\n" CPACK_DEBIAN_RUNTIME_DESCRIPTION
    "named memory pools for C++ programs"
    "${about}This package has the shared library, and what gdb loads with it to show"
    "pools.")
string(JOIN "\n" CPACK_DEBIAN_DEV_DESCRIPTION
    "named memory pools for C++ programs - development files"
    "${about}This package has the headers, also of the layer for standard containers and"
    "C hosts, the static library, and the files by which CMake and pkg-config find"
    "both libraries.")
string(JOIN "\n" CPACK_DEBIAN_TOOLS_DESCRIPTION
    "tools for programs and their memory pools"
    "${about}This package has mempool, which records the allocations of any program and"
    "tells what pools do, or would do, for it; and the checked library, on which it"
    "runs a program to find its faults.")

include(CPack)
