// Compares every report with its whole text in expected/. An address is written as the number of
// the object that it lies in, in the order of appearance, and the offset in that object: 0x and 8
// digits for each. If the variable OBR_MEMPOOL_APPROVE is set, the tests write the texts anew.

#include <MemPool>
#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <iomanip>
#include <iostream>
#include <iterator>
#include <limits>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "Child.hpp"
#include "HeapSpy.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "Output.hpp"
#include "diagnostics/reports/Walks.hpp"
#include "diagnostics/text/Messages.hpp"
#include "diagnostics/text/Text.hpp"

using namespace OBR::MemPool;
using testing::Eq;
using testing::ExitedWithCode;

namespace {

// Returns what `print` writes on standard output. Each line must be flushed.
template <typename Print>
std::string Printed(Print print) {
    Output output;
    std::ptrdiff_t numFlushes = 0;
    output.onFlush = [&] { ++numFlushes; };
    print();
    const std::string text = output.Take();
    EXPECT_EQ(numFlushes, std::count(text.begin(), text.end(), '\n'));
    return text;
}

using Blocks = std::vector<std::pair<const void*, std::size_t>>;  // Addresses and sizes.

// All memory of a pool except its table of groups.
void AddBlocks(Blocks& blocks, const BucketMgr& pool) {
    blocks.push_back({&pool, sizeof pool});
    ForEachGroup(pool, [&](std::uint32_t, const Group& group) {
        blocks.push_back({&group, sizeof group});
        ForEachBucket(group, [&](const Bucket& bucket) {
            blocks.push_back({&bucket, Bucket::baseDistance + bucket.size});
        });
    });
    for (const ExtRec* extRec = pool.extRecs; extRec != nullptr; extRec = extRec->next) {
        blocks.push_back({extRec, sizeof *extRec + extRec->length});
    }
}

std::string Contents(const Blocks& blocks) {
    std::string bytes;
    for (const auto& [start, size] : blocks) {
        bytes.append(static_cast<const char*>(start), size);
    }
    return bytes;
}

std::string Stable(std::string text, const Blocks& blocks) {
    std::map<const void*, std::size_t> numbers;
    for (auto at = text.find("0x"); at != std::string::npos; at = text.find("0x", at + 2)) {
        const std::uintptr_t address = std::stoull(text.substr(at, 18), nullptr, 16);
        for (const auto& [start, bytes] : blocks) {
            const std::uintptr_t distance = address - reinterpret_cast<std::uintptr_t>(start);
            if (distance > bytes) { continue; }
            const auto number = numbers.emplace(start, numbers.size() + 1).first->second;
            char mark[17];
            std::snprintf(mark, sizeof mark, "%08zx%08zx", number, distance);
            text.replace(at + 2, 16, mark);
            break;
        }
    }
    return text;
}

void ExpectText(const std::string& name, const std::string& text) {
    const std::string path = EXPECTED_DIR "/" + name + ".txt";
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    std::ifstream file(path);
    EXPECT_EQ(text, std::string(std::istreambuf_iterator<char>(file), {})) << path;
}

class Report : public testing::Test {
protected:
    Report() { Use(4010, 1000); }
    ~Report() override { Settings::off = true; }

    static void Use(std::uint32_t bucketSize, std::uint32_t maxRecordSize, bool keepEmpty = false) {
        Settings::pool.bucketSize = bucketSize;
        Settings::pool.dataAlignment = 4;
        Settings::pool.maxRecordSize = maxRecordSize;
        Settings::pool.minRecordSize = 8;
        Settings::pool.keepEmptyBuckets = keepEmpty;
        Settings::off = false;
        Settings::trace = false;
    }
};

std::vector<void*> Alloc(Mgr& pool, unsigned int size, int times) {
    std::vector<void*> blocks;
    while (times-- > 0) { blocks.push_back(pool.Alloc(size)); }
    return blocks;
}

// Returns what `print` writes about the pool. It must not change a byte of the pool.
template <typename Print>
std::string Printed(const Mgr& pool, Print print) {
    Blocks blocks;
    AddBlocks(blocks, *pool.GetBucketMgr());
    const std::string before = Contents(blocks);
    const std::string text = Stable(Printed(print), blocks);
    EXPECT_TRUE(Contents(blocks) == before);
    return text;
}
std::string Plain(const Mgr& pool) {
    return Printed(pool, [&] { pool.Dbg(); });
}

TEST_F(Report, OfAPool) {
    const Mgr idle("idle");
    Use(50, 40);  // The settings of the process now differ from the pool's.
    Settings::pool.minRecordSize = Settings::pool.dataAlignment = 16;
    Settings::off = true;
    std::string text = Plain(idle);
    Use(4010, 1000);

    // A group without buckets still shows its data size.
    Mgr lost("lost");
    void* const only = lost.Alloc(20);
    lost.Alloc(4);
    lost.Free(only);
    text += Plain(lost);

    // Several groups; full, partly used and empty buckets; heap records.
    Use(100, 96, true);
    Mgr detailed("detailed");
    const auto blocks = Alloc(detailed, 12, 14);
    for (const std::size_t index : {2U, 4U, 9U}) { detailed.Free(blocks[index]); }
    detailed.Free(detailed.Alloc(28));
    Alloc(detailed, 40, 2);
    Alloc(detailed, 100, 2);
    Alloc(detailed, 101, 1);
    text += Printed(detailed, [&] {
        detailed.DbgDetailed();
        const Bucket& oldest = *detailed.GetBucketMgr()->FindBucket(blocks[0]);
        oldest.DbgBucket(std::cout, 12, 0, true, false);
        oldest.DbgBucket(std::cout, 1234, 2, false, true);
    });

    // A disabled pool does not know its blocks.
    Settings::off = true;
    Mgr disabled("disabled");
    void* const block = disabled.Alloc(10);
    ExpectText("pools", text + Plain(disabled));
    disabled.Free(block);
}

TEST_F(Report, ShowsItsSectionsOneByOne) {
    Use(50, 40);
    Mgr pool("sections");
    pool.Alloc(12);
    const char* const expected[] = {"", "B", "", "BR", "", "BF", "", "BRF"};
    for (const unsigned int flags : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 7U}) {
        const std::string text = Printed([&] {
            pool.GetBucketMgr()->DbgReport(std::cout, 0, (flags & 1U) != 0, (flags & 2U) != 0,
                                           (flags & 4U) != 0);
        });
        std::string shown;
        for (const char* part :
             {"B   MemPool::Bucket #001\n", "R #001 ALL RECORDS (", "F #001 FREE LIST ("}) {
            if (text.find(part + 1) != std::string::npos) { shown += part[0]; }
        }
        EXPECT_EQ(shown, expected[flags]);
    }
}

TEST_F(Report, WritesNumbersWiderThanTheirColumnsWhole) {
    Use(4 + 192 * 16, 16);
    Mgr pool("wide");
    Alloc(pool, 12, 15);
    pool.Alloc(12345678);
    Bucket& bucket = *pool.GetBucketMgr()->groups[2]->head;
    std::string text = Plain(pool);
    bucket.numFree = 193;  // Of 192 records.
    text += Plain(pool);
    bucket.numFree = 0;  // Of none: full and empty.
    bucket.recSize = 0;
    text += Plain(pool);
    bucket.recSize = 16;
    ExpectText("wide", text);
}

TEST_F(Report, OfAllPoolsIsInTheOrderOfTheirNames) {
    EXPECT_EQ(Printed(Dbg), "");
    Use(50, 40);
    Mgr a("a");
    const Mgr unnamed("");
    const Mgr capital("Z");
    Alloc(a, 12, 1);
    Blocks blocks;
    for (const auto& entry : registry.All()) { AddBlocks(blocks, *entry.second); }
    ExpectText("library", Stable(Printed(Dbg) + Printed(DbgDetailed), blocks));
}

TEST_F(Report, DrawsBarsByTheirFrequency) {
    const Mgr pool("bars");
    ExpectText("bars", Printed([&] {
                   for (const std::uint32_t largest : {1U, 3U, 49U, 50U, 99U, 100U, 149U, 150U,
                                                       std::numeric_limits<std::uint32_t>::max()}) {
                       pool.GetBucketMgr()->DbgUsedData(std::cout, 2, {{8, 1}, {2000, largest}});
                   }
                   for (const int used : {1, 50, 51}) {
                       Mgr capped("capped");
                       Alloc(capped, 12, used);
                       capped.GetBucketMgr()->GetBucket(0)->DbgUsedHistogram(std::cout, 2);
                   }
               }));
}

TEST_F(Report, DrawsTheRecordsOfABucketAsAMap) {
    const auto map = [](int records, int used) {
        Use(static_cast<std::uint32_t>(4 + 16 * records), 16, true);
        Mgr pool("map");
        const auto blocks = Alloc(pool, 12, used + 1);
        const Bucket* const bucket = pool.GetBucketMgr()->FindBucket(blocks[0]);
        pool.Free(blocks.back());
        return Printed([&] { bucket->DbgRecordMap(std::cout); });
    };
    ExpectText("maps", map(1, 0) + map(7, 7) + map(8, 4) + map(9, 0) + map(16, 9));
}

// The host's settings of the stream hold until a report changes them, and the changes remain. The
// numbers after each report show what it leaves.
TEST_F(Report, TakesTheStreamAsItIsWhereItSetsNothing) {
    Use(50, 40);
    Mgr pool("stream");
    pool.Alloc(12);
    pool.Alloc(2000);
    const Bucket& bucket = *pool.GetBucketMgr()->GetBucket(0);
    const std::function<void()> reports[] = {
        [&] { pool.Dbg(); },
        [&] { bucket.DbgBucket(std::cout, 1, 0, true, true); },
    };
    std::string text;
    for (const auto& report : reports) {
        SetStreamState();
        text += Printed(pool, [&] {
            report();
            std::cout << 1234 << std::setw(12) << 1234 << std::setw(16) << 0.5 << std::endl;
        });
        std::cout.copyfmt(std::ios(nullptr));
    }
    ExpectText("stream-state", text);
}

// Only a host that has enabled the stream's exceptions gets those of a failed write.
TEST_F(Report, ReportsAFailedWriteIfTheStreamDoes) {
    const Mgr pool("failing");
    Output output;
    output.onFlush = [] { throw "no device"; };
    EXPECT_NO_THROW(pool.Dbg());
    EXPECT_NO_THROW(pool.Dbg()) << "The stream is in a failed state now.";
    std::cout.clear();
    std::cout.exceptions(std::ios::badbit);
    EXPECT_THROW(pool.Dbg(), const char*);
    std::cout.exceptions(std::ios::goodbit);

    // Exhausted memory throws at each request of a report, and the stream is as before.
    const auto print = [&pool] {
        const Output growing;
        pool.Dbg();
    };
    for (std::size_t n = 0; HeapSpy::FailsAt(n, print); ++n) {
        EXPECT_EQ(std::cout.exceptions(), std::ios::goodbit) << n;
    }
}

const std::string notFree = "ERROR:../s/MemPool: 2640: Invalid free record FREE != ";
const std::string used = notFree + "USED\n";
const std::string unknown = notFree + "UNKN\n";
const std::string tooLong = "ERROR:../s/MemPool: 2648: Exceeded the total number of recs 4 > 3\n";

// Kinds of damage to a bucket of three records, at the offsets 2, 18 and 34, the first in use.
const struct {
    const char* name;
    void (*damage)(Bucket&);
    std::string fault;  // What the check of the free list says; nothing if it passes.
} damages[] = {
    {"nothing", [](Bucket&) {}, ""},
    {"a circle", [](Bucket& bucket) { bucket.RecordAt(34)->Format(18); }, tooLong},
    {"a link to a used record", [](Bucket& bucket) { bucket.RecordAt(34)->Format(2); }, used},
    {"a link after the end", [](Bucket& bucket) { bucket.RecordAt(34)->Format(50); }, unknown},
    {"a link between records", [](Bucket& bucket) { bucket.RecordAt(34)->Format(19); }, unknown},
    {"a head after the end", [](Bucket& bucket) { bucket.freeHead = 65522; }, unknown},
    {"a list cut short", [](Bucket& bucket) { bucket.freeHead = 0; }, ""},
    {"a head a whole record before them",
     [](Bucket& bucket) {
         bucket.size = 47;
         bucket.recSize = 15;
         bucket.freeHead = 1;
     },
     unknown},
    {"too many free records stated", [](Bucket& bucket) { bucket.numFree = 9; }, ""},
    {"a heap record's type", [](Bucket& bucket) { bucket.RecordAt(34)->type = typeExt; },
     notFree + "EXT\n"},
    {"an unknown type", [](Bucket& bucket) { bucket.RecordAt(18)->type = 7; }, unknown},
    {"a size one short", [](Bucket& bucket) { bucket.size = 49; }, ""},
    {"just a header at the end", [](Bucket& bucket) { bucket.size = 37; }, ""},
    {"less than a header at the end", [](Bucket& bucket) { bucket.size = 36; }, unknown},
    {"sizes of one", [](Bucket& bucket) { bucket.size = bucket.recSize = 1; }, unknown},
    {"no record size", [](Bucket& bucket) { bucket.recSize = 0; }, unknown},
};

// The bucket lies in a block of exactly the size that its header states.
TEST_F(Report, OfADamagedBucketStaysWithinIt) {
    std::string text;
    for (const auto& [name, damage, fault] : damages) {
        Bucket* const whole = Bucket::Create(nullptr, 50, 12);
        whole->TakeRecord();
        for (const std::uint32_t offset : {2U, 18U, 34U}) {
            std::memset(whole->RecordAt(offset)->Data(), 0xEE, 12);
        }
        damage(*whole);
        const char* const start = reinterpret_cast<const char*>(whole);
        const std::size_t stated = Bucket::baseDistance + whole->size;
        const std::vector<char> bytes(start, start + std::max(sizeof(Bucket), stated));
        whole->recSize = 16;
        Bucket::Destroy(whole);

        const Bucket& bucket = *reinterpret_cast<const Bucket*>(bytes.data());
        text += std::string("== ") + name + "\n";
        text += Stable(Printed([&] { bucket.DbgBucket(std::cout, 1, 0, true, true); }),
                       {{&bucket, 0x20000}});
        const auto check = [&bucket] {
            Child::Capture(Child::Captured::both);
            bucket.CheckFreeList();
            std::_Exit(0);
        };
        EXPECT_EXIT(check(), ExitedWithCode(fault.empty() ? 0 : 1), Eq(fault)) << name;
    }
    ExpectText("damaged-buckets", text);
}

TEST_F(Report, WarnsOnStandardOutputWhereverItGoes) {
    std::unique_ptr<Bucket, void (*)(Bucket*)> bucket(Bucket::Create(nullptr, 50, 12),
                                                      Bucket::Destroy);
    bucket->size = 48;
    bucket->RecordAt(34)->Format(2);
    std::ostringstream elsewhere;
    EXPECT_EQ(Printed([&] {
                  bucket->DbgAllRecords(elsewhere, 0);
                  bucket->DbgFreeList(elsewhere, 0);
                  Messages::TooFewRows(1, 2);
              }),
              "WARNING:../s/MemPool: 2916: Exceeded the total number of recs 3 > 2\n"
              "WARNING:../s/MemPool: 2970: Exceeded the number of total number of recs 3 > 2\n"
              "WARNING:../s/MemPool: 2922: Did not reach the expected number of recs 1 < 2\n");
    EXPECT_EQ(elsewhere.str().find("WARNING"), std::string::npos);
}

// The second free record is damaged, which the operation itself does not read.
TEST_F(Report, ABuildWithChecksLooksAtEachBucketTouched) {
#ifdef OBR_MEMPOOL_CHECKS
    const std::string fault = unknown;
#else
    const std::string fault;
#endif
    for (const bool frees : {false, true}) {
        const auto run = [&] {
            Child::Capture(Child::Captured::both);
            Mgr pool("checked");
            void* const block = Alloc(pool, 12, 2)[0];
            pool.GetBucketMgr()->FindBucket(block)->RecordAt(2 + 3 * 16)->type = 7;
            frees ? void(pool.Free(block)) : void(pool.Alloc(12));
            std::_Exit(0);
        };
        EXPECT_EXIT(run(), ExitedWithCode(fault.empty() ? 0 : 1), Eq(fault));
    }
}

TEST(ReportText, HasOneFormForAddresses) {
    const auto* const address = reinterpret_cast<const void*>(0x123456789ABCDEF0);
    EXPECT_EQ(PtrText(address), "0x123456789abcdef0");
    EXPECT_EQ(BareHex(address), "123456789abcdef0");
    EXPECT_EQ(BareHex(nullptr), "000000000000000000");
}

}  // namespace
