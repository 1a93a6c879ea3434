# Debian packages, one per component (see Install.cmake). `cpack -G DEB` builds them in a build folder that
# was configured for /usr, as by the preset `package`. scripts/packages.sh builds and tests them.
#
# StagePackages.cmake does what CPack has no variables for.

set(CPACK_PACKAGE_NAME obrmempool)
set(CPACK_PACKAGE_VENDOR "the libObrMemPool maintainers")
set(CPACK_PACKAGE_FILE_NAME obrmempool-${PROJECT_VERSION})
set(CPACK_VERBATIM_VARIABLES ON)
# Install rules run with DESTDIR and the configured prefix, which InstallGdbLink.cmake looks at.
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

# The names of the packages, and of their source package. The maintainer's address is a placeholder: set
# another with cpack -D CPACK_DEBIAN_PACKAGE_MAINTAINER="Name <address>".
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

# dpkg-shlibdeps finds the dependencies on other libraries. The packages depend on the same version of each
# other: the tools contain a second build of the library and read its traces.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_CURRENT_BINARY_DIR})
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS "${runtimePackage} (= ${packageVersion})")
set(CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS "${runtimePackage} (= ${packageVersion})")
set(CPACK_DEBIAN_DEV_PACKAGE_SUGGESTS mempool-tools)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SUGGESTS gdb)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SUGGESTS "gdb, valgrind")

# The dependency of packages that link the library, and the trigger that updates the loader's cache. A
# change of the exported interface raises the version here.
file(CONFIGURE OUTPUT packages/shlibs
    CONTENT "libObrMemPool ${PROJECT_VERSION_MAJOR} ${runtimePackage} (>= 1.0.0)
libObrMemPoolC ${PROJECT_VERSION_MAJOR} ${runtimePackage} (>= 1.0.0)\n")
file(CONFIGURE OUTPUT packages/triggers CONTENT "activate-noawait ldconfig\n")
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA
    ${CMAKE_CURRENT_BINARY_DIR}/packages/shlibs
    ${CMAKE_CURRENT_BINARY_DIR}/packages/triggers)

# Empty, because each description starts with its own summary.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
string(JOIN "\n" about
    "libObrMemPool gives C++ and C programs named pools for millions of small"
    "objects that are dropped in groups. A block costs 4 to 8 bytes, is allocated"
    "and freed in constant time, and appears in reports of where the memory is."
    "" "")
string(JOIN "\n" CPACK_DEBIAN_RUNTIME_DESCRIPTION
    "named memory pools for C++ and C programs"
    "${about}This package contains the shared library, and the commands that gdb loads"
    "with it.")
string(JOIN "\n" CPACK_DEBIAN_DEV_DESCRIPTION
    "named memory pools for C++ and C programs - development files"
    "${about}This package contains the headers, the static library, the files through"
    "which CMake and pkg-config find the library, and the documentation.")
string(JOIN "\n" CPACK_DEBIAN_TOOLS_DESCRIPTION
    "tools for programs and their memory pools"
    "${about}This package contains mempool, which records the allocations of any"
    "program and shows what pools would gain for it, and the checked library, on"
    "which mempool runs a program to find its memory errors.")

include(CPack)
