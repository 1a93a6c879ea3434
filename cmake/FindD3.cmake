# D3, version 3, from the Debian package. D3_SCRIPT is the file.
find_file(D3_SCRIPT d3.min.js PATHS /usr/share/javascript/d3 NO_DEFAULT_PATH)
include(FindPackageHandleStandardArgs)
find_package_handle_standard_args(D3 REQUIRED_VARS D3_SCRIPT)
mark_as_advanced(D3_SCRIPT)
