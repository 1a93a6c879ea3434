// Unwinding a stack takes thousands of cycles, far more than an allocation. So each return address
// is unwound once: its distance to the next one on the stack is the same at every call. Only a
// function that takes a variable part of the stack is an exception; it counts as the caller itself.

#include "record/Callers.hpp"

#include <dlfcn.h>
#include <fnmatch.h>
#include <strings.h>
#include <sys/auxv.h>
#include <unistd.h>
#include <unwind.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <ctime>
#include <initializer_list>

namespace Recorder {

namespace {

const char* Pointer(std::uint64_t address) {
    const char* pointer = nullptr;
    std::memcpy(&pointer, &address, sizeof(pointer));
    return pointer;
}

constexpr std::size_t maxFrames = 48;

// The place of the address in the table, or that where it belongs; the last one if it is full.
Caller& Find(Channel& channel, std::uint64_t address) {
    constexpr std::size_t longestSearch = 64;
    std::size_t place = address * 0x9E3779B97F4A7C15U >> 48;
    for (std::size_t step = 0; step != longestSearch; ++step, ++place) {
        Caller& caller = channel.callers[place % maxGroup];
        const std::uint64_t found = caller.address.load(std::memory_order_acquire);
        if (found == address || found == 0) { return caller; }
    }
    return channel.callers[maxGroup];
}

// The active calls, the innermost first. `stack` is the stack pointer after the return.
struct Frame {
    std::uint64_t address;
    std::uint64_t stack;
};
struct Frames {
    Frame frames[maxFrames];
    std::size_t number;
};

_Unwind_Reason_Code AddFrame(_Unwind_Context* context, void* toFrames) {
    auto& frames = *static_cast<Frames*>(toFrames);
    if (frames.number == maxFrames) { return _URC_END_OF_STACK; }
    frames.frames[frames.number++] = {_Unwind_GetIP(context), _Unwind_GetCFA(context)};
    return _URC_NO_REASON;
}

bool IsRuntime(const char* path) {
    const char* const slash = std::strrchr(path, '/');
    const char* const name = slash == nullptr ? path : slash + 1;
    for (const char* start :
         {"libc.so", "libc-", "libstdc++.so", "libgcc_s.so", "libc++.so", "libc++abi.so",
          "ld-linux", "libm.so", "libpthread.so", "libmempool-record"}) {
        if (std::strncmp(name, start, std::strlen(start)) == 0) { return true; }
    }
    return false;
}

// Whether the function only passes on what an allocator gives: one of the malloc family by its
// name, operator new, one of the C++ library, or one that the user has named.
bool IsWrapper(const Channel& channel, const char* function) {
    for (const char* start : {"_Zn", "_ZSt", "_ZNSt", "_ZNKSt", "_ZN9__gnu_cxx"}) {
        if (std::strncmp(function, start, std::strlen(start)) == 0) { return true; }
    }
    for (const char* part : {"malloc", "calloc", "realloc", "memalign", "strdup", "strndup"}) {
        if (strcasestr(function, part) != nullptr) { return true; }
    }
    const std::size_t size = std::strlen(function);
    if (size >= 5 && strcasecmp(function + size - 5, "alloc") == 0) { return true; }
    const char* pattern = channel.skipped;
    while (*pattern != '\0' && fnmatch(pattern, function, 0) != 0) {
        pattern += std::strlen(pattern) + 1;
    }
    return *pattern != '\0';
}

// The path of the program's own file, which the loader calls by whatever name it was started.
void FindPath(const Dl_info& info, char* path, std::size_t size) {
    Dl_info program = {};
    const std::uint64_t entry = getauxval(AT_ENTRY);
    const bool isProgram =
        dladdr(Pointer(entry), &program) != 0 && program.dli_fbase == info.dli_fbase;
    const ssize_t found = isProgram ? readlink("/proc/self/exe", path, size - 1) : -1;
    if (found >= 0) {
        path[found] = '\0';
    } else {
        std::strncpy(path, info.dli_fname, size - 1);
        path[size - 1] = '\0';
    }
}

std::uint32_t FindModule(Channel& channel, const Dl_info& info) {
    char path[sizeof(Module::path)];
    FindPath(info, path, sizeof(path));
    const auto base = reinterpret_cast<std::uint64_t>(info.dli_fbase);
    // A signal handler may have interrupted the one who holds the lock: it gives up then.
    for (int tries = 0; channel.modulesLock.exchange(1) != 0; ++tries) {
        if (tries == 1000000) { return 0; }
    }
    const std::uint32_t number = channel.modulesUsed.load();
    std::uint32_t index = 1;
    for (; index <= number; ++index) {
        const Module& module = channel.modules[index];
        if (module.base == base && std::strcmp(module.path, path) == 0) { break; }
    }
    if (index > number && index < numModules) {
        Module& module = channel.modules[index];
        module.base = base;
        std::memcpy(module.path, path, sizeof(path));
        channel.modulesUsed.store(index);
    }
    channel.modulesLock.store(0);
    return index < numModules ? index : 0;
}

// Fills the table's place for the address. Returns whether the address is passed over.
bool Enter(Channel& channel, Caller& caller, const Frame& frame, std::uint64_t frameSize) {
    std::uint64_t none = 0;
    if (!caller.address.compare_exchange_strong(none, frame.address)) {
        const std::uint32_t state = caller.state.load(std::memory_order_acquire);
        if (state == Caller::Passed && caller.frameSize != frameSize) {
            caller.state.store(Caller::Variable, std::memory_order_release);
            return false;
        }
        return state == Caller::Passed;
    }
    Dl_info info = {};
    const bool isKnown = dladdr(Pointer(frame.address - 1), &info) != 0;
    caller.module = isKnown ? FindModule(channel, info) : 0;
    const bool isWrapper =
        channel.by == By::Caller && info.dli_sname != nullptr && IsWrapper(channel, info.dli_sname);
    const bool isPassed = isKnown && frameSize != 0 && (isWrapper || IsRuntime(info.dli_fname));
    caller.frameSize = frameSize;
    caller.state.store(isPassed ? Caller::Passed : Caller::Final, std::memory_order_release);
    return isPassed;
}

std::uint64_t IndexOf(const Channel& channel, const Caller& caller) {
    return static_cast<std::uint64_t>(&caller - channel.callers);
}

// Unwinds the stack, enters what the table lacks and returns the index of the caller.
__attribute__((noinline)) std::uint64_t Unwind(Channel& channel, std::uint64_t address,
                                               std::uint64_t stack) {
    const int oldErrno = errno;
    Frames found;
    found.number = 0;
    _Unwind_Backtrace(AddFrame, &found);
    std::size_t index = 0;
    while (index != found.number && found.frames[index].stack != stack) { ++index; }
    const Caller* caller = nullptr;
    if (index == found.number) {  // Code without tables to unwind it by.
        Caller& only = Find(channel, address);
        Enter(channel, only, {address, stack}, 0);
        caller = &only;
    }
    for (bool isPassed = true; isPassed && index != found.number; ++index) {
        const Frame& frame = found.frames[index];
        const std::uint64_t frameSize =
            index + 1 < found.number ? found.frames[index + 1].stack - frame.stack : 0;
        Caller& place = Find(channel, frame.address);
        caller = &place;
        isPassed = IndexOf(channel, place) != maxGroup && Enter(channel, place, frame, frameSize);
    }
    errno = oldErrno;
    return IndexOf(channel, *caller);
}

// Of this thread. Asking for it takes a system call, which is little beside unwinding.
std::uint64_t ProcessorNanoseconds() {
    timespec time = {};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * 1000000000U +
           static_cast<std::uint64_t>(time.tv_nsec);
}

}  // namespace

std::uint64_t FindCaller(Channel& channel, const void* returnAddress, const void* frame) {
    const auto first = reinterpret_cast<std::uint64_t>(returnAddress);
    std::uint64_t address = first;
    auto stack = reinterpret_cast<std::uint64_t>(frame);
    for (std::size_t depth = 0; depth != maxFrames; ++depth) {
        const Caller& caller = Find(channel, address);
        if (caller.address.load(std::memory_order_relaxed) != address) {
            if (IndexOf(channel, caller) == maxGroup) { return maxGroup; }
            break;
        }
        if (caller.state.load(std::memory_order_acquire) != Caller::Passed) {
            return IndexOf(channel, caller);
        }
        stack += caller.frameSize;
        std::memcpy(&address, Pointer(stack) - sizeof(address), sizeof(address));
    }
    const std::uint64_t start = ProcessorNanoseconds();
    const std::uint64_t index = Unwind(channel, first, reinterpret_cast<std::uint64_t>(frame));
    channel.unwindNanoseconds.fetch_add(ProcessorNanoseconds() - start, std::memory_order_relaxed);
    return index;
}

}  // namespace Recorder
