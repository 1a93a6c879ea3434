# GNU libiberty, which demangles names of C++ and Rust, as LibIberty::LibIberty.
include(FindPackageHandleStandardArgs)
find_path(LibIberty_INCLUDE_DIR libiberty/demangle.h)
find_library(LibIberty_LIBRARY iberty)
find_package_handle_standard_args(LibIberty REQUIRED_VARS LibIberty_LIBRARY LibIberty_INCLUDE_DIR)
if(LibIberty_FOUND AND NOT TARGET LibIberty::LibIberty)
    add_library(LibIberty::LibIberty UNKNOWN IMPORTED)
    set_target_properties(LibIberty::LibIberty PROPERTIES
        IMPORTED_LOCATION ${LibIberty_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${LibIberty_INCLUDE_DIR})
endif()
mark_as_advanced(LibIberty_INCLUDE_DIR LibIberty_LIBRARY)
