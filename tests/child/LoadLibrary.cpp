// Loads the library named by its argument at run time, and catches what may come out of that. Like
// ShowSettings.cpp it does not use the standard streams of C++.

#include <dlfcn.h>

#include <cstdio>

int main(int, char** arguments) {
    try {
        std::puts(dlopen(arguments[1], RTLD_NOW) != nullptr ? "loaded" : dlerror());
    } catch (...) { std::puts("caught"); }
}
