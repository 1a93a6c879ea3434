// The settings: what each environment leaves at the start-up, the banner, the pair of record sizes
// that is refused, and the accessors. A host's own layer stands in for the environment; two
// processes of another host show a real one.

#include <MemPool>
#include <csignal>
#include <iostream>
#include <map>
#include <new>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "Child.hpp"
#include "HostLayer/HostEnv.hpp"
#include "MemPool/EnvInit.hpp"

using namespace OBR::MemPool;

namespace {

using Values = std::map<std::string, const char*>;

// Local statics, since the start-up runs ahead of this file's own.
Values& Environment() {
    static Values values;
    return values;
}
std::vector<std::string>& Asked() {
    static std::vector<std::string> names;
    return names;
}

alignas(Mgr) char early[sizeof(Mgr)];
const Mgr* earlyPool = nullptr;

}  // namespace

// Nothing keeps a host's layer from building a pool when it is first asked.
const char* Host_Env::GetEnv(const char* name) {
    if (earlyPool == nullptr) { earlyPool = new (early) Mgr("early"); }
    Asked().push_back(name);
    const auto value = Environment().find(name);
    return value == Environment().end() ? nullptr : value->second;
}

namespace {

constexpr const char* on = "NUV_OBR_MEMPOOL_ON";
constexpr const char* shortOn = "NUV_MEMPOOL_ON";
constexpr const char* trace = "NUV_OBR_MEMPOOL_TRACE";
constexpr const char* bucketSize = "NUV_OBR_MEMPOOL_BUCKET_SIZE";
constexpr const char* maxRecordSize = "NUV_OBR_MEMPOOL_MAX_RECORD_SIZE";
constexpr const char* minRecordSize = "NUV_OBR_MEMPOOL_MIN_RECORD_SIZE";
constexpr const char* dataAlignment = "NUV_OBR_MEMPOOL_DATA_ALIGNMENT";
constexpr const char* keepEmptyBuckets = "NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS";
constexpr const char* info = "NUV_OBR_MEMPOOL_INFO";

// `values` are those of the lines from the bucket size on.
std::string Banner(const std::vector<std::string>& values) {
    std::vector<std::string> lines = {
        std::string(48, '='),
        "NUV_OBR_MEMPOOL_INFO",
        std::string(48, '='),
        "Version            : $Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $",
        "Bucket Size        : " + values[0],
        "Data Alignment     : " + values[1],
        "Keep Empty Buckets : " + values[2],
        "Max Record Size    : " + values[3],
        "Min Record Size    : " + values[4],
        "Trace              : " + values[5],
        "Use Heap           : " + values[6],
    };
    std::string text;
    int number = 3259;
    for (const std::string& line : lines) {
        text += "INFO:../s/MemPool: " + std::to_string(number++) + ": # " + line + "\n";
    }
    return text;
}

// Starts the settings up once more, under these values. Returns what stands on standard output and
// the settings that are other than at their defaults, or the refusal.
std::string StartUp(const Values& values) {
    Environment() = values;
    Asked().clear();
    NUV_OBR_MEMPOOL_TRACE(false);
    std::ostringstream text, errors;
    std::streambuf* const output = std::cout.rdbuf(text.rdbuf());
    std::streambuf* const errorOutput = std::cerr.rdbuf(errors.rdbuf());
    const char* refusal = nullptr;
    try {
        EnvInit();
    } catch (const char* thrown) { refusal = thrown; }
    std::cout.rdbuf(output);
    std::cerr.rdbuf(errorOutput);
    EXPECT_EQ(errors.str(), refusal == nullptr ? "" : refusal + std::string("\n"));
    if (refusal != nullptr) { return text.str() + refusal; }

    const auto show = [&text](const char* name, unsigned int value, unsigned int byDefault) {
        if (value != byDefault) { text << " " << name << "=" << value; }
    };
    show("on", NUV_OBR_MEMPOOL_ON(), 0);
    show("trace", NUV_OBR_MEMPOOL_TRACE(), 0);
    show("bucket", NUV_OBR_MEMPOOL_BUCKET_SIZE(), 4010);
    show("max", NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), 1000);
    show("min", NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), 8);
    show("alignment", NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), 4);
    show("keep", NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(), 0);
    return text.str();
}

// At load, and with the second variable only asked for where the first one leaves the pools off.
TEST(Settings, TheStartUpFindsTheRegistryReadyAndAsksInOrder) {
    std::vector<std::string> order = {on,
                                      shortOn,
                                      trace,
                                      bucketSize,
                                      maxRecordSize,
                                      minRecordSize,
                                      dataAlignment,
                                      keepEmptyBuckets,
                                      info};
    EXPECT_EQ(Asked(), order);
    EXPECT_EQ(GetNumMgrs(), 1u);
    EXPECT_EQ(GetMgr("early"), earlyPool);

    order.erase(order.begin() + 1);
    StartUp({{on, "1"}});
    EXPECT_EQ(Asked(), order);
}

const std::string refusal =
    "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (1000>=1000)";

TEST(Settings, EachEnvironmentLeavesItsSettings) {
    const auto defaults = Banner({"4010", "4", "0", "1000", "8", "0", "1"});
    const struct {
        Values environment;
        std::string expected;
    } rows[] = {
        {{{on, "1"}, {shortOn, "0"}}, " on=1"},
        {{{on, "0"}, {shortOn, "1"}}, " on=1"},
        {{{on, "-1"}, {shortOn, "-1"}}, ""},
        {{{on, "yes"}}, ""},
        {{{trace, "1"}}, " trace=1"},
        {{{trace, "-1"}}, ""},
        {{{bucketSize, "-1"}}, ""},
        {{{bucketSize, "0"}}, " bucket=0"},
        {{{bucketSize, ""}}, " bucket=0"},
        {{{bucketSize, " +8000 bytes"}}, " bucket=8000"},
        {{{maxRecordSize, "32767"}}, " max=32767"},
        {{{maxRecordSize, "32768"}}, ""},
        {{{maxRecordSize, "-1"}}, ""},
        {{{minRecordSize, "4"}}, " min=4"},
        {{{minRecordSize, "3"}}, ""},
        {{{minRecordSize, "2000"}, {maxRecordSize, "2001"}}, " max=2001 min=2000"},
        {{{dataAlignment, "3"}}, " alignment=3"},
        {{{dataAlignment, "0"}}, " alignment=1"},
        {{{dataAlignment, "-3"}}, " alignment=1"},
        {{{dataAlignment, "65536"}}, " alignment=0"},
        {{{keepEmptyBuckets, "1"}}, " keep=1"},
        {{{keepEmptyBuckets, "-1"}}, ""},
        {{{info, "-1"}}, ""},
        {{{info, "0"}}, defaults},
        {{{info, "please"}}, defaults},
        {{{minRecordSize, "1000"}, {info, "1"}},
         Banner({"4010", "4", "0", "1000", "1000", "0", "1"}) + refusal},
        {{{minRecordSize, "-1"}},
         "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (4294967295>=1000)"},
    };
    for (const auto& row : rows) { EXPECT_EQ(StartUp(row.environment), row.expected); }
}

TEST(Settings, TheStartUpStoresEveryDefaultButTheTrace) {
    StartUp({{on, "1"},
             {keepEmptyBuckets, "1"},
             {bucketSize, "9"},
             {minRecordSize, "7"},
             {maxRecordSize, "99"},
             {dataAlignment, "8"}});
    EXPECT_EQ(StartUp({}), "");
    NUV_OBR_MEMPOOL_TRACE(true);
    Environment() = {{trace, "0"}};
    EnvInit();
    EXPECT_TRUE(NUV_OBR_MEMPOOL_TRACE());
    NUV_OBR_MEMPOOL_TRACE(false);
}

// Standard output works at that time, though the host itself does not make it ready.
TEST(Settings, TheLoadShowsTheBannerAheadOfTheHost) {
    EXPECT_EXIT(Child::Run(Child::Captured::out,
                           {{info, "1"},
                            {on, "1"},
                            {trace, "1"},
                            {bucketSize, "70000"},
                            {maxRecordSize, "1500"},
                            {minRecordSize, "20"},
                            {dataAlignment, "16"},
                            {keepEmptyBuckets, "1"}},
                           HOST),
                testing::ExitedWithCode(0),
                testing::Eq(Banner({"70000", "16", "1", "1500", "20", "1", "0"}) + "on\n"));
}

// The host's own code never runs. The last line is that of the standard library about an exception
// that nothing catches.
TEST(Settings, RecordSizesThatCannotWorkEndTheLoad) {
    EXPECT_EXIT(
        Child::Run(Child::Captured::both, {{minRecordSize, "1000"}}, HOST),
        testing::KilledBySignal(SIGABRT),
        testing::Eq(refusal + "\nterminate called after throwing an instance of 'char const*'\n"));
}

TEST(Settings, AccessorsStoreWhatTheyAreGiven) {
    NUV_OBR_MEMPOOL_BUCKET_SIZE(4294967295);
    NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(70000);
    NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(80000);
    NUV_OBR_MEMPOOL_DATA_ALIGNMENT(65540);
    EXPECT_EQ(NUV_OBR_MEMPOOL_BUCKET_SIZE(), 4294967295);
    EXPECT_EQ(NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), 70000u);
    EXPECT_EQ(NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), 80000u);
    EXPECT_EQ(NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), 4u);
    for (const bool value : {true, false}) {
        NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(value);
        EXPECT_EQ(NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(), value);
        NUV_OBR_MEMPOOL_ON(value);
        EXPECT_EQ(NUV_OBR_MEMPOOL_ON(), value);
        EXPECT_EQ(NUV_OBR_MEMPOOL_OFF(), !value);
        NUV_OBR_MEMPOOL_OFF(value);
        EXPECT_EQ(NUV_OBR_MEMPOOL_ON(), !value);
    }
}

}  // namespace
