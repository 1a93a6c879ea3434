// Functions that only pass on the memory that they ask for, so that the caller of one is the one
// who wants it. For the recorder inside of a program: it uses the C library alone.

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
                              "std::", "__gnu_cxx::", "alloc::", "core::"}) {
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
