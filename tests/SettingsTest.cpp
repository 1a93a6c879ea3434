// The settings: what each environment leaves at the start-up, the banner, the pair of record sizes
// that is refused, and the accessors. A host's own layer stands in for the environment; two
// processes of another host show a real one.

#include <MemPool>
#include <csignal>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <map>
#include <new>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "Child.hpp"
#include "HostLayer/HostEnv.hpp"
#include "MemPool/Settings.hpp"
#include "Output.hpp"

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
template <typename... Values>
std::string Banner(Values... values) {
    char text[1000];
    std::snprintf(text, sizeof text,
                  R"(INFO:../s/MemPool: 3259: # ================================================
INFO:../s/MemPool: 3260: # NUV_OBR_MEMPOOL_INFO
INFO:../s/MemPool: 3261: # ================================================
INFO:../s/MemPool: 3262: # Version            : $Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $
INFO:../s/MemPool: 3263: # Bucket Size        : %d
INFO:../s/MemPool: 3264: # Data Alignment     : %d
INFO:../s/MemPool: 3265: # Keep Empty Buckets : %d
INFO:../s/MemPool: 3266: # Max Record Size    : %d
INFO:../s/MemPool: 3267: # Min Record Size    : %d
INFO:../s/MemPool: 3268: # Trace              : %d
INFO:../s/MemPool: 3269: # Use Heap           : %d
)",
                  values...);
    return text;
}

// The variables in the README's table, and their defaults, 0 where one is told in words.
struct Readme {
    std::vector<std::string> variables;
    std::map<std::string, unsigned int> defaults;

    Readme() {
        std::ifstream file(README);
        for (std::string line; std::getline(file, line);) {
            char name[64] = "NUV_";
            unsigned int byDefault = 0;
            if (std::sscanf(line.c_str(), "| `NUV_%50[^`]` | %u", name + 4, &byDefault) < 1) {
                continue;
            }
            variables.push_back(name);
            defaults[name] = byDefault;
        }
    }
};

// Starts the settings up once more, under these values. Returns what stands on standard output and
// the settings that are other than at their defaults, or the refusal.
std::string StartUp(const Values& values) {
    Environment() = values;
    Asked().clear();
    Output output;
    std::ostringstream errors;
    std::streambuf* const errorOutput = std::cerr.rdbuf(errors.rdbuf());
    const std::locale locale = std::locale::global(groupingLocale);
    std::cout << std::boolalpha;
    const char* refusal = nullptr;
    try {
        EnvInit();
    } catch (const char* thrown) { refusal = thrown; }
    std::locale::global(locale);
    std::cerr.rdbuf(errorOutput);
    EXPECT_EQ(errors.str(), refusal == nullptr ? "" : refusal + std::string("\n"));
    std::string text = output.Take();
    if (refusal != nullptr) { return text + refusal; }

    static Readme readme;
    const auto show = [&text](const char* key, unsigned int value, const char* variable) {
        if (value == readme.defaults[variable]) { return; }
        text += std::string(" ") + key + "=" + std::to_string(value);
    };
    show("on", NUV_OBR_MEMPOOL_ON(), on);
    show("trace", NUV_OBR_MEMPOOL_TRACE(), trace);
    show("bucket", NUV_OBR_MEMPOOL_BUCKET_SIZE(), bucketSize);
    show("max", NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), maxRecordSize);
    show("min", NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), minRecordSize);
    show("alignment", NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), dataAlignment);
    show("keep", NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(), keepEmptyBuckets);
    return text;
}

// At load, and with the second variable only asked for where the first one leaves the pools off.
TEST(Settings, TheStartUpFindsTheRegistryReadyAndAsksAsTheReadmeTells) {
    std::vector<std::string> order = Readme().variables;
    EXPECT_EQ(Asked(), order);
    EXPECT_EQ(GetNumMgrs(), 1u);
    EXPECT_EQ(GetMgr("early"), earlyPool);

    order.erase(order.begin() + 1);
    StartUp({{on, "1"}});
    EXPECT_EQ(Asked(), order);
}

const auto defaults = Banner(4010, 4, 0, 1000, 8, 0, 1);

std::string Refusal(const std::string& sizes) {
    return "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (" + sizes + ")";
}

// Each row finds what the one before has left, and what is not stored anew would show.
TEST(Settings, EachEnvironmentLeavesItsSettings) {
    const struct {
        Values environment;
        std::string expected;
    } rows[] = {
        {{{on, "1"}, {shortOn, "0"}}, " on=1"},
        {{{on, "0"}, {shortOn, "1"}}, " on=1"},
        {{{on, "-1"}, {shortOn, "-1"}}, ""},
        {{{on, "yes"}}, ""},
        {{{bucketSize, "-1"}}, ""},
        {{{bucketSize, "0"}}, " bucket=0"},
        {{{bucketSize, ""}}, " bucket=0"},
        {{{bucketSize, " +8000 bytes"}}, " bucket=8000"},
        {{{maxRecordSize, "32767"}}, " max=32767"},
        {{{maxRecordSize, "32768"}}, ""},
        {{{maxRecordSize, "010"}}, " max=10"},
        {{{maxRecordSize, "-1"}}, ""},
        {{{minRecordSize, "4"}}, " min=4"},
        {{{minRecordSize, "3"}}, ""},
        {{{minRecordSize, "2000"}, {maxRecordSize, "2001"}}, " max=2001 min=2000"},
        {{{dataAlignment, "3"}}, " alignment=3"},
        {{{dataAlignment, "0"}}, " alignment=1"},
        {{{dataAlignment, "-3"}}, " alignment=1"},
        {{{dataAlignment, "65536"}}, " alignment=0"},
        {{{keepEmptyBuckets, "-1"}}, ""},
        {{{keepEmptyBuckets, "0"}}, ""},
        {{{keepEmptyBuckets, "1"}}, " keep=1"},
        {{{info, "-1"}}, ""},
        {{{info, "please"}}, defaults},
        {{{minRecordSize, "1000"}, {info, "0"}},
         Banner(4010, 4, 0, 1000, 1000, 0, 1) + Refusal("1000>=1000")},
        {{{minRecordSize, "-1"}}, Refusal("4294967295>=1000")},
        {{{maxRecordSize, "3"}}, Refusal("8>=3")},
        {{{maxRecordSize, "0"}}, Refusal("8>=0")},
        {{{trace, "-1"}}, ""},
        {{{trace, "1"}}, " trace=1"},
        {{{trace, "0"}}, " trace=1"},  // The one setting that no start-up switches off.
    };
    for (const auto& row : rows) { EXPECT_EQ(StartUp(row.environment), row.expected); }
    NUV_OBR_MEMPOOL_TRACE(false);
}

// Standard output works at that time, though the host itself does not make it ready.
TEST(Settings, TheLoadShowsTheBannerAheadOfTheHost) {
    const auto load = [](const Child::Environment& environment) {
        Child::Run(Child::Captured::out, environment, HOST);
    };
    EXPECT_EXIT(load({{info, ""}}), testing::ExitedWithCode(0), testing::Eq(defaults + "off\n"));
    EXPECT_EXIT(load({{info, "1"},
                      {on, "1"},
                      {trace, "1"},
                      {bucketSize, "70000"},
                      {maxRecordSize, "1500"},
                      {minRecordSize, "20"},
                      {dataAlignment, "16"},
                      {keepEmptyBuckets, "1"}}),
                testing::ExitedWithCode(0),
                testing::Eq(Banner(70000, 16, 1, 1500, 20, 1, 0) + "on\n"));
}

// The host's own code never runs. The last line is that of the standard library about an exception
// that nothing catches.
TEST(Settings, RecordSizesThatCannotWorkEndTheLoad) {
    EXPECT_EXIT(Child::Run(Child::Captured::both, {{minRecordSize, "1000"}}, HOST),
                testing::KilledBySignal(SIGABRT),
                testing::Eq(Refusal("1000>=1000") +
                            "\nterminate called after throwing an instance of 'char const*'\n"));
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
