// A Heap on a heap below that is watched: its blocks, the calls of C, its figures and its settings.

#include <MemPoolHeap>

#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <optional>
#include <random>
#include <sstream>
#include <tuple>

#include "PoolFixture.hpp"

namespace OBR::MemPool {

namespace {

class HeapTest : public PoolFixture {};

std::size_t NumBlocks(const Heap& heap) {
    return heap.GetStats().usedRecords + heap.GetStats().heapRecords;
}

auto AllSettings() {
    return std::tuple(Settings::pool.bucketSize, Settings::pool.dataAlignment,
                      Settings::pool.maxRecordSize, Settings::pool.minRecordSize,
                      Settings::pool.keepEmptyBuckets, Settings::off);
}

// What a heap of that name and these settings is refused for; "" if it is not. The settings of the
// process are not touched.
std::string Refusal(const char* name, const HeapSettings& settings = HeapSettings()) {
    const auto before = AllSettings();
    std::string refusal;
    try {
        const Heap heap(name, settings);
        EXPECT_EQ(AllSettings(), before);
    } catch (const std::invalid_argument& error) { refusal = error.what(); }
    EXPECT_EQ(AllSettings(), before);
    return refusal;
}

}  // namespace

TEST_F(HeapTest, CountsWhatTheReportCounts) {
    Use(200, 4, 100, 8, true);
    Heap heap;
    for (std::size_t size = 0; size < 120; ++size) {
        void* const block = heap.Malloc(size);
        if (size % 3 == 0 || size < 9) { heap.Free(block); }
    }
    std::ostringstream report;
    std::streambuf* const nowhere = std::cout.rdbuf(report.rdbuf());
    heap.GetMgr().Dbg();
    std::cout.rdbuf(nowhere);
    const HeapStats stats = heap.GetStats();
    const std::pair<std::string, std::size_t> lines[] = {
        {"Num Buckets : ", stats.buckets},     {"   Empty    : ", stats.emptyBuckets},
        {"   Full     : ", stats.fullBuckets}, {"Used Recs   : ", stats.usedRecords},
        {"Free Recs   : ", stats.freeRecords}, {"Ext Recs    : ", stats.heapRecords}};
    for (const auto& [label, figure] : lines) {
        const std::size_t number = report.str().find(label) + label.size();
        EXPECT_EQ(std::stoul(report.str().substr(number)), figure) << label;
        EXPECT_NE(figure, 0) << label;
    }
}

TEST_F(HeapTest, CountsWhatItHoldsOfTheHeapBelow) {
    for (const bool off : {false, true}) {
        Settings::off = off;
        Heap heap;
        const std::size_t bytesIfNew = HeapSpy::arrayBytes;
        for (const std::size_t alignment : {1u, 8u, 64u}) {
            for (const std::size_t size : {0u, 10u, 2000u}) {
                heap.Allocate(size, alignment);
                EXPECT_EQ(heap.GetStats().bytesHeld, HeapSpy::arrayBytes - bytesIfNew);
            }
        }
    }
}

// The offsets by which GetStats reads a pool are those of the library.
TEST_F(HeapTest, KnowsTheMemoryOfAPool) {
    using namespace detail;
    Mgr mgr;
    mgr.Alloc(5000);
    const BucketMgr& pool = *mgr.GetBucketMgr();
    EXPECT_EQ(ReadAt<Group**>(&pool, format::poolGroups), pool.groups);
    EXPECT_EQ(ReadAt<std::uint32_t>(&pool, format::poolNumGroups), pool.numGroups);
    EXPECT_EQ(ReadAt<std::uint32_t>(&pool, format::poolBucketSize), pool.bucketSize);
    EXPECT_EQ(ReadAt<std::uint32_t>(&pool, format::poolRounding), pool.dataAlignment);
    EXPECT_EQ(ReadAt<std::uint32_t>(&pool, format::poolMaxRecord), pool.maxRecordSize);
    EXPECT_EQ(ReadAt<std::uint32_t>(&pool, format::poolMinRecord), pool.minRecordSize);
    EXPECT_EQ(ReadAt<bool>(&pool, format::poolKeepsEmpty), pool.keepEmptyBuckets);
    EXPECT_EQ(ReadAt<void*>(&pool, format::poolExtRecs), pool.extRecs);
    static_assert(format::bucketGroup == offsetof(Bucket, parent) &&
                  format::groupHead == offsetof(Group, head) &&
                  format::groupNumBuckets == offsetof(Group, numBuckets) &&
                  format::bucketNext == offsetof(Bucket, next1) &&
                  format::bucketSize == offsetof(Bucket, size) &&
                  format::bucketRecSize == offsetof(Bucket, recSize) &&
                  format::bucketNumFree == offsetof(Bucket, numFree) &&
                  format::extRecNext == offsetof(ExtRec, next) &&
                  format::extRecLength == offsetof(ExtRec, length) &&
                  format::sizeOfBucketHead == Bucket::baseDistance &&
                  format::sizeOfExtRec == sizeof(ExtRec) &&
                  format::sizeOfRecHdr == sizeof(RecHdr) && format::firstRecord == firstOffset);
}

// Blocks of both pools, in any order of their alignments, go back to the pool that they are from.
TEST_F(HeapTest, GoesOnInLargeBucketsWhereAClassIsLarge) {
    Heap heap("grows");
    const Heap small("small", HeapSettings().BucketSize(4010));
    const std::size_t bytesIfNew = HeapSpy::arrayBytes;
    std::vector<std::pair<char*, std::size_t>> blocks;
    std::mt19937 random(3);
    for (std::size_t n = 0; n < 40000; ++n) {
        const std::size_t size = n % 5 == 0 ? 600 + random() % 800 : 33 + n % 3;
        const std::size_t alignment = std::size_t{1} << random() % 7;
        blocks.emplace_back(static_cast<char*>(heap.Allocate(size, alignment)), size);
        std::memset(blocks.back().first, static_cast<int>(n), size);
        if (n % 3 == 0) {
            std::swap(blocks.back(), blocks[random() % blocks.size()]);
            ASSERT_GE(heap.UsableSize(blocks.back().first), blocks.back().second);
            ASSERT_TRUE(heap.Free(blocks.back().first));
            blocks.pop_back();
        }
    }
    const Mgr* const large = GetMgr("grows, large buckets");
    ASSERT_NE(large, nullptr);
    EXPECT_GT(large->GetBucketMgr()->GetNumBuckets(), 10);
    CheckInvariants(*large->GetBucketMgr());
    CheckInvariants(*heap.GetMgr().GetBucketMgr());
    EXPECT_EQ(NumBlocks(heap), blocks.size());
    EXPECT_EQ(heap.GetStats().bytesHeld, HeapSpy::arrayBytes - bytesIfNew - 249 * sizeof(Group*));
    for (const auto& [block, size] : blocks) { ASSERT_TRUE(heap.Free(block)); }
    EXPECT_EQ(heap.GetStats().bytesHeld, 0);
    EXPECT_EQ(GetNumMgrs(), 3);
}

// What is given back makes room, and the peak is the most that was held at once.
TEST_F(HeapTest, HoldsNoMoreThanItsLimit) {
    constexpr std::size_t limit = 500000;
    for (const bool on : {true, false}) {
        Heap heap(nullptr, HeapSettings().On(on).Limit(limit));
        const auto fill = [&](std::size_t size, std::size_t alignment) {
            std::vector<void*> blocks;
            while (void* const block = heap.Malloc(size, alignment)) { blocks.push_back(block); }
            EXPECT_THROW(heap.Allocate(size, alignment), std::bad_alloc);
            const HeapStats stats = heap.GetStats();
            EXPECT_LE(stats.bytesHeld, limit);
            EXPECT_GT(stats.bytesHeld, limit - 33000);
            EXPECT_EQ(stats.bytesPeak, std::max(stats.bytesPeak, stats.bytesHeld));
            return blocks;
        };
        for (void* const block : fill(5000, 8)) { heap.Free(block); }
        EXPECT_EQ(heap.GetStats().bytesHeld, 0);
        EXPECT_GT(heap.GetStats().bytesPeak, limit - 33000);
        fill(3, 4);
        heap.FreeAll();
        fill(40, 16);
        EXPECT_EQ(heap.Malloc(limit), nullptr);
    }
}

// A block that grows in small steps moves seldom, also where a limit leaves little room. If it
// shrinks to less than half, the rest is given back, or it stays where it is.
TEST_F(HeapTest, GrowsInPlaceAndGivesBackWhatIsLeft) {
    constexpr std::size_t most = 3000000;
    for (const auto& [on, alignment, limit] :
         {std::tuple(true, 8u, SIZE_MAX), std::tuple(true, 64u, SIZE_MAX),
          std::tuple(true, 8u, most * 9 / 4), std::tuple(false, 8u, SIZE_MAX)}) {
        Heap heap(nullptr, HeapSettings().On(on).Limit(limit));
        auto* block = static_cast<char*>(heap.Malloc(1, alignment));
        int moves = 0;
        for (std::size_t size = 1; size < most; size += 1 + size / 100) {
            auto* const moved = static_cast<char*>(heap.Realloc(block, size));
            ASSERT_NE(moved, nullptr);
            moves += moved == block ? 0 : 1;
            block = moved;
            ASSERT_GE(heap.UsableSize(block), size);
            std::memset(block + size / 2, static_cast<int>(size), size - size / 2);
            ASSERT_EQ(reinterpret_cast<std::uintptr_t>(block) % alignment, 0);
        }
        EXPECT_LT(moves, 60);
        for (std::size_t size = most; size > 100; size = size * 2 / 5) {
            block[0] = 'a';
            block[size / 2] = 'b';
            block = static_cast<char*>(heap.Realloc(block, size));
            EXPECT_EQ(block[0], 'a');
            EXPECT_EQ(block[size / 2], 'b');
            EXPECT_LT(heap.GetStats().bytesHeld, size == most ? 4 * most : size * 9 / 8 + 4500);
        }
        HeapSpy::refuseIn = 1;
        HeapSpy::refusesForGood = true;
        EXPECT_EQ(heap.Realloc(block, 20), block);
        HeapSpy::refuseIn = 0;
        HeapSpy::refusesForGood = false;
        EXPECT_TRUE(heap.Free(block));
        EXPECT_EQ(heap.GetStats().bytesHeld, 0);
    }
}

// If the heap gave memory back to the system, malloc's would end lower.
TEST_F(HeapTest, KeepsMemoryForTheNextBlocks) {
    Heap heap;
    const void* end = nullptr;
    for (int round = 0; round < 3; ++round) {
        for (int i = 0; i < 100000; ++i) { heap.Malloc(40); }
        if (round == 0) { end = sbrk(0); }
        heap.FreeAll();
        EXPECT_GE(sbrk(0), end);
    }
    EXPECT_LE(sbrk(0), static_cast<const char*>(end) + 500000);
}

TEST_F(HeapTest, RefusesWhatIsTooMuch) {
    constexpr std::size_t most = std::numeric_limits<std::size_t>::max();
    for (const bool off : {false, true}) {
        Settings::off = off;
        Heap heap;
        HeapSpy::lastRequest = 0;
        for (const std::size_t size : {Heap::MaxSize() + 1, std::size_t{1} << 32, most - 6, most}) {
            EXPECT_EQ(heap.Malloc(size), nullptr);
            EXPECT_EQ(heap.Calloc(size / 2 + 1, 2), nullptr);
            EXPECT_EQ(heap.Calloc(2, size / 2 + 1), nullptr);
            EXPECT_THROW(heap.Allocate(size, 4), std::bad_alloc);
            EXPECT_THROW(Allocator<int>(heap).allocate(size / 4 + 1), std::bad_alloc);
        }
        for (const std::size_t alignment : {0u, 3u, 12u, 8192u}) {
            EXPECT_THROW(heap.Allocate(1, alignment), std::bad_alloc);
        }
        EXPECT_EQ(HeapSpy::lastRequest, 0);
        EXPECT_TRUE(HeapSpy::FailsAt(0, [&] { heap.Allocate(Heap::MaxSize(), 4096); }));
    }
}

TEST_F(HeapTest, IgnoresNullAndForeignPointers) {
    std::uint64_t words[20] = {};
    for (const bool off : {false, true}) {
        Settings::off = off;
        Heap heap;
        Heap other;
        void* const block = heap.Malloc(10);
        void* const null = nullptr;
        for (void* const foreign : {null, static_cast<void*>(&words[15]), other.Malloc(10)}) {
            EXPECT_FALSE(heap.Free(foreign));
            EXPECT_EQ(heap.UsableSize(foreign), 0);
            EXPECT_EQ(heap.Realloc(foreign, 5) == nullptr, foreign != nullptr);
        }
        EXPECT_EQ(heap.Call(nullptr, 8, 0), nullptr);
        EXPECT_EQ(NumBlocks(heap), 2);
        EXPECT_EQ(NumBlocks(other), 1);
        EXPECT_EQ(heap.Realloc(block, 0), nullptr);
        EXPECT_EQ(NumBlocks(heap), 1);
        EXPECT_NE(heap.Realloc(nullptr, 0), heap.Malloc(0));
        if (!off) { EXPECT_FALSE(heap.Free(block)) << "freed twice"; }
    }
}

// Sizes at the ends of what their fields hold: a heap is refused where the process would end.
TEST_F(HeapTest, IsRefusedWhereNoPoolCanBeMade) {
    std::mt19937 random(5);
    const auto oneOf = [&random](std::initializer_list<std::uint32_t> values) {
        return values.begin()[random() % values.size()];
    };
    for (int round = 0; round < 150 && !HasFailure(); ++round) {
        Use(oneOf({0, 3, 4, 12, 100, 104, 4010, 65535, 65536}),
            static_cast<std::uint16_t>(oneOf({0, 1, 3, 4, 5, 8, 12, 100, 65531, 65532})),
            oneOf({0, 3, 4, 8, 96, 100, 1000, 65531, 65532, 0xFFFFFFFB, 0xFFFFFFFF}),
            oneOf({0, 4, 8, 96, 97, 100, 0xFFFFFFFC, 0xFFFFFFFD, 0xFFFFFFFF}));
        if (Refusal(nullptr).empty()) { continue; }
        Settings::pool.dataAlignment = RoundUp(Settings::pool.dataAlignment, 4);
        const pid_t child = fork();
        if (child == 0) {
            std::atexit([] { _exit(1); });  // A sanitizer has nothing to look for.
            _exit(Mgr().IsEnabled() ? 0 : 2);
        }
        int status = 0;
        waitpid(child, &status, 0);
        EXPECT_EQ(WEXITSTATUS(status), 1) << testing::PrintToString(AllSettings());
    }
    Use(4010, 4, 1000, 8);
    EXPECT_NE(Refusal(nullptr, HeapSettings().DataAlignment(65536)), "");
    EXPECT_NE(Refusal(nullptr, HeapSettings().MinRecordSize(std::size_t{1} << 32)), "");
}

TEST_F(HeapTest, HasTheGivenSettingsAndElseThoseOfTheProcess) {
    Use(300, 5, 90, 6, true);
    Settings::off = true;
    const auto settings = [](const Heap& heap) {
        const BucketMgr& pool = *heap.GetMgr().GetBucketMgr();
        return std::tuple(pool.bucketSize, pool.dataAlignment, pool.maxRecordSize,
                          pool.minRecordSize, pool.keepEmptyBuckets, !pool.enabled);
    };
    EXPECT_EQ(settings(Heap()), std::tuple(300, 8, 88, 8, true, true));
    const auto before = AllSettings();
    std::optional<Heap> heap;
    const HeapSettings said =
        HeapSettings().On(true).BucketSize(std::size_t{1} << 32).MaxRecordSize(50);
    const auto build = [&] {
        heap.emplace("own",
                     HeapSettings(said).MinRecordSize(9).DataAlignment(4).KeepEmptyBuckets(false));
    };
    for (std::size_t n = 0; HeapSpy::FailsAt(n, build); ++n) { EXPECT_EQ(AllSettings(), before); }
    EXPECT_EQ(settings(*heap), std::tuple(65535, 4, 48, 12, false, false));
    EXPECT_EQ(Refusal("own", said), "OBR::MemPool::Heap: there is a pool named 'own' already");
}

}  // namespace OBR::MemPool
