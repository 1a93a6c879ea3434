// A host for gdb to look at: pools of every kind, reports that it writes when gdb asks for them,
// and a crash at the end. Its debug information describes the library's structs.

#include <malloc.h>
#include <MemPool>
#include <MemPoolSettings>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <list>
#include <new>

#include "MemPool/MgrRegistry.hpp"

using namespace OBR::MemPool;

// For the debug information.
const MgrRegistry* registryOfNone = nullptr;
const ExtRec* extRecOfNone = nullptr;

// What gdb's commands round in Python.
unsigned int roundedUp[] = {RoundUp(0, 4), RoundUp(1, 4), RoundUp(8, 4), RoundUp(10, 3)};

// The report that gdb asks for: it sets these while the host stands in Ready and lets it go on. It
// calls nothing, since gdb cannot do that on a processor with registers that it does not know.
char askedName[64] = "";
char askedPath[4096] = "";
bool asked = false;
bool askedDetailed = false;

bool ReportIfAsked() {
    if (!asked) { return false; }
    asked = false;
    const std::ofstream file(askedPath);
    std::streambuf* const screen = std::cout.rdbuf(file.rdbuf());
    askedDetailed ? GetMgr(askedName)->DbgDetailed() : GetMgr(askedName)->Dbg();
    std::cout.rdbuf(screen);
    return true;
}

extern "C" void Ready() {
    std::cout << "ready" << std::endl;
}

int main() {
    NUV_OBR_MEMPOOL_ON(true);
    NUV_OBR_MEMPOOL_BUCKET_SIZE(1100);

    // All sorts of settings: bounds that share a group, alignments of all kinds.
    std::list<Mgr> sorts;
    for (const unsigned int alignment : {1U, 2U, 3U, 4U, 8U, 100U, 512U}) {
        for (const unsigned int minimum : {1U, 8U, 30U}) {
            NUV_OBR_MEMPOOL_DATA_ALIGNMENT(alignment);
            NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(minimum);
            NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(minimum == 8);
            sorts.emplace_back();
            for (const unsigned int size : {1U, 5U, 10U, 30U, 200U, 990U, 1000U}) {
                sorts.back().Free(sorts.back().Alloc(size));
                sorts.back().Alloc(size);
            }
        }
    }
    NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(false);
    NUV_OBR_MEMPOOL_DATA_ALIGNMENT(4);
    NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(0xFFFFFFFF);  // Rounded up, it wraps to 0.
    sorts.emplace_back();
    NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(8);
    NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(8);
    sorts.emplace_back();

    // Two full buckets and one with a free record between two used ones, of three records each; one
    // of another group; three heap records. The name just fits into its string.
    NUV_OBR_MEMPOOL_BUCKET_SIZE(50);
    NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(40);
    Mgr letters("fifteen letters");
    void* blocks[9];
    for (void*& block : blocks) { block = letters.Alloc(12); }
    letters.Free(blocks[7]);
    letters.Alloc(20);
    void* const extBlocks[3] = {letters.Alloc(1000), letters.Alloc(37), letters.Alloc(1001)};

    new (extBlocks[0]) Mgr("in a block");
    Mgr three("three");
    void* const first = three.Alloc(12);
    PoolSettings settings = PoolSettings::OfProcess();
    settings.bucketSize = 43;
    const std::string tooLarge = PoolSizes(settings).Problem();
    settings.bucketSize = 50;
    settings.minRecordSize = 44;
    const std::string tooSmall = PoolSizes(settings).Problem();

    Mgr left("left");
    const Mgr right("right");
    left = right;
    const Mgr withUmlaut("\xC3\xA4");
    const Mgr withQuote("o t'hers");
    const Mgr withBackslash("a\\b  \"c");
    NUV_OBR_MEMPOOL_ON(false);
    const Mgr off("off");
    const Mgr alsoOff("also off");
    OBR::vector<int> numbers;
    for (const int number : {1, 2, 3}) { numbers.push_back(number); }

    do { Ready(); } while (ReportIfAsked());

    // 100000 blocks, and as many free records between them.
    NUV_OBR_MEMPOOL_ON(true);
    NUV_OBR_MEMPOOL_BUCKET_SIZE(4010);
    Mgr many("many");
    std::list<void*> spared;
    for (int count = 0; count < 100000; ++count) {
        spared.push_back(many.Alloc(12));
        many.Alloc(12);
    }
    for (void* const block : spared) { many.Free(block); }
    mallopt(M_TOP_PAD, 0);  // From now on the heap ends with its newest block.
    Mgr overrun("overrun");
    auto* const text = static_cast<char*>(overrun.Alloc(12));
    do { Ready(); } while (ReportIfAsked());

    // Damages the header of the next record, and with it the link to the free one after it. A
    // library that checks its lists ends the process first, which is then turned into a crash.
    std::atexit(std::abort);
    for (int index = 0; index < 15; ++index) { text[index] = '\xFF'; }
    overrun.Alloc(12);
    overrun.Alloc(12);
    return first == blocks[0] || extBlocks[0] == nullptr;
}
