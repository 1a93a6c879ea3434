// A program to be recorded. Its argument says what it does. Its own blocks have sizes from 70000
// on. It links nothing of the project.

#include <alloca.h>
#include <dlfcn.h>
#include <malloc.h>
#include <pthread.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fstream>
#include <new>
#include <string>
#include <thread>
#include <vector>

namespace {

// What is stored here counts as used for an optimiser.
void* volatile sink = nullptr;
volatile std::size_t tooMany = ~std::size_t{0};

void* Keep(void* block) {
    sink = block;
    return block;
}
void Use(std::size_t size) {
    errno = ENOTTY;
    std::free(Keep(std::malloc(size)));
    if (errno != ENOTTY) { std::abort(); }
}

// A block that was there before main, and one that nobody frees.
struct Early {
    void* block = Keep(std::malloc(70000));
} early;

void Family() {
    std::free(Keep(std::malloc(70001)));
    std::free(Keep(std::calloc(7, 10001)));
    void* block = Keep(std::realloc(nullptr, 70002));
    block = Keep(std::realloc(block, 70003));
    block = Keep(reallocarray(block, 2, 35002));
    if (reallocarray(block, tooMany, 2) != nullptr) { std::abort(); }
    if (std::realloc(block, tooMany / 4) != nullptr) { std::abort(); }
    sink = std::realloc(block, 0);
    std::free(Keep(memalign(64, 70005)));
    std::free(Keep(std::aligned_alloc(64, 70016)));
    void* aligned = nullptr;
    if (posix_memalign(&aligned, 4096, 70007) != 0 || malloc_usable_size(aligned) < 70007) {
        std::abort();
    }
    std::free(Keep(aligned));
    if (posix_memalign(&aligned, 3, 70008) == 0 || aligned == nullptr) { std::abort(); }
    std::free(Keep(valloc(70009)));
    std::free(Keep(pvalloc(70010)));
    std::free(early.block);
    std::free(nullptr);
}

struct alignas(64) Wide {
    char bytes[70016];
};

void Operators() {
    ::operator delete(Keep(::operator new(70001)));
    ::operator delete (Keep(::operator new(70002)), std::size_t{70002});
    ::operator delete[](Keep(::operator new[](70003)));
    ::operator delete(Keep(::operator new(70004, std::nothrow)), std::nothrow);
    delete static_cast<Wide*>(Keep(new Wide));
    delete[] static_cast<Wide*>(Keep(new (std::nothrow) Wide[1]));
}

void Threads() {
    std::vector<std::thread> threads;
    for (int index = 0; index != 4; ++index) {
        threads.emplace_back([] {
            std::vector<void*> blocks;
            for (int round = 0; round != 20000; ++round) {
                blocks.push_back(std::malloc(70000));
                if (round % 3 != 0) {
                    std::free(blocks.back());
                    blocks.pop_back();
                }
            }
            for (void* const block : blocks) { std::free(block); }
        });
    }
    for (std::thread& thread : threads) { thread.join(); }
    std::thread([] { sink = std::malloc(70001); }).join();
    std::free(sink);
}

void Wait(pid_t child) {
    int status = 0;
    if (waitpid(child, &status, 0) != child || status != 0) { std::abort(); }
}

void Fork() {
    Use(70001);
    const pid_t child = fork();
    if (child == 0) {
        Use(70002);
        _exit(0);
    }
    Wait(child);
    Use(70003);
}

void VFork() {
    const pid_t child = vfork();
    if (child == 0) {
        execlp("sh", "sh", "-c", "exit 0", nullptr);
        _exit(1);
    }
    Wait(child);
    Use(70001);
}

void Spawn(const char* self) {
    if (std::system((std::string(self) + " family").c_str()) != 0) { std::abort(); }
    Use(70001);
}

void Exec(const char* self) {
    Use(70001);
    execl(self, self, "callers", nullptr);
}

// Becomes itself so many times, while other threads allocate.
void Execs(const char* self, int number) {
    if (number == 0) { return; }
    for (int index = 0; index != 3; ++index) {
        std::thread([] {
            while (true) { Use(16); }
        }).detach();
    }
    usleep(2000);
    execl(self, self, "execs", std::to_string(number - 1).c_str(), nullptr);
}

void Load() {
    void* const library = dlopen("libz.so.1", RTLD_NOW);
    if (library == nullptr) { std::abort(); }
    Use(70001);
    dlclose(library);
    Use(70002);
}

void Signals() {
    std::signal(SIGALRM, [](int) { Use(70001); });
    ualarm(1000, 1000);
    for (int count = 0; count != 300000; ++count) { Use(16); }
    ualarm(0, 0);
}

void Spin() {
    const std::clock_t end = std::clock() + CLOCKS_PER_SEC / 10;
    while (std::clock() < end) {}
    for (int count = 0; count != 50000; ++count) { Use(200); }
}

void Allocate() {
    for (int count = 0; count != 1000000; ++count) { Use(200); }
}

// Most of the time is in a few calls, which clear large blocks.
void Clear() {
    mallopt(M_MMAP_THRESHOLD, 32 << 20);
    mallopt(M_TRIM_THRESHOLD, 64 << 20);
    for (int count = 0; count != 20000; ++count) { Use(200); }
    for (int count = 0; count != 20; ++count) { std::free(Keep(std::calloc(1, 16 << 20))); }
}

// With nobody to drain the channel, which fills.
void Stop() {
    kill(getppid(), SIGSTOP);
    Allocate();
    std::puts("done");
}

void CountInterrupts() {
    static volatile std::sig_atomic_t number = 0;
    std::signal(SIGINT, [](int) { number = number + 1; });
    std::puts("ready");
    std::fflush(stdout);
    while (number == 0) { usleep(1000); }
    usleep(200000);
    std::printf("%d\n", static_cast<int>(number));
}

// Allocates from time to time until it is killed.
void Run() {
    Use(70001);
    std::puts("ready");
    std::fflush(stdout);
    while (usleep(1000) == 0) { Use(16); }
}

void Environment() {
    for (char** variable = environ; *variable != nullptr; ++variable) { std::puts(*variable); }
    for (int descriptor = 3; descriptor != 1024; ++descriptor) {
        if (lseek(descriptor, 0, SEEK_CUR) >= 0) { std::printf("open %d\n", descriptor); }
    }
}

}  // namespace

__attribute__((noinline)) void FirstCaller() {
    Keep(std::malloc(70001));
}
// A string that is duplicated is the C library's own call of malloc, in the name of its caller,
// which has a hash as in Rust.
__attribute__((noinline)) void SecondCaller() __asm__("_ZN6Second6Caller17h0123456789abcdefE");
void SecondCaller() {
    const std::string text(70001, 'x');
    Keep(strdup(text.c_str()));
}

// Names as in Rust. Two of them are the same without their arguments.
__attribute__((noinline)) void Node() __asm__("_RNvNtC4demo5parse4node");
__attribute__((noinline)) void GrowBytes() __asm__("_RINvC4demo4growhE");
__attribute__((noinline)) void GrowWords() __asm__("_RINvC4demo4growmE");
__attribute__((noinline)) void Step() __asm__("_RNvXC4demoNtB2_4TreeNtB2_4Walk4step");
void Node() {
    Keep(std::malloc(70001));
}
void GrowBytes() {
    Keep(std::malloc(70002));
}
void GrowWords() {
    Keep(std::malloc(70003));
}
void Step() {
    Keep(std::malloc(70004));
}

// A function that passes memory on.
extern "C" __attribute__((noinline)) void* pass_Alloc(std::size_t size) {
    return Keep(std::malloc(size));
}
template <typename>
__attribute__((noinline)) void ThirdCaller() {
    Keep(pass_Alloc(70001));
}

__attribute__((noinline)) void FourthCaller(std::size_t size) {
    Keep(alloca(size));
    FirstCaller();
}

// Passes memory on, but its name is not exported.
__attribute__((noinline)) static void* LocalAlloc(std::size_t size) __asm__("local_alloc");
static void* LocalAlloc(std::size_t size) {
    return Keep(std::malloc(size));
}
__attribute__((noinline)) void FifthCaller() {
    Keep(LocalAlloc(70001));
}

int main(int argc, char** argv) {
    const std::string what = argc > 1 ? argv[1] : "";
    if (what == "family") { Family(); }
    if (what == "operators") { Operators(); }
    if (what == "threads") { Threads(); }
    if (what == "fork") { Fork(); }
    if (what == "vfork") { VFork(); }
    if (what == "spawn") { Spawn(argv[0]); }
    if (what == "exec") { Exec(argv[0]); }
    if (what == "execs") { Execs(argv[0], std::atoi(argv[2])); }
    if (what == "load") { Load(); }
    if (what == "signals") { Signals(); }
    if (what == "spin") { Spin(); }
    if (what == "allocate") {
        Allocate();
        std::ofstream("ticks") << std::clock();
    }
    if (what == "clear") { Clear(); }
    if (what == "stop") { Stop(); }
    if (what == "interrupts") { CountInterrupts(); }
    if (what == "run") { Run(); }
    if (what == "environment") { Environment(); }
    if (what == "callers") {
        FirstCaller();
        SecondCaller();
        ThirdCaller<std::vector<int>>();
    }
    if (what == "names") {
        Node();
        GrowBytes();
        GrowWords();
        Step();
    }
    if (what == "local") {
        FifthCaller();
        usleep(200000);  // Until mempool has named the function.
        for (int count = 0; count != 2; ++count) { FifthCaller(); }
    }
    if (what == "alloca") {
        for (const std::size_t size : {100U, 3000U}) { FourthCaller(size); }
    }
    if (what == "exit") {
        Use(70001);
        _exit(7);
    }
    if (what == "abort") {
        Use(70001);
        std::abort();
    }
    return 0;
}
