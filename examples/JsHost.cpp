// Runs a JavaScript program in duktape, whose interpreter takes every block from a heap. When the
// program ends, the heap is dropped as a whole. duk_destroy_heap would free block by block and run
// finalizers; use --close for a program that needs those. With --heap the blocks come from the C
// library's malloc, for comparison.
//
// Programs can call print(text), and readLine(), which returns the next line of the standard input
// or undefined at its end.

#include <MemPoolHeap>

#include <cstdio>
#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <string>

#include <duktape.h>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;

struct Options {
    std::string program;
    bool useMalloc = false;
    bool off = false;
    bool close = false;
};

// duktape passes its context to each call. If one returns null, it collects garbage, tries again,
// and finally throws an error in the JavaScript program. These operations of a heap throw nothing,
// so no exception crosses duktape's frames.
void* Malloc(void* heap, duk_size_t size) {
    return static_cast<Heap*>(heap)->Malloc(size);
}
void* Realloc(void* heap, void* block, duk_size_t size) {
    return static_cast<Heap*>(heap)->Realloc(block, size);
}
void Free(void* heap, void* block) {
    static_cast<Heap*>(heap)->Free(block);
}

duk_ret_t Print(duk_context* js) {
    std::puts(duk_to_string(js, 0));
    return 0;
}

duk_ret_t ReadLine(duk_context* js) {
    static std::string line;
    if (!std::getline(std::cin, line)) { return 0; }
    duk_push_lstring(js, line.data(), line.size());
    return 1;
}

// Runs the text of a program. An error returns to the caller, which prints its message.
duk_ret_t RunProgram(duk_context* js, void* text) {
    duk_push_c_function(js, Print, 1);
    duk_put_global_string(js, "print");
    duk_push_c_function(js, ReadLine, 0);
    duk_put_global_string(js, "readLine");
    duk_eval_string_noresult(js, static_cast<const std::string*>(text)->c_str());
    return 0;
}

bool Run(const Options& options, std::string text) {
    Heap heap("js", HeapSettings().On(!options.off));
    duk_context* const js = options.useMalloc
                                ? duk_create_heap_default()
                                : duk_create_heap(Malloc, Realloc, Free, &heap, nullptr);
    if (js == nullptr) {
        std::fprintf(stderr, "JsHost: not enough memory\n");
        return false;
    }
    const bool success = duk_safe_call(js, RunProgram, &text, 0, 1) == DUK_EXEC_SUCCESS;
    if (!success) {
        std::fprintf(stderr, "JsHost: %s: %s\n", options.program.c_str(),
                     duk_safe_to_string(js, -1));
    }
    if (options.useMalloc || options.close) { duk_destroy_heap(js); }
    heap.FreeAll();
    return success;
}

int Main(int argc, char** argv) {
    Options options;
    CommandLine line("JsHost", "Runs a JavaScript program in a memory pool.");
    line.File("PROGRAM", options.program, "A JavaScript file");
    line.Flag("--heap", options.useMalloc, "Use the C library's malloc instead of pools");
    line.Flag("--off", options.off, "Disable pools, so that a memory checker sees each block");
    line.Flag("--close", options.close, "Run finalizers and free all blocks before the heap");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    std::ifstream input(options.program);
    if (!input) { throw std::runtime_error("cannot read " + options.program); }
    const std::string text(std::istreambuf_iterator<char>(input), {});
    std::ios::sync_with_stdio(false);  // Faster input: reading is not what is measured here.
    return Run(options, text) ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Main(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "JsHost: %s\n", error.what());
        return 1;
    }
}
