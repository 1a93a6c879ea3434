// Runs a Ruby program in mruby, whose interpreter takes every block from a heap. The options are
// those of examples/JsHost.cpp.

#include <MemPoolHeap>

#include <cstdio>
#include <memory>
#include <string>

#include <mruby.h>
#include <mruby/compile.h>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;

void* FromHeap(mrb_state*, void* block, std::size_t size, void* heap) {
    auto& pool = *static_cast<Heap*>(heap);
    if (size != 0) { return pool.Realloc(block, size); }
    pool.Free(block);
    return nullptr;
}

}  // namespace

int main(int argc, char** argv) {
    std::string program;
    bool useMalloc = false;
    bool off = false;
    bool close = false;
    CommandLine line("RubyHost", "Runs a Ruby program in a memory pool.");
    line.File("PROGRAM", program, "A Ruby file");
    line.Flag("--heap", useMalloc, "Use the C library's malloc instead of pools");
    line.Flag("--off", off, "Disable pools");
    line.Flag("--close", close, "Free all blocks before the heap");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    Heap heap("ruby", HeapSettings().On(!off));
    mrb_state* const ruby = useMalloc ? mrb_open() : mrb_open_allocf(FromHeap, &heap);
    if (ruby == nullptr) { return 1; }
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(program.c_str(), "r"),
                                                               std::fclose);
    if (file == nullptr) {
        std::perror(program.c_str());
        return 1;
    }
    mrb_load_file(ruby, file.get());
    const bool success = ruby->exc == nullptr;
    if (!success) { mrb_print_error(ruby); }
    if (useMalloc || close) { mrb_close(ruby); }
    heap.FreeAll();
    return success ? 0 : 1;
}
