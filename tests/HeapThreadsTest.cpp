// Heaps that are built, used and destroyed in several threads at once.

#include <MemPoolHeap>

#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace OBR::MemPool {

TEST(HeapThreads, HaveHeapsOfTheirOwn) {
    const auto work = [](std::size_t thread) {
        for (std::size_t round = 0; round < 300; ++round) {
            const std::size_t size = 8 * (1 + thread % 2 * 50 + round % 10);
            const std::string name = std::to_string(thread) + " " + std::to_string(round);
            Heap named(name.c_str(), HeapSettings().On(true).MinRecordSize(size + 8));
            const bool isOn = thread % 3 != 0;
            Heap unnamed(nullptr, HeapSettings().On(isOn));
            ASSERT_EQ(named.UsableSize(named.Malloc(1)), size);
            ASSERT_EQ(unnamed.GetMgr().IsEnabled(), isOn);
            // More than 16 buckets of one class, so that the heap builds its second pool.
            for (std::size_t i = 0; i < 3000; ++i) { unnamed.Malloc(40); }
            ASSERT_EQ(unnamed.GetStats().buckets, isOn ? 19 : 0);
        }
    };
    std::vector<std::thread> threads;
    for (std::size_t number = 0; number < 4; ++number) { threads.emplace_back(work, number); }
    for (std::thread& thread : threads) { thread.join(); }
    EXPECT_EQ(GetNumMgrs(), 0);
    EXPECT_FALSE(NUV_OBR_MEMPOOL_ON());
}

}  // namespace OBR::MemPool
