// A host with faults: `Faulty bare|heap FAULT...` makes them one after the other, on bare pools or
// heaps, and announces each on standard error. Comments mark the lines that reports must name:
// where a fault is made, and where it is found if that is another line.

#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <mutex>
#include <string>
#include <thread>

#include <MemPool>
#include <MemPoolHeap>

using namespace OBR::MemPool;

namespace {

struct Bare {
    Mgr pool;
    explicit Bare(const char* name) : pool(name) {}
    volatile char* Take(unsigned int size) { return static_cast<char*>(pool.Alloc(size)); }
    bool Give(volatile char* block) { return pool.Free(const_cast<char*>(block)); }
    void Drop() { pool.Clear(); }
    bool Knows(volatile char* block) {
        return pool.Contains(const_cast<char*>(block)) &&
               pool.GetSize(const_cast<char*>(block)) != 0;
    }
};

struct Layered {
    Heap heap;
    explicit Layered(const char* name) : heap(name) {}
    volatile char* Take(unsigned int size) {
        return static_cast<char*>(heap.Realloc(heap.Malloc(2 * size), size));
    }
    bool Give(volatile char* block) { return heap.Free(const_cast<char*>(block)); }
    void Drop() { heap.FreeAll(); }
    bool Knows(volatile char* block) {
        static_cast<void>(heap.GetStats());
        return heap.UsableSize(const_cast<char*>(block)) != 0;
    }
};

// Destroys a pool after main, before the library reports what is in use.
void (*destroyLate)() = nullptr;
__attribute__((destructor)) void DestroyLate() {
    if (destroyLate != nullptr) { destroyLate(); }
}

template <typename Pool>
bool Make(const std::string& fault) {
    Pool nodes("nodes");
    Pool others("others");
    const bool isLarge = fault.find(", large") != std::string::npos;
    const unsigned int size = isLarge ? 2001 : fault == "overrun 1" ? 1 : 13;
    volatile char* const block = nodes.Take(size);  // taken here
    const auto is = [&](const char* name) { return fault.find(name) == 0; };
    if (is("none")) {
        // Everything that looks at a header, and settings that do not reach these buckets.
        volatile char* const second = nodes.Take(size);
        std::memset(const_cast<char*>(block), 1, size);
        GetMgr("nodes")->DbgDetailed();
        return nodes.Knows(second) && others.Knows(second) == isLarge && nodes.Give(block) &&
               nodes.Give(second) && !nodes.Give(nullptr);
    }
    if (is("read after free")) {
        nodes.Give(block);
        return block[3] != 100;  // at: read after free
    } else if (is("write after free")) {
        nodes.Give(block);
        block[3] = 1;  // at: write after free
    } else if (is("use after clear")) {
        nodes.Drop();
        block[3] = 1;  // at: use after clear
    } else if (is("double free, then a child")) {
        nodes.Give(block);
        nodes.Give(block);
        if (fork() == 0) { std::exit(0); }
        int status = -1;
        wait(&status);
        if (status != 0) { std::exit(4); }
    } else if (is("disabled pool")) {
        NUV_OBR_MEMPOOL_ON(false);
        Mgr off("off");
        NUV_OBR_MEMPOOL_ON(true);
        const bool refused = !off.Free(const_cast<char*>(block));  // at: disabled pool
        return nodes.Give(block) && refused && off.Free(off.Alloc(size));
    } else if (is("no bytes")) {
        NUV_OBR_MEMPOOL_DATA_ALIGNMENT(4);
        NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(4);
        NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(4);
        Mgr tiny("tiny");
        NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(1000);
        return nodes.Give(block) && !tiny.Free(tiny.Alloc(0));  // at: no bytes, taken here
    } else if (is("two threads") || is("threads in turns")) {
        std::mutex turns[2];
        std::atomic<int> left = 20;
        const auto work = [&](std::mutex& turn) {
            {
                const std::lock_guard<std::mutex> lock(turn);
                nodes.Give(nodes.Take(size));  // at: two threads
            }
            std::this_thread::sleep_for(std::chrono::microseconds(100));
        };
        std::thread worker([&] {
            pthread_setname_np(pthread_self(), "worker");
            for (; left > 0; --left) { work(turns[is("two threads")]); }
        });
        while (left > 0) { work(turns[0]); }
        worker.join();
        return nodes.Give(block);
    } else if (is("ends with 3")) {
        std::exit(3);
    } else if (is("heap leak")) {
        static_cast<void>(new int[1000]);
        return nodes.Give(block);  // NOLINT(clang-analyzer-cplusplus.NewDeleteLeaks)
    } else if (is("double free")) {
        nodes.Give(block);
        return !nodes.Knows(block) && !nodes.Give(block);  // at: double free
    } else if (is("wrong pool")) {
        const bool refused = !others.Give(block);  // at: wrong pool
        return nodes.Give(block) && refused;
    } else if (is("inner")) {
        const bool refused = !nodes.Give(block + size) && !nodes.Give(block + 8);  // at: inner
        return nodes.Give(block) && refused;
    } else if (is("overrun 100")) {
        block[size + 99] = 1;  // at: overrun 100
        return nodes.Give(block);
    } else if (is("overrun 40")) {
        block[size + 39] = 1;  // at: overrun 40
        return nodes.Give(block);
    } else if (is("overrun 1")) {
        block[size] = 1;  // at: overrun 1
        return nodes.Give(block);
    } else if (is("heap record overrun")) {
        block[size] = 1;  // at: heap record overrun
        return nodes.Give(block);
    } else if (is("underrun 100")) {
        block[-100] = 1;  // at: underrun 100
        return nodes.Give(block);
    } else if (is("underrun 40")) {
        block[-40] = 1;                         // at: underrun 40
        const bool known = nodes.Knows(block);  // found: underrun 40
        return nodes.Give(block) && known;
    } else if (is("underrun 1")) {
        block[-1] = 1;      // at: underrun 1
        nodes.Give(block);  // found: underrun 1
    } else if (is("cleared")) {
        block[-40] = 1;  // at: cleared
        nodes.Drop();    // found: cleared
    } else if (is("neighbours")) {
        volatile char* const second = nodes.Take(size);
        volatile char* const third = nodes.Take(size);
        block[-40] = third[-40] = 1;  // at: neighbours
        nodes.Give(second);           // found: neighbours
        std::cerr << "== after neighbours" << std::endl;
        return nodes.Give(block) && nodes.Give(third);
    } else if (is("beside")) {
        block[-48] = 1;                                  // at: beside
        volatile char* const second = nodes.Take(size);  // found: beside
        return nodes.Give(second) && nodes.Give(block);
    } else if (is("leak at exit")) {
        static auto* const kept = new Pool("kept");
        static Pool* const alive[] = {new Pool("alive"), new Pool("also")};
        for (Pool* const pool : alive) { pool->Take(size); }
        kept->Take(992);  // at: exit, taken here
        destroyLate = [] { delete kept; };
        return nodes.Give(block);
    } else if (is("leak")) {
        for (int count = 0; count < 3; ++count) { nodes.Take(size); }  // at: leak
    } else {
        return false;
    }
    return true;
}

}  // namespace

int main(int argc, char** argv) {
    NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(true);
    NUV_OBR_MEMPOOL_DATA_ALIGNMENT(8);
    const bool isBare = argv[1] == std::string("bare");
    for (int i = 2; i < argc; ++i) {
        std::cerr << "== " << argv[i] << std::endl;
        if (!(isBare ? Make<Bare>(argv[i]) : Make<Layered>(argv[i]))) {
            std::cerr << "wrong answer" << std::endl;
        }
    }
    std::cerr << "== exit" << std::endl;
    std::fputs("all", fdopen(STDOUT_FILENO, "w"));  // Stays in the buffer.
}
