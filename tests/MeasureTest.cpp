// The measurements of a replay, with a clock of the test's own, which advances by 1, 2, 3 and so on
// nanoseconds per reading, and with the counters of the heap.

#include "replay/Measure.hpp"

#include <malloc.h>

#include <cstdint>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <MemPool/Bucket.hpp>
#include <MemPool>

#include "TraceLines.hpp"
#include "replay/Clock.hpp"
#include "replay/HeapCount.hpp"
#include "replay/Recording.hpp"

double Replay::ProcessorNanoseconds() {
    static double now = 0;
    static double step = 0;
    return now += ++step;
}

namespace {

using Replay::Layer;

Replay::Recording Record(const std::string& shorthand, std::size_t maxSteps = 1000000) {
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    Trace::StepReader reader(ReadLines(Lines(shorthand)), "lines");
    return Replay::ReadRecording(
        reader, [](auto) {}, maxSteps);
}

// What the allocator takes for a request, its header of 8 bytes included.
std::int64_t Taken(std::size_t size) {
    void* const block = ::operator new(size);
    const auto usable = static_cast<std::int64_t>(malloc_usable_size(block));
    ::operator delete(block);
    return usable + 8;
}

TEST(Recording, FindsTheFirstOfThePeaksWithTheMostBlocks) {
    const Replay::Recording recording = Record(
        "@c:P\n@n:P:caller\n@a:P:X:64\n@x:P\n@a:P:X:24\n@a:P:Y:40\n@f:P:Y:\n@a:P:Y:40\n@x:P\n"
        "@c:Q\n@a:Q:X:64\n@d:Q\n@a:P:X:1\n");
    EXPECT_EQ(recording.peakSteps, 5U);
    EXPECT_EQ(recording.peakBytes, 64U);
    EXPECT_EQ(recording.peakBlocks, 2U);
    EXPECT_EQ(recording.numCleared, 3U);
    EXPECT_EQ(recording.numNeverFreed, 2U);
    EXPECT_EQ(recording.steps.size(), 12U);
}

TEST(Recording, CountsTheStepsAboveItsLimit) {
    const Replay::Recording recording =
        Record("@c:P\n@a:P:X:64\n@f:P:X:\n@n:P:caller\n@a:P:X:8\n", 2);
    EXPECT_EQ(recording.steps.size(), 2U);
    EXPECT_EQ(recording.numLeftOut, 2U) << "A name is no step.";
}

TEST(Recording, MergesGroupsButNoPools) {
    const std::string groups = "@i:by:caller\n@c:P\n@a:P:X:64\n@c:Q\n@a:Q:Y:8\n";
    Replay::Recording heap = Record(groups + "@c:R\n@f:Q:Y:\n");
    Replay::MergePools(heap);
    EXPECT_EQ(heap.pools.size(), 1U);
    EXPECT_EQ(heap.steps.size(), 4U);
    EXPECT_EQ(heap.peakSteps, 3U);
    for (const Trace::Step& step : heap.steps) { EXPECT_EQ(step.pool, 0U); }
    const std::string lines = "@c:P\n@a:P:X:64\n@c:Q\n@a:Q:Y:8\n";
    for (const std::string& real :
         {lines, "@i:by:pools\n" + lines, groups + "@x:Q\n", groups + "@d:Q\n"}) {
        Replay::Recording pools = Record(real);
        Replay::MergePools(pools);
        EXPECT_EQ(pools.pools.size(), 2U) << real;
    }
}

// The pools are clocked twice, the heap twice more for what it frees at the end of a pool.
TEST(Measure, ChargesEachSideWithTheTimeOfItsEvents) {
    const Replay::Recording recording = Record("@c:P\n@a:P:X:8\n@x:P\n@a:P:X:8\n@d:P\n");
    EXPECT_DOUBLE_EQ(Replay::NanosecondsPerEvent(recording, Layer::Heap), 2. / 5);
    EXPECT_DOUBLE_EQ(Replay::NanosecondsPerEvent(recording, Layer::System), (4. + 6) / 5);
}

TEST(Measure, CountsWhatIsHeldAndGivesAllOfItBack) {
    const Replay::Recording recording =
        Record("@c:P\n@a:P:X:5000\n@x:P\n@c:Q\n@a:Q:X:6000\n@d:Q\n@a:P:X:6000\n@a:P:Y:1025\n");
    EXPECT_EQ(Replay::BytesHeld(recording, Layer::System), Taken(6000) + Taken(1025))
        << "In place of the bytes asked for.";
    EXPECT_NEAR(static_cast<double>(Replay::BytesHeld(recording, Layer::Mgr)),
                6000 + 1025 + 2 * 24 + 249 * 8 + 400, 400);

    HeapCount::Start();
    for (const Layer layer : {Layer::Heap, Layer::Malloc, Layer::Mgr, Layer::System}) {
        Replay::NanosecondsPerEvent(recording, layer);
    }
    EXPECT_EQ(HeapCount::Stop(), 0);
}

// 1000 blocks of 24 bytes with the header of a record: 28 bytes as they are; 4 more to be aligned
// to 8 or, in the malloc layer, for a record of a multiple of 16. One of 988 bytes is the largest
// that the malloc layer takes from its pool.
TEST(Measure, ChargesABlockWithWhatItsLayerTakes) {
    std::string lines = "@c:P\n";
    for (int i = 0; i < 1000; ++i) {
        lines += "@a:P:" + std::to_string(1000000000000000 + i) + ":24\n";
    }
    const Replay::Recording recording = Record(lines);
    const auto held = [&](Layer layer) {
        return static_cast<double>(Replay::BytesHeld(recording, layer)) / 1000;
    };
    EXPECT_NEAR(held(Layer::Mgr), 28 + 3.5, 1.5);
    EXPECT_NEAR(held(Layer::Heap), 32 + 3.5, 1.5);
    EXPECT_NEAR(held(Layer::Malloc), 32 + 3.5 + Replay::bytesOfPreload / 1000., 1.5)
        << "With the pages of the preload.";
    const auto one = [&](const std::string& size) {
        return Replay::BytesHeld(Record("@c:P\n@a:P:X:" + size + "\n"), Layer::Malloc);
    };
    EXPECT_GT(one("988"), one("989") + 2000);
    EXPECT_EQ(OBR::MemPool::Bucket::shift, 0U) << "Other pools are as before.";
}

}  // namespace
