# elfutils: libdw as LibDw::LibDw, libelf as LibDw::LibElf.
include(FindPackageHandleStandardArgs)
find_path(LibDw_INCLUDE_DIR elfutils/libdwfl.h)
find_library(LibDw_LIBRARY dw)
find_library(LibDw_ELF_LIBRARY elf)
find_package_handle_standard_args(LibDw
    REQUIRED_VARS LibDw_LIBRARY LibDw_ELF_LIBRARY LibDw_INCLUDE_DIR)
if(LibDw_FOUND AND NOT TARGET LibDw::LibDw)
    add_library(LibDw::LibElf UNKNOWN IMPORTED)
    set_target_properties(LibDw::LibElf PROPERTIES
        IMPORTED_LOCATION ${LibDw_ELF_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${LibDw_INCLUDE_DIR})
    add_library(LibDw::LibDw UNKNOWN IMPORTED)
    set_target_properties(LibDw::LibDw PROPERTIES
        IMPORTED_LOCATION ${LibDw_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${LibDw_INCLUDE_DIR})
endif()
mark_as_advanced(LibDw_INCLUDE_DIR LibDw_LIBRARY LibDw_ELF_LIBRARY)
