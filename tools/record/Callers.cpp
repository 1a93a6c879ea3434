// Unwinding a stack takes thousands of cycles, far more than an allocation. So each return address
// is unwound only once: its distance to the next one on the stack is the same at every call. A
// function whose stack frame varies in size is an exception. It counts as the caller itself, and a
// recorded stack ends there.

#include "record/Callers.hpp"

#include <dlfcn.h>
#include <fnmatch.h>
#include <link.h>
#include <sys/auxv.h>
#include <unistd.h>
#include <unwind.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <ctime>

#include "trace/PassingOn.hpp"

namespace Recorder {

namespace {

const char* Pointer(std::uint64_t address) {
    const char* pointer = nullptr;
    std::memcpy(&pointer, &address, sizeof(pointer));
    return pointer;
}

constexpr std::size_t maxFrames = maxDepth + 8;  // The recorder's own among them.

constexpr std::size_t longestSearch = 64;  // In a table.

// The entry of the address in the table, or the free entry for it; the last one if there is none.
Caller& Find(Channel& channel, std::uint64_t address) {
    std::size_t place = address * 0x9E3779B97F4A7C15U >> 48;
    for (std::size_t step = 0; step != longestSearch; ++step, ++place) {
        Caller& caller = channel.callers[place % maxCaller];
        const std::uint64_t found = caller.address.load(std::memory_order_acquire);
        if (found == address || found == 0) { return caller; }
    }
    return channel.callers[maxCaller];
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
    const bool isEnd = frames.number == maxFrames || _Unwind_GetIP(context) == 0;
    if (isEnd) { return _URC_END_OF_STACK; }
    frames.frames[frames.number++] = {_Unwind_GetIP(context), _Unwind_GetCFA(context)};
    return _URC_NO_REASON;
}

// Whether a function passes memory on, by its exported name or by a pattern of the user. Finding
// the name takes long.
bool IsWrapper(const Channel& channel, std::uint64_t returnAddress) {
    Dl_info info = {};
    if (dladdr(Pointer(returnAddress - 1), &info) == 0 || info.dli_sname == nullptr) {
        return false;
    }
    if (Trace::PassesOn(info.dli_sname)) { return true; }
    const char* pattern = channel.skipped;
    while (*pattern != '\0' && fnmatch(pattern, info.dli_sname, 0) != 0) {
        pattern += std::strlen(pattern) + 1;
    }
    return *pattern != '\0';
}

// The file that was loaded around an address. Finding it takes neither a lock nor a symbol.
struct Loaded {
    explicit Loaded(const void* address) {
        dl_find_object found = {};
        if (_dl_find_object(const_cast<void*>(address), &found) == 0) {
            base = found.dlfo_map_start;
            name = found.dlfo_link_map->l_name;
        }
    }

    const void* base = nullptr;  // Null if there is none.
    const char* name = "";       // Empty for the program itself.
};

void FindPath(const Loaded& loaded, char* path, std::size_t size) {
    const bool isProgram = loaded.base == Loaded(Pointer(getauxval(AT_ENTRY))).base;
    const ssize_t found = isProgram ? readlink("/proc/self/exe", path, size - 1) : -1;
    if (found >= 0) {
        path[found] = '\0';
    } else {
        std::strncpy(path, loaded.name, size - 1);
        path[size - 1] = '\0';
    }
}

std::uint32_t FindModule(Channel& channel, const Loaded& loaded) {
    char path[sizeof(Module::path)];
    FindPath(loaded, path, sizeof(path));
    const auto base = reinterpret_cast<std::uint64_t>(loaded.base);
    // A signal handler that has interrupted the holder of the lock gives up.
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

// The entry of the address, which is added if it is missing; the last one if there is no room.
Caller& FindOrAdd(Channel& channel, std::uint64_t address) {
    while (true) {
        Caller& caller = Find(channel, address);
        if (&caller == &channel.callers[maxCaller]) { return caller; }
        std::uint64_t found = 0;
        const bool isAdded = caller.address.compare_exchange_strong(found, address);
        if (isAdded || found == address) { return caller; }
    }
}

// Enters the address, unless the table is full. Returns whether the walk goes on past it.
bool Enter(Channel& channel, const Frame& frame, std::uint64_t frameSize) {
    Caller& caller = FindOrAdd(channel, frame.address);
    if (&caller == &channel.callers[maxCaller]) { return false; }
    const std::uint32_t state = caller.state.load(std::memory_order_acquire);
    if (state == Caller::Passed && caller.frameSize != frameSize) {
        caller.state.store(Caller::Variable, std::memory_order_release);
        return false;
    }
    if (state != Caller::Unknown) { return state == Caller::Passed; }
    const Loaded loaded(Pointer(frame.address - 1));
    caller.module = loaded.base != nullptr ? FindModule(channel, loaded) : 0;
    const bool isPassed =
        frameSize != 0 && (channel.by == By::Stack || Trace::IsRuntime(loaded.name) ||
                           (channel.by == By::Caller && IsWrapper(channel, frame.address)));
    caller.frameSize = frameSize;
    void* const returnAddress = const_cast<char*>(Pointer(frame.address));
    caller.function = reinterpret_cast<std::uint64_t>(_Unwind_FindEnclosingFunction(returnAddress));
    caller.state.store(isPassed ? Caller::Passed : Caller::Final, std::memory_order_release);
    return isPassed;
}

// The callers of a walk, the innermost first.
struct Trail {
    void Add(std::size_t caller) {
        callers[number++] = static_cast<std::uint16_t>(caller);
        hash = (hash ^ caller) * 0x9E3779B97F4A7C15U;
        hash ^= hash >> 32;
    }

    std::uint16_t callers[maxDepth];
    std::size_t number = 0;
    std::uint64_t hash = 0;
};

// Unwinds the stack and adds the missing addresses to the table.
__attribute__((noinline)) void Unwind(Channel& channel, std::uint64_t address,
                                      std::uint64_t stack) {
    const int oldErrno = errno;
    Frames found;
    found.number = 0;
    _Unwind_Backtrace(AddFrame, &found);
    std::size_t index = 0;
    while (index != found.number && found.frames[index].stack != stack) { ++index; }
    if (index == found.number) {  // Code without unwind tables.
        Enter(channel, {address, stack}, 0);
    }
    // The size of the last frame that was stored is unknown.
    const std::size_t end = found.number - (found.number == maxFrames ? 1 : 0);
    for (bool isPassed = true; isPassed && index < end; ++index) {
        const Frame& frame = found.frames[index];
        const std::uint64_t frameSize =
            index + 1 != found.number ? found.frames[index + 1].stack - frame.stack : 0;
        isPassed = Enter(channel, frame, frameSize);
    }
    errno = oldErrno;
}

// Walks from caller to caller through the table. False if one is missing.
bool Follow(Channel& channel, std::uint64_t address, std::uint64_t stack, Trail& trail) {
    trail.number = 0;
    trail.hash = 0;
    do {
        const Caller& caller = Find(channel, address);
        const auto index = static_cast<std::size_t>(&caller - channel.callers);
        const bool isEntered = caller.address.load(std::memory_order_acquire) == address;
        const std::uint32_t state = caller.state.load(std::memory_order_acquire);
        if (index != maxCaller && (!isEntered || state == Caller::Unknown)) { return false; }
        trail.Add(index);
        if (state != Caller::Passed) { return true; }
        stack += caller.frameSize;
        std::memcpy(&address, Pointer(stack) - sizeof(address), sizeof(address));
    } while (trail.number != channel.depth);
    return true;
}

// The index of the stack in the table, to which it is added if it is new.
std::uint64_t Intern(Channel& channel, const Trail& trail) {
    const std::uint64_t hash = trail.hash | 1;
    std::size_t place = hash >> 44;
    for (std::size_t step = 0; step != longestSearch; ++step, ++place) {
        Stack& stack = channel.stacks[place % maxGroup];
        std::uint64_t found = stack.hash.load(std::memory_order_acquire);
        if (found == 0 && stack.hash.compare_exchange_strong(found, hash)) { found = hash; }
        if (found != hash) { continue; }
        // Any thread that finds it empty fills it: the thread that entered it may not run for long.
        if (stack.number.load(std::memory_order_acquire) == 0) {
            const auto number = static_cast<std::uint32_t>(trail.number);
            const std::uint32_t most = numFrames - number;
            if (channel.framesUsed.load() > most) { break; }  // The sum never wraps.
            const std::uint32_t first = channel.framesUsed.fetch_add(number);
            if (first > most) { break; }
            std::memcpy(channel.frames + first, trail.callers, number * sizeof(*trail.callers));
            stack.first.store(first, std::memory_order_release);
            stack.number.store(number, std::memory_order_release);
        }
        return place % maxGroup;
    }
    return maxGroup;
}

// The processor time of this thread. Reading it takes a system call: little, compared with
// unwinding.
std::uint64_t ProcessorNanoseconds() {
    timespec time = {};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * 1000000000U +
           static_cast<std::uint64_t>(time.tv_nsec);
}

}  // namespace

std::uint64_t FindGroup(Channel& channel, const void* returnAddress, const void* frame) {
    const auto address = reinterpret_cast<std::uint64_t>(returnAddress);
    const auto stack = reinterpret_cast<std::uint64_t>(frame);
    Trail trail;
    if (!Follow(channel, address, stack, trail)) {
        const std::uint64_t start = ProcessorNanoseconds();
        Unwind(channel, address, stack);
        channel.unwindNanoseconds.fetch_add(ProcessorNanoseconds() - start,
                                            std::memory_order_relaxed);
        if (!Follow(channel, address, stack, trail)) { trail.Add(maxCaller); }
    }
    return channel.by == By::Stack ? Intern(channel, trail) : trail.callers[trail.number - 1];
}

}  // namespace Recorder
