// The malloc family in a program that runs on the preloaded pools.

#include <dlfcn.h>
#include <malloc.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <new>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

extern "C" void* __libc_malloc(std::size_t size);

namespace {

// A compiler that knows malloc would optimise half of this away.
void* (*volatile const Malloc)(std::size_t) = malloc;
void* (*volatile const Calloc)(std::size_t, std::size_t) = calloc;
void* (*volatile const Realloc)(void*, std::size_t) = realloc;

bool Holds(const void* block, std::size_t size, std::uint8_t fill) {
    const auto* const bytes = static_cast<const std::uint8_t*>(block);
    return std::count(bytes, bytes + size, fill) == static_cast<std::ptrdiff_t>(size);
}

bool IsAligned(const void* block, std::size_t alignment) {
    return reinterpret_cast<std::uintptr_t>(block) % alignment == 0;
}

// Blocks change their sizes at random, in the pool and outside of it. False if one lost a byte.
bool Works(unsigned int seed) {
    std::mt19937 random(seed);
    struct Block {
        void* start = nullptr;
        std::size_t size = 0;
        std::uint8_t fill = 0;
    };
    std::vector<Block> blocks(100);
    bool works = true;
    for (int step = 0; step < 20000; ++step) {
        Block& block = blocks[random() % blocks.size()];
        const std::size_t size = random() % (random() % 8 == 0 ? 5000 : 200);
        block.start = Realloc(block.start, size);
        works = works && Holds(block.start, std::min(size, block.size), block.fill);
        works = works && IsAligned(block.start, 16) && malloc_usable_size(block.start) >= size;
        block.size = size;
        block.fill = static_cast<std::uint8_t>(random());
        if (block.start != nullptr) { std::memset(block.start, block.fill, size); }
    }
    for (const Block& block : blocks) { free(block.start); }
    return works;
}

// Runs `action` in a child and returns its result.
template <typename Action>
bool InChild(Action action) {
    const pid_t child = fork();
    if (child == 0) { _exit(action() ? 0 : 1); }
    int status = -1;
    waitpid(child, &status, 0);
    return status == 0;
}

}  // namespace

TEST(MallocOnPoolsTest, ServesEverySize) {
    Dl_info info{};
    ASSERT_NE(dladdr(reinterpret_cast<void*>(Malloc), &info), 0);
    ASSERT_NE(std::strstr(info.dli_fname, "MallocOnPools"), nullptr);
    EXPECT_TRUE(Works(1));
    void* const large = Malloc(100);
    EXPECT_EQ(Realloc(large, 60), large);
    EXPECT_NE(Realloc(large, 4), large);
    void* const none = Malloc(0);
    EXPECT_NE(none, nullptr);
    EXPECT_EQ(Realloc(none, 0), nullptr);
    free(nullptr);
    EXPECT_EQ(malloc_usable_size(nullptr), 0U);
    // Up to the largest record of 1000 bytes, in multiples of 16. The bytes before a block show
    // where it came from.
    void* const inPool = Malloc(988);
    EXPECT_NE(static_cast<std::uint32_t*>(inPool)[-1], 0U);
    void* const beyond = Malloc(989);
    EXPECT_EQ(static_cast<std::uint32_t*>(beyond)[-1], 0U);
    free(inPool);
    free(beyond);
    void* const small = Malloc(12);
    EXPECT_EQ(malloc_usable_size(small), 12U) << "16 bytes in all.";
    free(small);
}

TEST(MallocOnPoolsTest, ClearsAndRefuses) {
    for (const std::size_t size : {24U, 900U, 3000U}) {
        void* const dirty = Malloc(3 * size);
        std::memset(dirty, 0xEE, 3 * size);
        free(dirty);
        void* const clear = Calloc(3, size);
        void* const next = Calloc(3, size);
        EXPECT_TRUE(Holds(clear, 3 * size, 0));
        EXPECT_TRUE(IsAligned(clear, 16) && IsAligned(next, 16));
        free(clear);
        free(next);
    }
    errno = 0;
    const volatile std::size_t many = SIZE_MAX / 2 + 8;  // Twice that is 14 in 64 bits.
    EXPECT_EQ(Calloc(many, 2), nullptr);
    EXPECT_EQ(errno, ENOMEM);
    errno = 0;
    EXPECT_EQ(reallocarray(nullptr, many, 2), nullptr);
    EXPECT_EQ(errno, ENOMEM);
    EXPECT_EQ(Malloc(many), nullptr);
}

TEST(MallocOnPoolsTest, AlignsAsAsked) {
    for (std::size_t alignment = 8; alignment <= 65536; alignment *= 2) {
        void* block = nullptr;
        EXPECT_EQ(posix_memalign(&block, alignment, 40), 0);
        void* const blocks[] = {block, aligned_alloc(alignment, 40), memalign(alignment, 40)};
        for (void* const aligned : blocks) {
            EXPECT_TRUE(IsAligned(aligned, alignment) && IsAligned(aligned, 16));
            EXPECT_GE(malloc_usable_size(aligned), 40U);
            std::memset(aligned, 1, 40);
            free(aligned);
        }
    }
    const volatile std::size_t many = SIZE_MAX / 2;
    void* block = &block;
    errno = 0;
    EXPECT_EQ(posix_memalign(&block, 4, 40), EINVAL);
    EXPECT_EQ(posix_memalign(&block, 24, 40), EINVAL);
    EXPECT_EQ(posix_memalign(&block, 32, many), ENOMEM);
    EXPECT_EQ(block, &block);
    EXPECT_EQ(errno, 0);
}

TEST(MallocOnPoolsTest, TakesBlocksOfTheCLibrary) {
    void* block = __libc_malloc(40);
    std::memset(block, 7, 40);
    EXPECT_EQ(malloc_usable_size(block), 40U);
    block = Realloc(block, 4000);
    EXPECT_TRUE(Holds(block, 40, 7));
    free(block);
}

// The pages that only the start-up of the library uses, 300 KB, do not stay.
TEST(MallocOnPoolsTest, TakesLittleMemoryItself) {
    std::ifstream maps("/proc/self/smaps");
    bool isOfLibrary = false;
    int kilobytes = 0;
    for (std::string line; std::getline(maps, line);) {
        if (line.find('-') < line.find(' ')) {
            isOfLibrary = line.find("MallocOnPools.so") != std::string::npos;
        } else if (isOfLibrary && line.rfind("Rss:", 0) == 0) {
            kilobytes += std::stoi(line.substr(4));
        }
    }
    EXPECT_GT(kilobytes, 0);
    EXPECT_LT(kilobytes, 400);
}

TEST(MallocOnPoolsTest, ThreadsAndTheirChildrenShareIt) {
    std::atomic<bool> goesOn{true};
    std::thread others[2];
    std::atomic<bool> works{true};
    unsigned int seed = 0;
    for (std::thread& other : others) {
        other = std::thread([&works, &goesOn, start = ++seed]() mutable {
            for (int turn = 0; turn < 20 || goesOn; ++turn) { works = Works(start += 2) && works; }
        });
    }
    void* const block = Malloc(32);
    std::thread([block] { free(block); }).join();
    for (int turn = 0; turn < 20; ++turn) {
        EXPECT_TRUE(InChild([] { return InChild([] { return Works(9); }); }));
    }
    goesOn = false;
    for (std::thread& other : others) { other.join(); }
    EXPECT_TRUE(works);
}

TEST(MallocOnPoolsTest, SurvivesExhaustedMemory) {
    EXPECT_TRUE(InChild([] {
        const rlimit limit = {64 << 20, 64 << 20};
        setrlimit(RLIMIT_AS, &limit);
        void* last = nullptr;
        while (void* const block = Malloc(100)) {
            *static_cast<void**>(block) = last;
            last = block;
        }
        if (errno != ENOMEM || last == nullptr) { return false; }
        bool isThrown = false;
        try {
            ::operator delete(::operator new(100));
        } catch (const std::bad_alloc&) { isThrown = true; }
        while (last != nullptr) {
            void* const next = *static_cast<void**>(last);
            free(last);
            last = next;
        }
        return isThrown && Works(1);
    }));
}
