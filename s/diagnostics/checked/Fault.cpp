// Only a handler of on_exit learns the exit status. This one is registered before main and does not
// belong to any library, so that it runs after the destructors of the host and of every library. It
// also flushes C's streams, since the process ends here.

#include "diagnostics/checked/Fault.hpp"

#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>

#include "HostLayer/HostEnv.hpp"
#include "diagnostics/checked/Variables.hpp"

// Null if the host has no LeakSanitizer. The check runs once; if it finds a leak, it ends the
// process with its own status.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" __attribute__((weak, visibility("default"))) void __lsan_do_leak_check();

namespace OBR::MemPool::Checked {

namespace {

std::atomic<pid_t> faulty = 0;  // The process in which a fault was reported, or 0.

#ifdef __GLIBC__
constexpr const char* statusVariable = "MEMPOOL_CHECK_STATUS";

void End(int status, void* /*none*/) {
    if (status != 0 || faulty != getpid()) { return; }
    const int own = NumberOf(statusVariable, 0, 255, 99);
    if (own == 0) { return; }
    if (__lsan_do_leak_check != nullptr) { __lsan_do_leak_check(); }
    std::fflush(nullptr);
    _exit(own);
}

// A library that can be unloaded must not leave the handler behind. `mempool check` sets the
// variable and preloads the library, which therefore stays.
__attribute__((constructor)) void Register() {
    if (Host_Env::GetEnv(statusVariable) != nullptr) { on_exit(End, nullptr); }
}
#endif

}  // namespace

void Report(const BucketMgr& pool, const std::string& what) {
    const std::string line = "mempool: pool " + pool.name + ": " + what + "\n";
    std::fputs(line.c_str(), stderr);
    std::fflush(stderr);
    faulty = getpid();
}

}  // namespace OBR::MemPool::Checked
