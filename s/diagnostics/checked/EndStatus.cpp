// How the status is changed: only a handler of on_exit learns what the process was to end with.
// This one stands ready before main and in no library's name, so that it runs behind the
// destructors of the host and of every library. Flushing C's streams, which comes behind it, is
// done here.

#include "diagnostics/checked/EndStatus.hpp"

#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>

#include "HostLayer/HostEnv.hpp"

// Null where the host has no LeakSanitizer. A status of its own wins, if it has not looked yet.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" __attribute__((weak, visibility("default"))) void __lsan_do_leak_check();

namespace OBR::MemPool::EndStatus {

namespace {

// The process that a fault was told of, or 0.
std::atomic<pid_t> faulty = 0;

#ifdef __GLIBC__
int AskedFor() {
    const char* const text = Host_Env::GetEnv("MEMPOOL_CHECK_STATUS");
    char* end = nullptr;
    const long status = text == nullptr ? 0 : std::strtol(text, &end, 10);
    return status >= 1 && status <= 255 && *end == '\0' ? static_cast<int>(status) : 0;
}

void End(int status, void* /*none*/) {
    if (status != 0 || faulty != getpid()) { return; }
    if (__lsan_do_leak_check != nullptr) { __lsan_do_leak_check(); }
    std::fflush(nullptr);
    _exit(AskedFor());
}

// A library that can be unloaded must not leave the handler behind: only `mempool check`, which
// preloads this one, asks for it.
__attribute__((constructor)) void StandReady() {
    if (AskedFor() != 0) { on_exit(End, nullptr); }
}
#endif

}  // namespace

void NoteFault() {
    faulty = getpid();
}

}  // namespace OBR::MemPool::EndStatus
