# Optional parts of the project. A part needs Debian packages. If one is missing the part is left out, or the
# configure step fails if the option of the part is ON:
#
#   optional_part(OBR_MEMPOOL_TOOLS "Build the tools")
#   part_needs(OBR_MEMPOOL_TOOLS mempool
#       CLI11 libcli11-dev
#       ZLIB zlib1g-dev)
#   if(CAN_BUILD_mempool)
#
# The option is ON (all of the part must be built), OFF (none of it), or AUTO (as much as possible).

# optional_part(OPTION HELP [DEFAULT]): declares the option of a part. DEFAULT is AUTO if omitted. Inside of
# another project the option is OFF.
function(optional_part option help)
    set(default ${ARGN} AUTO)
    list(GET default 0 default)
    if(NOT PROJECT_IS_TOP_LEVEL)
        set(default OFF)
    endif()
    set(${option} ${default} CACHE STRING "${help}: ON, OFF, or AUTO to leave out what lacks a package")
    set_property(CACHE ${option} PROPERTY STRINGS AUTO ON OFF)
endfunction()

# part_needs(OPTION NAME [CMAKE_PACKAGE DEBIAN_PACKAGE]...): looks for the packages that NAME needs and sets
# CAN_BUILD_NAME. A version may follow the CMake package after a blank. This is a macro, so that the caller
# sees the variables that a package sets.
macro(part_needs option name)
    set(CAN_BUILD_${name} FALSE)
    if(${option})
        set(partPackages ${ARGN})
        set(partMissing "")
        while(partPackages)
            list(POP_FRONT partPackages partPackage partDebianPackage)
            string(REPLACE " " ";" partPackage "${partPackage}")
            find_package(${partPackage} QUIET)
            list(GET partPackage 0 partPackage)
            if(NOT ${partPackage}_FOUND)
                string(APPEND partMissing " ${partDebianPackage}")
            endif()
        endwhile()
        set(partMessage "${name} cannot be built without the Debian packages:${partMissing} (${option})")
        if(NOT partMissing)
            set(CAN_BUILD_${name} TRUE)
        elseif("${${option}}" STREQUAL "AUTO")
            message(STATUS "${partMessage}")
        else()
            message(FATAL_ERROR "${partMessage}")
        endif()
    endif()
endmacro()
