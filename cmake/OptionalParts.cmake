# Parts of the project beside the library. What a part needs comes from Debian packages; where one is
# missing the part is left out, unless its option asks for it:
#
#   optional_part(OBR_MEMPOOL_TOOLS "Build the tools")
#   part_needs(OBR_MEMPOOL_TOOLS mempool
#       CLI11 libcli11-dev
#       ZLIB zlib1g-dev)
#   if(CAN_BUILD_mempool)
#
# The option is ON (everything of the part must be built), OFF (nothing is), or AUTO (what can be).

# Declares the option of a part: AUTO by default, or what a third argument says; OFF inside of another
# project.
function(optional_part option help)
    set(default ${ARGN} AUTO)
    list(GET default 0 default)
    if(NOT PROJECT_IS_TOP_LEVEL)
        set(default OFF)
    endif()
    set(${option} ${default} CACHE STRING "${help}: ON, OFF, or AUTO, which leaves out what it cannot")
    set_property(CACHE ${option} PROPERTY STRINGS AUTO ON OFF)
endfunction()

# Finds what `name`, of the part with that option, needs: pairs of a CMake package, whose version may
# follow behind a blank, and the Debian package that brings it. Sets CAN_BUILD_name. A macro, since
# what a package sets is meant for the caller.
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
