// Runs Lua scripts on pools. Each script has a Lua state with a heap of its own, which serves all
// blocks of the state. When a script ends, one call drops its heap; lua_close would free each
// block. With --heap the states use the C library's malloc, for comparison.
//
// Standard output has only what the scripts print; the figures go to standard error. Dropping a
// heap runs no finalizers (__gc, <close> of a suspended coroutine). Use --close for scripts that
// need them.

#include <MemPoolHeap>

#include <sys/resource.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <string>
#include <vector>

#include <lua.hpp>

#include "CommandLine.hpp"

namespace {

using OBR::MemPool::Heap;
using OBR::MemPool::HeapSettings;

// An interpreter has hundreds of thousands of small blocks of few sizes, so it gains most from the
// largest buckets: few are made, and blocks that are allocated together lie together. The collector
// frees thousands of blocks at a time and almost empties a size class, so empty buckets are kept.
// Records of up to 1000 bytes hold all objects and small tables. There are few larger blocks.
HeapSettings Settings(bool on) {
    return HeapSettings().On(on).BucketSize(65535).MaxRecordSize(1000).KeepEmptyBuckets(true);
}

// Lua's allocator. If it returns null, Lua collects garbage, tries again, and finally raises its
// own "not enough memory". No exception crosses Lua's frames.
void* FromHeap(void* heap, void* block, std::size_t oldSize, std::size_t size) {
    return static_cast<Heap*>(heap)->Call(block, oldSize, size);
}

void* FromMalloc(void*, void* block, std::size_t, std::size_t size) {
    if (size == 0) {
        std::free(block);
        return nullptr;
    }
    return std::realloc(block, size);
}

struct Options {
    std::vector<std::string> scripts;
    bool useMalloc = false;
    bool off = false;
    bool close = false;
    bool report = false;
};

double Seconds() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return std::chrono::duration<double>(now).count();
}

// The message handler of lua_pcall: adds a traceback to the error.
int AddTraceback(lua_State* lua) {
    const char* const text = luaL_tolstring(lua, 1, nullptr);
    luaL_traceback(lua, lua, text, 1);
    return 1;
}

// Runs the script of that name. Called in protected mode, since each call here can run out of
// memory.
int RunScript(lua_State* lua) {
    const auto* const name = static_cast<const char*>(lua_touserdata(lua, 1));
    luaL_openlibs(lua);
    lua_createtable(lua, 0, 1);
    lua_pushstring(lua, name);
    lua_rawseti(lua, -2, 0);
    lua_setglobal(lua, "arg");

    lua_pushcfunction(lua, AddTraceback);
    if (luaL_loadfile(lua, name) != LUA_OK) { return lua_error(lua); }
    if (lua_pcall(lua, 0, 0, -2) != LUA_OK) { return lua_error(lua); }
    return 0;
}

bool Succeeds(lua_State* lua, const std::string& script) {
    lua_pushcfunction(lua, RunScript);
    lua_pushlightuserdata(lua, const_cast<char*>(script.c_str()));
    if (lua_pcall(lua, 1, 0, 0) == LUA_OK) { return true; }
    const char* const text = lua_tostring(lua, -1);
    std::fprintf(stderr, "LuaHost: %s\n", text != nullptr ? text : "an error without a message");
    return false;
}

bool Run(const Options& options, const std::string& script, std::size_t number) {
    std::unique_ptr<Heap> heap;
    if (!options.useMalloc) {
        // The number keeps names of pools unique if a script runs twice.
        const std::string name = std::to_string(number) + " " + script;
        heap = std::make_unique<Heap>(name.c_str(), Settings(!options.off));
    }
    lua_State* const lua =
        heap ? lua_newstate(FromHeap, heap.get()) : lua_newstate(FromMalloc, nullptr);
    if (lua == nullptr) {
        std::fprintf(stderr, "LuaHost: %s: not enough memory\n", script.c_str());
        return false;
    }

    const double begin = Seconds();
    const bool success = Succeeds(lua, script);
    const double run = Seconds() - begin;
    if (heap && options.report) {
        std::fflush(stdout);
        heap->GetMgr().Dbg();
    }

    const double end = Seconds();
    if (!heap || options.close) { lua_close(lua); }
    if (heap) { heap->FreeAll(); }
    const double close = Seconds() - end;

    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::fprintf(stderr, "%s: run %.3f s, close %.4f s, peak %.1f MB\n", script.c_str(), run, close,
                 static_cast<double>(usage.ru_maxrss) / 1000);
    return success;
}

int Main(int argc, char** argv) {
    Options options;
    CommandLine line("LuaHost", "Runs Lua scripts, each in a memory pool of its own.");
    line.Files("SCRIPT", options.scripts, "Lua scripts to run, one after the other");
    line.Flag("--heap", options.useMalloc, "Use the C library's malloc instead of pools");
    line.Flag("--off", options.off, "Disable pools, so that a memory checker sees each block");
    line.Flag("--close", options.close,
              "Close the state before the heap is dropped, which runs finalizers");
    line.Flag("--report", options.report, "Print the pool of each script when it ends");
    int status = 0;
    if (!line.Read(argc, argv, status)) { return status; }

    bool success = true;
    for (std::size_t number = 0; number < options.scripts.size(); ++number) {
        success = Run(options, options.scripts[number], number + 1) && success;
    }
    return success ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Main(argc, argv);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "LuaHost: %s\n", error.what());
        return 1;
    }
}
