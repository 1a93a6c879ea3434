# The JavaScript engine duktape, as Duktape::Duktape.
include(FindPackageHandleStandardArgs)
find_path(Duktape_INCLUDE_DIR duktape.h)
find_library(Duktape_LIBRARY duktape)
find_package_handle_standard_args(Duktape REQUIRED_VARS Duktape_LIBRARY Duktape_INCLUDE_DIR)
if(Duktape_FOUND AND NOT TARGET Duktape::Duktape)
    add_library(Duktape::Duktape UNKNOWN IMPORTED)
    set_target_properties(Duktape::Duktape PROPERTIES
        IMPORTED_LOCATION ${Duktape_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${Duktape_INCLUDE_DIR})
endif()
mark_as_advanced(Duktape_INCLUDE_DIR Duktape_LIBRARY)
