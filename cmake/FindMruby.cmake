# The Ruby engine mruby, as Mruby::Mruby.
include(FindPackageHandleStandardArgs)
find_path(Mruby_INCLUDE_DIR mruby.h)
find_library(Mruby_LIBRARY mruby)
find_package_handle_standard_args(Mruby REQUIRED_VARS Mruby_LIBRARY Mruby_INCLUDE_DIR)
if(Mruby_FOUND AND NOT TARGET Mruby::Mruby)
    add_library(Mruby::Mruby UNKNOWN IMPORTED)
    set_target_properties(Mruby::Mruby PROPERTIES
        IMPORTED_LOCATION ${Mruby_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${Mruby_INCLUDE_DIR}
        INTERFACE_LINK_LIBRARIES m)
endif()
mark_as_advanced(Mruby_INCLUDE_DIR Mruby_LIBRARY)
