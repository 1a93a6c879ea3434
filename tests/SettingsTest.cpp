// The settings: the result of each environment, the banner, the record sizes that are refused, and
// the accessors. A host layer of the test's own replaces the environment; two tests start another
// host with a real one.

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

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "Child.hpp"
#include "HostLayer/HostEnv.hpp"
#include "MemPool/Settings.hpp"
#include "Output.hpp"

using namespace OBR::MemPool;
using testing::HasSubstr;
using testing::StartsWith;

namespace {

using Values = std::map<std::string, const char*>;

// Local statics, since the start-up runs before this file's other statics exist.
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

// A host's layer may build a pool when it is first asked.
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

// The banner with these values from the bucket size on.
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

// The README's table: the variables, and the other cells of the row of each.
struct Readme {
    std::vector<std::string> variables;
    std::map<std::string, std::string> cells;

    Readme() {
        std::ifstream file(README);
        for (std::string line; std::getline(file, line);) {
            if (line.compare(0, 7, "| `NUV_") != 0) { continue; }
            const std::size_t end = line.find('`', 3);
            variables.push_back(line.substr(3, end - 3));
            cells[variables.back()] = line.substr(end + 1);
        }
    }
};

// Starts the settings up again with these variables. Returns what is printed, and then the settings
// that differ from their defaults, or the refusal.
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

    const PoolSettings settings = PoolSettings::OfProcess();
    if (NUV_OBR_MEMPOOL_ON()) { text += " on"; }
    if (NUV_OBR_MEMPOOL_TRACE()) { text += " trace"; }
    for (const Setting& row : SettingTable::all) {
        const unsigned int value = row.In(settings);
        if (value != row.In(PoolSettings())) {
            text += std::string(" ") + row.key + "=" + std::to_string(value);
        }
    }
    return text;
}

// At load. The second variable is read only if the first leaves pools off.
TEST(Settings, TheStartUpFindsTheRegistryReadyAndReadsInTheOrderOfTheReadme) {
    std::vector<std::string> order = Readme().variables;
    EXPECT_EQ(Asked(), order);
    EXPECT_EQ(GetNumMgrs(), 1u);
    EXPECT_EQ(GetMgr("early"), earlyPool);

    order.erase(order.begin() + 1);
    StartUp({{on, "1"}});
    EXPECT_EQ(Asked(), order);
}

TEST(Settings, TheReadmeHasTheDefaultsAndBoundsOfTheTable) {
    Readme readme;
    for (const Setting& row : SettingTable::all) {
        const std::string byDefault = row.IsFlag() ? "off" : std::to_string(row.In(PoolSettings()));
        EXPECT_THAT(readme.cells[row.variable], StartsWith(" | " + byDefault + " | "));
    }
    EXPECT_THAT(readme.cells[maxRecordSize],
                HasSubstr(" to " + std::to_string(SettingTable::maxRecordSize.largest) + " | "));
    EXPECT_THAT(
        readme.cells[minRecordSize],
        HasSubstr(" | " + std::to_string(SettingTable::minRecordSize.smallest) + " or more | "));
}

const auto defaults = Banner(4010, 4, 0, 1000, 8, 0, 1);

std::string Refusal(const std::string& sizes) {
    return "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (" + sizes + ")";
}

// Each row starts with the settings of the row before: one that is not reset would show.
TEST(Settings, EachEnvironmentLeavesItsSettings) {
    const struct {
        Values environment;
        std::string expected;
    } rows[] = {
        {{{on, "1"}, {shortOn, "0"}}, " on"},
        {{{on, "0"}, {shortOn, "1"}}, " on"},
        {{{on, "-1"}, {shortOn, "-1"}}, ""},
        {{{on, "yes"}}, ""},
        {{{bucketSize, "-1"}}, ""},
        {{{bucketSize, "0"}}, " bucket_size=0"},
        {{{bucketSize, ""}}, " bucket_size=0"},
        {{{bucketSize, " +8000 bytes"}}, " bucket_size=8000"},
        {{{maxRecordSize, "32767"}}, " max_record_size=32767"},
        {{{maxRecordSize, "32768"}}, ""},
        {{{maxRecordSize, "010"}}, " max_record_size=10"},
        {{{maxRecordSize, "-1"}}, ""},
        {{{minRecordSize, "4"}}, " min_record_size=4"},
        {{{minRecordSize, "3"}}, ""},
        {{{minRecordSize, "2000"}, {maxRecordSize, "2001"}},
         " max_record_size=2001 min_record_size=2000"},
        {{{dataAlignment, "3"}}, " data_alignment=3"},
        {{{dataAlignment, "0"}}, " data_alignment=1"},
        {{{dataAlignment, "-3"}}, " data_alignment=1"},
        {{{dataAlignment, "65536"}}, " data_alignment=0"},
        {{{keepEmptyBuckets, "-1"}}, ""},
        {{{keepEmptyBuckets, "0"}}, ""},
        {{{keepEmptyBuckets, "1"}}, " keep_empty_buckets=1"},
        {{{info, "-1"}}, ""},
        {{{info, "please"}}, defaults},
        {{{minRecordSize, "1000"}, {info, "0"}},
         Banner(4010, 4, 0, 1000, 1000, 0, 1) + Refusal("1000>=1000")},
        {{{minRecordSize, "-1"}}, Refusal("4294967295>=1000")},
        {{{maxRecordSize, "3"}}, Refusal("8>=3")},
        {{{maxRecordSize, "0"}}, Refusal("8>=0")},
        {{{trace, "-1"}}, ""},
        {{{trace, "1"}}, " trace"},
        {{{trace, "0"}}, " trace"},  // The only setting that no start-up resets.
    };
    for (const auto& row : rows) { EXPECT_EQ(StartUp(row.environment), row.expected); }
    NUV_OBR_MEMPOOL_TRACE(false);
}

// Standard output works then, although the host does not initialise it.
TEST(Settings, TheLoadShowsTheBannerBeforeTheHostStarts) {
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

// The host's own code never runs. The standard library prints the last line, about an exception
// that nothing catches.
TEST(Settings, RecordSizesThatCannotWorkEndTheLoad) {
    EXPECT_EXIT(Child::Run(Child::Captured::both, {{minRecordSize, "1000"}}, HOST),
                testing::KilledBySignal(SIGABRT),
                testing::Eq(Refusal("1000>=1000") +
                            "\nterminate called after throwing an instance of 'char const*'\n"));
}

TEST(Settings, AccessorsStoreAnyValue) {
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
