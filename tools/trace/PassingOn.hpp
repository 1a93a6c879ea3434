// Functions that only pass memory on to their callers. The recorder in a program uses this file, so
// it needs only the C library.

#ifndef OBR_TOOLS_TRACE_PASSINGON_HPP
#define OBR_TOOLS_TRACE_PASSINGON_HPP

#include <strings.h>

#include <cstring>
#include <initializer_list>

namespace Trace {

// Whether the file is a run-time library of C or C++.
inline bool IsRuntime(const char* path) {
    const char* const slash = std::strrchr(path, '/');
    const char* const name = slash == nullptr ? path : slash + 1;
    for (const char* start :
         {"libc.so", "libc-", "libstdc++.so", "libgcc_s.so", "libc++.so", "libc++abi.so",
          "ld-linux", "libm.so", "libpthread.so", "libmempool-record"}) {
        if (std::strncmp(name, start, std::strlen(start)) == 0) { return true; }
    }
    return false;
}

// Whether the function, mangled or not, is one of the malloc family by its name, operator new, or
// one of the C++ or Rust library.
inline bool PassesOn(const char* function) {
    for (const char* start : {"_Zn", "_ZSt", "_ZNSt", "_ZNKSt", "_ZN9__gnu_cxx", "operator new",
                              "std::", "__gnu_cxx::", "alloc::", "core::", "<alloc::", "<core::"}) {
        if (std::strncmp(function, start, std::strlen(start)) == 0) { return true; }
    }
    for (const char* part : {"malloc", "calloc", "realloc", "memalign", "strdup", "strndup"}) {
        if (strcasestr(function, part) != nullptr) { return true; }
    }
    const std::size_t size = std::strlen(function);
    return size >= 5 && strcasecmp(function + size - 5, "alloc") == 0;
}

}  // namespace Trace

#endif
