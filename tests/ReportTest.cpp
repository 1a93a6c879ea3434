// Every report against its whole text in expected/. An address is shown as the number of the object
// that it lies in, in the order in which they appear, and its distance from there: 0x, 8 digits
// each. The variable OBR_MEMPOOL_APPROVE, set to anything, makes the tests write the texts anew.

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
#include <locale>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "Child.hpp"
#include "MemPool/BucketMgr.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "diagnostics/Text.hpp"

using namespace OBR::MemPool;
using testing::Eq;
using testing::ExitedWithCode;

namespace {

#ifdef OBR_MEMPOOL_CHECKS
constexpr bool hasChecks = true;
#else
constexpr bool hasChecks = false;
#endif

// Remembers how much of the text had been written at each flush.
class LineBuf final : public std::stringbuf {
public:
    std::vector<std::ptrdiff_t> flushes;

protected:
    int sync() override {
        flushes.push_back(pptr() - pbase());
        return 0;
    }
};

// What `print` writes on standard output, where each line must be flushed by itself.
template <typename Print>
std::string Printed(Print print) {
    LineBuf lines;
    std::streambuf* const screen = std::cout.rdbuf(&lines);
    print();
    std::cout.rdbuf(screen);

    const std::string text = lines.str();
    std::vector<std::ptrdiff_t> ends;
    for (auto end = text.find('\n'); end != std::string::npos; end = text.find('\n', end + 1)) {
        ends.push_back(static_cast<std::ptrdiff_t>(end) + 1);
    }
    EXPECT_EQ(lines.flushes, ends);
    return text;
}

struct Block {
    const void* start;
    std::size_t bytes;
    std::uintptr_t Begin() const { return reinterpret_cast<std::uintptr_t>(start); }
};
using Blocks = std::vector<Block>;

Block BlockOf(const Bucket* bucket) {
    return {bucket, std::max<std::size_t>(sizeof(Bucket), Bucket::baseDistance + bucket->size)};
}

// All memory of a pool but its table of groups.
void AddBlocks(Blocks& blocks, const BucketMgr& pool) {
    blocks.push_back({&pool, sizeof pool});
    for (std::uint32_t index = 0; index < pool.numGroups; ++index) {
        const Group* const group = pool.groups[index];
        if (group == nullptr) { continue; }
        blocks.push_back({group, sizeof *group});
        for (const Bucket* bucket = group->head; bucket != nullptr; bucket = bucket->next1) {
            blocks.push_back(BlockOf(bucket));
        }
    }
    for (const ExtRec* extRec = pool.extRecs; extRec != nullptr; extRec = extRec->next) {
        blocks.push_back({extRec, sizeof *extRec + extRec->length});
    }
}

std::string Stable(std::string text, const Blocks& blocks) {
    std::map<const void*, std::size_t> numbers;
    for (auto at = text.find("0x"); at != std::string::npos; at = text.find("0x", at + 2)) {
        const std::uintptr_t address = std::stoull(text.substr(at, 18), nullptr, 16);
        const auto block = std::find_if(blocks.begin(), blocks.end(), [&](const Block& candidate) {
            return address >= candidate.Begin() && address - candidate.Begin() <= candidate.bytes;
        });
        if (block == blocks.end()) { continue; }
        const std::size_t number = numbers.emplace(block->start, numbers.size() + 1).first->second;
        char mark[17];
        std::snprintf(mark, sizeof mark, "%08zx%08zx", number, address - block->Begin());
        text.replace(at + 2, 16, mark);
    }
    return text;
}

std::string Stable(std::string text, const BucketMgr& pool) {
    Blocks blocks;
    AddBlocks(blocks, pool);
    return Stable(std::move(text), blocks);
}

void ExpectText(const std::string& name, const std::string& text) {
    const std::string path = EXPECTED_DIR "/" + name + ".txt";
    if (std::getenv("OBR_MEMPOOL_APPROVE") != nullptr) { std::ofstream(path) << text; }
    std::ifstream file(path);
    EXPECT_EQ(text, std::string(std::istreambuf_iterator<char>(file), {})) << path;
}

class Grouping final : public std::numpunct<char> {
    char do_thousands_sep() const override { return '\''; }
    std::string do_grouping() const override { return "\3"; }
};
const std::locale groupingLocale(std::locale::classic(), new Grouping);

class Report : public testing::Test {
protected:
    Report() {
        former.copyfmt(std::cout);
        Use(4010, 1000);
    }
    ~Report() override {
        ResetStream();
        Settings::off = true;
    }

    static void Use(std::uint32_t bucketSize, std::uint32_t maxRecordSize, bool keepEmpty = false) {
        Settings::bucketSize = bucketSize;
        Settings::dataAlignment = 4;
        Settings::maxRecordSize = maxRecordSize;
        Settings::minRecordSize = 8;
        Settings::keepEmptyBuckets = keepEmpty;
        Settings::off = false;
        Settings::trace = false;
    }
    void ResetStream() const { std::cout.copyfmt(former); }

private:
    std::ios former{nullptr};
};

std::vector<void*> Alloc(Mgr& pool, unsigned int size, int times) {
    std::vector<void*> blocks;
    while (times-- > 0) { blocks.push_back(pool.Alloc(size)); }
    return blocks;
}

std::string Plain(const Mgr& pool) {
    return Stable(Printed([&] { pool.Dbg(); }), *pool.GetBucketMgr());
}
std::string Detailed(const Mgr& pool) {
    return Stable(Printed([&] { pool.DbgDetailed(); }), *pool.GetBucketMgr());
}

TEST_F(Report, OfAPoolThatHasAllocatedNothing) {
    const Mgr pool("idle");
    ExpectText("idle-pool", Plain(pool));
    EXPECT_EQ(Detailed(pool), Plain(pool));
}

TEST_F(Report, OfADisabledPoolKnowsNothingOfItsBlocks) {
    Settings::off = true;
    Mgr pool("disabled");
    void* const small = pool.Alloc(10);
    void* const large = pool.Alloc(2000);
    ExpectText("disabled-pool", Plain(pool));
    pool.Free(small);
    pool.Free(large);
}

TEST_F(Report, OfAPoolWithRecordsAndAHeapRecord) {
    Mgr pool("demo");
    Alloc(pool, 10, 3);
    Alloc(pool, 2000, 1);
    ExpectText("demo-pool", Plain(pool));
}

TEST_F(Report, ListsBucketsFreeBucketsAndHeapRecordsInTheOrderOfTheirLists) {
    Use(4010, 1000, true);
    Mgr pool("tables");
    const auto oldest = Alloc(pool, 12, 250);
    Alloc(pool, 12, 250);
    Alloc(pool, 12, 3);
    for (std::size_t index = 0; index < 249; ++index) { pool.Free(oldest[index]); }
    pool.Free(pool.Alloc(32));
    Alloc(pool, 2000, 1);
    Alloc(pool, 5000, 1);
    ExpectText("tables", Plain(pool));
}

// Records of several groups, full, partly used and empty buckets, and heap records.
void Fill(Mgr& pool) {
    const auto blocks = Alloc(pool, 12, 14);
    for (const std::size_t index : {2, 4, 9}) { pool.Free(blocks[index]); }
    pool.Free(pool.Alloc(28));
    Alloc(pool, 40, 2);
    Alloc(pool, 100, 2);
    Alloc(pool, 101, 1);
}

TEST_F(Report, OpensEveryBucketOnRequest) {
    Use(100, 96, true);
    Mgr pool("detailed");
    Fill(pool);
    ExpectText("detailed-pool", Detailed(pool));
}

TEST_F(Report, OfABucketAndItsParts) {
    Use(242, 200);
    Mgr pool("bucket");
    pool.Free(Alloc(pool, 20, 3)[1]);
    const Bucket& bucket = *pool.GetBucketMgr()->GetBucket(0);
    const std::string text = Printed([&] {
        bucket.DbgBucket(std::cout, 1, 1, true, true);
        bucket.DbgBucket(std::cout, 12, 0, false, false);
        bucket.DbgBucket(std::cout, 999, 0, true, false);
        bucket.DbgBucket(std::cout, 1234, 2, false, true);
    });
    ExpectText("bucket", Stable(text, *pool.GetBucketMgr()));
}

TEST_F(Report, OfAGroupThatLostItsBucketsStillShowsItsDataSize) {
    Mgr pool("lost");
    void* const block = pool.Alloc(20);
    pool.Alloc(8);
    pool.Free(block);
    ExpectText("lost-buckets", Plain(pool));
}

// A handle that was assigned to shows the pool that it has now, under each pool that it made; a
// pool that has lost its handle is not shown.
TEST_F(Report, OfAllPoolsIsInTheOrderOfTheirNames) {
    EXPECT_EQ(Printed([] { Dbg(); }), "");
    EXPECT_EQ(Printed([] { DbgDetailed(); }), "");

    Use(50, 40);
    Mgr b("b");
    Mgr a("a");
    Mgr unnamed("");
    const Mgr capital("Z");
    Alloc(a, 12, 1);
    const auto library = [&] {
        Blocks blocks;
        for (const auto& entry : registry.All()) { AddBlocks(blocks, *entry.second); }
        return Stable(Printed([] { Dbg(); }) + Printed([] { DbgDetailed(); }), blocks);
    };
    ExpectText("library", library());

    BucketMgr* const orphan = [&] {
        Mgr assigned("orphan");
        BucketMgr* const left = assigned.GetBucketMgr();
        assigned = unnamed;
        ExpectText("library-assigned", library());
        return left;
    }();
    EXPECT_EQ(GetNumMgrs(), 4U);
    ExpectText("library-orphan", library());
    registry.Erase("orphan");
    delete orphan;
}

TEST_F(Report, DrawsBarsByTheirFrequency) {
    const Mgr pool("bars");
    const auto scaled = [&](std::uint32_t largest) {
        pool.GetBucketMgr()->DbgUsedData(std::cout, 2,
                                         {{8, 1}, {12, largest}, {2000, largest - largest / 2}});
    };
    const auto capped = [](int used) {
        Mgr host("capped");
        Alloc(host, 12, used);
        host.GetBucketMgr()->GetBucket(0)->DbgUsedHistogram(std::cout, 2);
    };
    ExpectText("bars", Printed([&] {
                   for (const std::uint32_t largest : {1U, 3U, 49U, 50U, 99U, 100U, 149U, 150U}) {
                       scaled(largest);
                   }
                   scaled(std::numeric_limits<std::uint32_t>::max());
                   for (const int used : {1, 49, 50, 51, 250}) { capped(used); }
               }));
}

TEST_F(Report, DrawsTheRecordsOfABucketAsAMap) {
    const auto map = [](int records, int used) {
        Use(static_cast<std::uint32_t>(4 + 16 * records), 16, true);
        Mgr pool("map");
        const auto blocks = Alloc(pool, 12, used + 1);
        const Bucket* const bucket = pool.GetBucketMgr()->FindBucket(blocks[0]);
        pool.Free(blocks.back());
        bucket->DbgRecordMap(std::cout);
    };
    ExpectText("maps", Printed([&] {
                   map(3, 1);
                   map(1, 1);
                   map(1, 0);
                   map(7, 7);
                   map(8, 4);
                   map(9, 0);
                   map(16, 9);
               }));

    Use(65535, 8);
    Settings::dataAlignment = 1;
    Settings::minRecordSize = 5;
    Mgr pool("long");
    pool.Alloc(1);
    const std::string text =
        Printed([&] { pool.GetBucketMgr()->GetBucket(0)->DbgRecordMap(std::cout); });
    const auto rows = [&](const std::string& label, const std::string& behind) {
        const auto begin = text.find("\n" + label + " |");
        return text.substr(begin, text.find("\n" + behind + " |") - begin);
    };
    ExpectText("map-labels", rows(" 992", "1008") + rows("9992", "10008") + rows("13104", ""));
}

TEST_F(Report, WritesNumbersWiderThanTheirColumnsWhole) {
    Mgr pool("wide");
    const BucketMgr& wide = *pool.GetBucketMgr();
    SizeCounts many;
    for (std::uint32_t size = 1; size <= 100000; ++size) { many[size] = 1; }
    const std::string rows = Printed([&] { wide.DbgUsedData(std::cout, 0, many); });
    EXPECT_EQ(rows.substr(rows.rfind('\n', rows.size() - 2)), "\n100000  100000         1 **\n");

    pool.Alloc(12);
    Bucket& bucket = *wide.groups[2]->head;
    pool.Alloc(12345678);
    const auto text = [&](std::uint16_t numFree, std::uint16_t recSize) {
        const auto sound = std::make_pair(bucket.numFree, bucket.recSize);
        bucket.numFree = numFree;
        bucket.recSize = recSize;
        const std::string report = Plain(pool);
        std::tie(bucket.numFree, bucket.recSize) = sound;
        return report;
    };
    // More free records than there are, as many, and a bucket without a record size.
    ExpectText("wide", text(251, 16) + text(250, 16) + text(5, 0));
}

// What a host may have set on its stream before it asks for a report.
struct StreamState {
    const char* name;
    void (*set)(std::ostream& stream);
};
constexpr StreamState streamStates[] = {
    {"fill", [](std::ostream& stream) { stream.fill('#'); }},
    {"left", [](std::ostream& stream) { stream.setf(std::ios::left, std::ios::adjustfield); }},
    {"base", [](std::ostream& stream) { stream << std::hex << std::showbase << std::uppercase; }},
    {"width", [](std::ostream& stream) { stream.width(20); }},
    {"grouping", [](std::ostream& stream) { stream.imbue(groupingLocale); }},
    {"signs", [](std::ostream& stream) { stream << std::showpos << std::boolalpha; }},
    {"floats", [](std::ostream& stream) { stream << std::scientific << std::setprecision(9); }},
};

TEST_F(Report, TakesTheStreamAsItIsWhereItSetsNothing) {
    Use(50, 40);
    Mgr pool("stream");
    pool.Alloc(12);
    pool.Alloc(2000);
    const Bucket& bucket = *pool.GetBucketMgr()->GetBucket(0);
    std::string text;
    for (const StreamState& state : streamStates) {
        const auto add = [&](auto print) {
            state.set(std::cout);
            text += Printed(print);
            ResetStream();
        };
        text += std::string("== ") + state.name + "\n";
        add([&] { pool.Dbg(); });
        add([&] { bucket.DbgBucket(std::cout, 1, 1, true, true); });
        add([&] { bucket.DbgAllRecords(std::cout, 1); });
        add([&] { bucket.DbgRecordMap(std::cout); });
        add([&] { bucket.DbgMapSizes(std::cout, 1, 0); });
    }
    ExpectText("stream-states", Stable(text, *pool.GetBucketMgr()));
}

TEST_F(Report, IgnoresTheLocaleOfTheProcess) {
    Mgr pool("locale");
    pool.Alloc(2000);
    const std::string text = Detailed(pool);
    const std::locale before = std::locale::global(groupingLocale);
    EXPECT_EQ(Detailed(pool), text);
    EXPECT_EQ(PtrText(reinterpret_cast<void*>(0x123456789)), "0x0000000123456789");
    std::locale::global(before);
}

TEST_F(Report, LeavesTheStreamRightJustifiedWithABlankAsFill) {
    Use(50, 40);
    Mgr pool("after");
    const Mgr empty("empty");
    pool.Alloc(12);
    pool.Alloc(100);
    const BucketMgr& full = *pool.GetBucketMgr();
    const Bucket& bucket = *full.GetBucket(0);
    const struct {
        const char* name;
        bool setsFixed;
        std::function<void()> print;
    } reports[] = {
        {"DbgReport", true, [&] { full.DbgReport(std::cout, 0, true, true, true); }},
        {"DbgReport of an empty pool", false, [&] { empty.Dbg(); }},
        {"DbgUsedData", false,
         [&] {
             full.DbgUsedData(std::cout, 0, {{1, 1}});
         }},
        {"DbgBuckets", true, [&] { full.DbgBuckets(std::cout, 0); }},
        {"DbgFreeBuckets", false, [&] { full.DbgFreeBuckets(std::cout, 0, 1, 1); }},
        {"DbgExtRecs", false, [&] { full.DbgExtRecs(std::cout, 0); }},
        {"DbgBucket", false, [&] { bucket.DbgBucket(std::cout, 1, 0, true, true); }},
        {"DbgAllRecords", false, [&] { bucket.DbgAllRecords(std::cout, 0); }},
        {"DbgUsedHistogram", false, [&] { bucket.DbgUsedHistogram(std::cout, 0); }},
        {"DbgFreeList", false, [&] { bucket.DbgFreeList(std::cout, 0); }},
        {"DbgRecordMap", false, [&] { bucket.DbgRecordMap(std::cout << std::setfill(' ')); }},
    };
    for (const auto& report : reports) {
        SCOPED_TRACE(report.name);
        std::cout << std::left << std::hex << std::scientific << std::setprecision(9)
                  << std::setfill('#') << std::setw(3);
        Printed(report.print);
        EXPECT_EQ(std::cout.flags() & std::ios::adjustfield, std::ios::right);
        EXPECT_EQ(std::cout.flags() & std::ios::basefield, std::ios::hex);
        EXPECT_EQ(std::cout.flags() & std::ios::floatfield,
                  report.setsFixed ? std::ios::fixed : std::ios::scientific);
        EXPECT_EQ(std::cout.precision(), report.setsFixed ? 3 : 9);
        EXPECT_EQ(std::cout.fill(), ' ');
        EXPECT_EQ(std::cout.width(), 0);
        ResetStream();
    }
}

std::string BytesOf(const Blocks& blocks) {
    std::string bytes;
    for (const Block& block : blocks) {
        bytes.append(static_cast<const char*>(block.start), block.bytes);
    }
    return bytes;
}

TEST_F(Report, ChangesNothing) {
    Use(100, 96, true);
    Mgr pool("unchanged");
    Fill(pool);
    const BucketMgr& bucketMgr = *pool.GetBucketMgr();
    Blocks blocks{{bucketMgr.groups, bucketMgr.numGroups * sizeof(Group*)}};
    AddBlocks(blocks, bucketMgr);
    const std::string before = BytesOf(blocks);
    Printed([&] { pool.DbgDetailed(); });
    bucketMgr.GetBucket(0)->CheckFreeList();
    EXPECT_EQ(BytesOf(blocks), before);
}

// A bucket of three records, at the offsets 2, 18 and 34, of which the first is in use, with one
// thing damaged. It lies in a block of exactly the size that its header then tells.
class DamagedBucket {
public:
    explicit DamagedBucket(void (*damage)(Bucket&)) {
        Bucket* const sound = Bucket::Create(nullptr, 50, 12);
        const std::size_t soundBytes = BlockOf(sound).bytes;
        sound->TakeRecord();
        damage(*sound);
        bytes = BlockOf(sound).bytes;
        block = std::make_unique<char[]>(bytes);
        std::memset(block.get(), 0xEE, bytes);
        std::memcpy(block.get(), sound, std::min(bytes, soundBytes));
        sound->recSize = 16;
        Bucket::Destroy(sound);
    }
    const Bucket& operator*() const { return *reinterpret_cast<const Bucket*>(block.get()); }
    const Bucket* operator->() const { return &**this; }
    std::string Bytes() const { return {block.get(), bytes}; }

private:
    std::size_t bytes;
    std::unique_ptr<char[]> block;
};

constexpr const char* tooLong =
    "ERROR:../s/MemPool: 2648: Exceeded the total number of recs 4 > 3\n";
constexpr const char* notFree = "ERROR:../s/MemPool: 2640: Invalid free record FREE != ";

const struct {
    const char* name;
    void (*damage)(Bucket&);
    std::string fault;  // What the check of the free list says; nothing if it passes.
} damages[] = {
    {"nothing", [](Bucket&) {}, ""},
    {"a circle", [](Bucket& bucket) { bucket.RecordAt(34)->Format(18); }, tooLong},
    {"a circle of one", [](Bucket& bucket) { bucket.RecordAt(18)->Format(18); }, tooLong},
    {"a link to a used record", [](Bucket& bucket) { bucket.RecordAt(34)->Format(2); },
     std::string(notFree) + "USED\n"},
    {"a link just behind the end", [](Bucket& bucket) { bucket.RecordAt(34)->Format(50); },
     std::string(notFree) + "UNKN\n"},
    {"a link far behind the end", [](Bucket& bucket) { bucket.RecordAt(18)->Format(65522); },
     std::string(notFree) + "UNKN\n"},
    {"a link between records", [](Bucket& bucket) { bucket.RecordAt(34)->Format(19); },
     std::string(notFree) + "UNKN\n"},
    {"a link ahead of the records", [](Bucket& bucket) { bucket.RecordAt(34)->Format(1); },
     std::string(notFree) + "UNKN\n"},
    {"a list that begins behind the end", [](Bucket& bucket) { bucket.freeHead = 65522; },
     std::string(notFree) + "UNKN\n"},
    {"a list that begins between records", [](Bucket& bucket) { bucket.freeHead = 17; },
     std::string(notFree) + "UNKN\n"},
    {"a list cut short", [](Bucket& bucket) { bucket.freeHead = 0; }, ""},
    {"no free records told", [](Bucket& bucket) { bucket.numFree = 0; }, ""},
    {"too many free records told", [](Bucket& bucket) { bucket.numFree = 9; }, ""},
    {"a heap record's type", [](Bucket& bucket) { bucket.RecordAt(34)->type = typeExt; },
     std::string(notFree) + "EXT\n"},
    {"an unknown type", [](Bucket& bucket) { bucket.RecordAt(18)->type = 7; },
     std::string(notFree) + "UNKN\n"},
    {"a size one short", [](Bucket& bucket) { bucket.size = 49; }, ""},
    {"a size with half a record taken too often",
     [](Bucket& bucket) {
         bucket.size = 42;
         bucket.freeHead = 2;
         bucket.RecordAt(2)->Format(18);
     },
     "ERROR:../s/MemPool: 2648: Exceeded the total number of recs 3 > 2\n"},
    {"a size with just a header at the end", [](Bucket& bucket) { bucket.size = 37; }, ""},
    {"a size with less than a header at the end", [](Bucket& bucket) { bucket.size = 36; },
     std::string(notFree) + "UNKN\n"},
    {"a size one record too large", [](Bucket& bucket) { bucket.size = 66; }, ""},
    {"a size below one header", [](Bucket& bucket) { bucket.size = 4; },
     std::string(notFree) + "UNKN\n"},
    {"a size and a record size of one", [](Bucket& bucket) { bucket.size = bucket.recSize = 1; },
     std::string(notFree) + "UNKN\n"},
    {"a size of 0", [](Bucket& bucket) { bucket.size = 0; }, std::string(notFree) + "UNKN\n"},
    {"no record size", [](Bucket& bucket) { bucket.recSize = 0; }, std::string(notFree) + "UNKN\n"},
};

TEST_F(Report, OfADamagedBucketStaysWithinIt) {
    std::string text;
    for (const auto& damaged : damages) {
        const DamagedBucket bucket(damaged.damage);
        const std::string before = bucket.Bytes();
        text += std::string("== ") + damaged.name + "\n";
        text += Stable(Printed([&] { bucket->DbgBucket(std::cout, 1, 0, true, true); }),
                       Blocks{{&*bucket, 0x20000}});
        EXPECT_EQ(bucket.Bytes(), before);
    }
    ExpectText("damaged-buckets", text);
}

TEST_F(Report, WarnsOnStandardOutputWhereverItGoes) {
    const DamagedBucket circle([](Bucket& bucket) {
        bucket.size = 49;
        bucket.RecordAt(34)->Format(18);
    });
    std::ostringstream elsewhere;
    EXPECT_EQ(Printed([&] { circle->DbgBucket(elsewhere, 1, 0, true, true); }),
              "WARNING:../s/MemPool: 2916: Exceeded the total number of recs 3 > 2\n"
              "WARNING:../s/MemPool: 2970: Exceeded the number of total number of recs 3 > 2\n");
    EXPECT_EQ(elsewhere.str().find("WARNING"), std::string::npos);
    EXPECT_NE(elsewhere.str().find("00004     34    18    16"), std::string::npos);
}

TEST_F(Report, TheCheckStopsAtTheFirstFaultOfAFreeList) {
    for (const auto& damaged : damages) {
        SCOPED_TRACE(damaged.name);
        const DamagedBucket bucket(damaged.damage);
        const std::string before = bucket.Bytes();
        if (damaged.fault.empty()) {
            EXPECT_EQ(Printed([&] { bucket->CheckFreeList(); }), "");
            EXPECT_EQ(bucket.Bytes(), before);
        } else {
            const auto check = [&] {
                Child::Capture(Child::Captured::both);
                bucket->CheckFreeList();
            };
            EXPECT_EXIT(check(), ExitedWithCode(1), Eq(damaged.fault));
        }
    }
}

// The first free record but one is damaged, so that the operation itself does not meet it.
TEST_F(Report, ABuildWithChecksLooksAtEachBucketTouched) {
    const std::function<void(Mgr&, void*)> operations[] = {
        [](Mgr& pool, void*) { pool.Alloc(12); },
        [](Mgr& pool, void* block) { pool.Free(block); },
    };
    for (const auto& operation : operations) {
        const auto run = [&] {
            Child::Capture(Child::Captured::both);
            Mgr pool("checked");
            void* const block = Alloc(pool, 12, 2)[0];
            pool.GetBucketMgr()->FindBucket(block)->RecordAt(2 + 3 * 16)->type = 7;
            operation(pool, block);
            std::_Exit(0);
        };
        EXPECT_EXIT(run(), ExitedWithCode(hasChecks ? 1 : 0),
                    Eq(hasChecks ? std::string(notFree) + "UNKN\n" : ""));
    }
}

TEST(ReportText, HasOneFormForLevelsAddressesAndKinds) {
    EXPECT_EQ(Indent(0), "");
    EXPECT_EQ(Indent(1), "   ");
    EXPECT_EQ(Indent(2), "      ");
    const void* const pointer = reinterpret_cast<void*>(0xABCDEF);
    EXPECT_EQ(PtrText(pointer), "0x0000000000abcdef");
    EXPECT_EQ(PtrText(reinterpret_cast<void*>(~std::uintptr_t{0})), "0xffffffffffffffff");
    EXPECT_EQ(PtrText(nullptr), "000000000000000000");
    EXPECT_EQ(BareHex(pointer), "0000000000abcdef");
    EXPECT_EQ(BareHex(nullptr), "000000000000000000");
    const char* const kinds[] = {"FREE", "USED", "EXT", "UNKN"};
    for (const int type : {0, 1, 2, 3}) {
        EXPECT_STREQ(RecKindName(static_cast<std::uint8_t>(type)), kinds[type]);
    }
    EXPECT_STREQ(RecKindName(255), "UNKN");
}

}  // namespace
