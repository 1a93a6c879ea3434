# Part of an install: creates the link through which gdb finds `script` for the library in `linkDir`. Both
# are absolute or relative to `prefix`. Gdb.cmake explains where the link must be.

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
