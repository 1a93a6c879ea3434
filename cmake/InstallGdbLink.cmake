# Part of an install: makes the link by which gdb finds `script` with the library in `linkDir`. Both
# are told from `prefix`, or by their whole paths. See Gdb.cmake for where it stands and why.

cmake_path(ABSOLUTE_PATH linkDir BASE_DIRECTORY "${prefix}" NORMALIZE)
cmake_path(ABSOLUTE_PATH script BASE_DIRECTORY "${prefix}" NORMALIZE)
if(prefix STREQUAL "/usr")
    string(PREPEND linkDir /usr/share/gdb/auto-load)
endif()
cmake_path(RELATIVE_PATH script BASE_DIRECTORY "${linkDir}")

set(link "${linkDir}/${linkName}")
message(STATUS "Installing: $ENV{DESTDIR}${link}")
file(MAKE_DIRECTORY "$ENV{DESTDIR}${linkDir}")
file(CREATE_LINK "${script}" "$ENV{DESTDIR}${link}" SYMBOLIC)
list(APPEND CMAKE_INSTALL_MANIFEST_FILES "${link}")
