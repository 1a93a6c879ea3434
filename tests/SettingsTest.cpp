// The settings as a host sees them: what each environment leaves at load, the banner, the pair of
// record sizes that ends the load, and the accessors.

#include <MemPool>
#include <array>
#include <csignal>
#include <cstddef>
#include <initializer_list>
#include <string>

#include <gtest/gtest.h>

#include "Child.hpp"

using namespace OBR::MemPool;
using Child::Captured;
using Child::Environment;
using testing::Eq;
using testing::ExitedWithCode;
using testing::KilledBySignal;

namespace {

const std::string version = "$Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $";
const std::string refusal = "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE ";

// `values` are those of the lines from the bucket size on.
std::string Banner(const std::array<const char*, 7>& values) {
    const char* const texts[] = {
        "Bucket Size        : ", "Data Alignment     : ", "Keep Empty Buckets : ",
        "Max Record Size    : ", "Min Record Size    : ", "Trace              : ",
        "Use Heap           : ",
    };
    const std::string info = "INFO:../s/MemPool: ";
    const std::string rule = ": # ================================================\n";
    std::string text = info + "3259" + rule + info + "3260: # NUV_OBR_MEMPOOL_INFO\n" + info +
                       "3261" + rule + info + "3262: # Version            : " + version + "\n";
    for (std::size_t line = 0; line < values.size(); ++line) {
        text += info + std::to_string(3263 + line) + ": # " + texts[line] + values[line] + "\n";
    }
    return text;
}

// `changes` are the settings that the load leaves other than at their defaults.
void ExpectSettings(const Environment& environment, const std::string& changes,
                    const std::string& banner = "") {
    EXPECT_EXIT(Child::Run(Captured::both, environment, SHOW_SETTINGS), ExitedWithCode(0),
                Eq(banner + "settings:" + (changes.empty() ? "" : " ") + changes + "\n"));
}

constexpr const char* on = "NUV_OBR_MEMPOOL_ON";
constexpr const char* shortOn = "NUV_MEMPOOL_ON";
constexpr const char* trace = "NUV_OBR_MEMPOOL_TRACE";
constexpr const char* bucketSize = "NUV_OBR_MEMPOOL_BUCKET_SIZE";
constexpr const char* maxRecordSize = "NUV_OBR_MEMPOOL_MAX_RECORD_SIZE";
constexpr const char* minRecordSize = "NUV_OBR_MEMPOOL_MIN_RECORD_SIZE";
constexpr const char* dataAlignment = "NUV_OBR_MEMPOOL_DATA_ALIGNMENT";
constexpr const char* keepEmptyBuckets = "NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS";
constexpr const char* info = "NUV_OBR_MEMPOOL_INFO";

TEST(Settings, EachVariableAtItsBounds) {
    const struct {
        const char *name, *value, *changes;
    } rows[] = {
        {on, "1", "on=1 off=0"},
        {on, "0", ""},
        {on, "-1", ""},
        {on, "yes", ""},
        {shortOn, "1", "on=1 off=0"},
        {shortOn, "0", ""},
        {trace, "1", "trace=1"},
        {trace, "0", ""},
        {trace, "-1", ""},
        {bucketSize, "-1", ""},
        {bucketSize, "0", "bucket=0"},
        {bucketSize, "", "bucket=0"},
        {bucketSize, "large", "bucket=0"},
        {bucketSize, " +8000 bytes", "bucket=8000"},
        {maxRecordSize, "32767", "max=32767"},
        {maxRecordSize, "32768", ""},
        {maxRecordSize, "-1", ""},
        {minRecordSize, "4", "min=4"},
        {minRecordSize, "3", ""},
        {minRecordSize, "999", "min=999"},
        {dataAlignment, "3", "alignment=3"},
        {dataAlignment, "0", "alignment=1"},
        {dataAlignment, "-3", "alignment=1"},
        {dataAlignment, "65536", "alignment=0"},
        {dataAlignment, "65537", "alignment=1"},
        {keepEmptyBuckets, "1", "keep=1"},
        {keepEmptyBuckets, "0", ""},
        {keepEmptyBuckets, "-1", ""},
        {info, "-1", ""},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.name) + "=" + row.value);
        ExpectSettings({{row.name, row.value}}, row.changes);
    }
}

TEST(Settings, WithNoVariableSetTheDefaultsStandAndNothingIsPrinted) {
    ExpectSettings({}, "");
}

TEST(Settings, VariablesCombine) {
    ExpectSettings({{on, "0"}, {shortOn, "1"}}, "on=1 off=0");
    ExpectSettings({{on, "1"}, {shortOn, "0"}}, "on=1 off=0");
    ExpectSettings({{on, "-1"}, {shortOn, "-1"}}, "");
    ExpectSettings({{minRecordSize, "2000"}, {maxRecordSize, "2001"}}, "max=2001 min=2000");
}

TEST(Settings, TheBannerShowsEverySettingThatTheEnvironmentLeaves) {
    const auto defaults = Banner({"4010", "4", "0", "1000", "8", "0", "1"});
    ExpectSettings({{info, "0"}}, "", defaults);
    ExpectSettings({{info, "1"}}, "", defaults);
    ExpectSettings({{info, ""}}, "", defaults);
    ExpectSettings({{info, "please"}}, "", defaults);
    ExpectSettings({{info, "1"},
                    {on, "1"},
                    {trace, "1"},
                    {bucketSize, "70000"},
                    {maxRecordSize, "1500"},
                    {minRecordSize, "20"},
                    {dataAlignment, "16"},
                    {keepEmptyBuckets, "1"}},
                   "on=1 off=0 trace=1 bucket=70000 max=1500 min=20 alignment=16 keep=1",
                   Banner({"70000", "16", "1", "1500", "20", "1", "0"}));
}

// No line of ShowSettings appears: the host's own code never runs. The last line is that of the
// standard library about an exception that nothing catches.
TEST(Settings, RecordSizesThatCannotWorkEndTheLoad) {
    const struct {
        Environment environment;
        const char* sizes;
    } rows[] = {
        {{{minRecordSize, "1000"}}, "(1000>=1000)"},
        {{{minRecordSize, "-1"}}, "(4294967295>=1000)"},
        {{{maxRecordSize, "8"}}, "(8>=8)"},
        {{{maxRecordSize, "0"}}, "(8>=0)"},
        {{{maxRecordSize, "20"}, {minRecordSize, "21"}}, "(21>=20)"},
    };
    const std::string uncaught = "terminate called after throwing an instance of 'char const*'\n";
    for (const auto& row : rows) {
        const std::string line = refusal + row.sizes + "\n";
        EXPECT_EXIT(Child::Run(Captured::err, row.environment, SHOW_SETTINGS),
                    KilledBySignal(SIGABRT), Eq(line + uncaught));
        EXPECT_EXIT(Child::Run(Captured::out, row.environment, SHOW_SETTINGS),
                    KilledBySignal(SIGABRT), Eq(""));
        // dlopen promises its callers not to throw: a catch around it is never reached.
        EXPECT_EXIT(Child::Run(Captured::both, row.environment, LOAD_LIBRARY, LIBRARY),
                    KilledBySignal(SIGABRT), Eq(line + uncaught));
    }

    const Environment shown = {{minRecordSize, "1000"}, {info, "0"}};
    EXPECT_EXIT(Child::Run(Captured::both, shown, SHOW_SETTINGS), KilledBySignal(SIGABRT),
                Eq(Banner({"4010", "4", "0", "1000", "1000", "0", "1"}) + refusal +
                   "(1000>=1000)\n" + uncaught));
}

TEST(Settings, StandardOutputWorksWhileTheLibraryIsLoadedAtRunTime) {
    EXPECT_EXIT(Child::Run(Captured::out, {{info, "0"}}, LOAD_LIBRARY, LIBRARY), ExitedWithCode(0),
                Eq(Banner({"4010", "4", "0", "1000", "8", "0", "1"}) + "loaded\n"));
}

TEST(Settings, APoolCopiesTheSwitchWhenItIsBuilt) {
    NUV_OBR_MEMPOOL_OFF(true);
    const Mgr before("before");
    NUV_OBR_MEMPOOL_ON(true);
    const Mgr after("after");
    EXPECT_FALSE(before.IsEnabled());
    EXPECT_TRUE(after.IsEnabled());
    NUV_OBR_MEMPOOL_OFF(true);
    EXPECT_TRUE(after.IsEnabled());
}

// Stores each value and expects the getter of that name to give it back.
template <typename Value>
void ExpectStored(void (*set)(Value), Value (*get)(), std::initializer_list<Value> values) {
    for (const Value value : values) {
        set(value);
        EXPECT_EQ(get(), value);
    }
}

TEST(Settings, AccessorsStoreWhatTheyAreGiven) {
    ExpectStored<unsigned int>(NUV_OBR_MEMPOOL_BUCKET_SIZE, NUV_OBR_MEMPOOL_BUCKET_SIZE,
                               {0, 4294967295});
    ExpectStored<unsigned int>(NUV_OBR_MEMPOOL_MAX_RECORD_SIZE, NUV_OBR_MEMPOOL_MAX_RECORD_SIZE,
                               {1, 70000});
    ExpectStored<unsigned int>(NUV_OBR_MEMPOOL_MIN_RECORD_SIZE, NUV_OBR_MEMPOOL_MIN_RECORD_SIZE,
                               {2, 80000});
    EXPECT_EQ(NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), 70000u);
    ExpectStored<unsigned int>(NUV_OBR_MEMPOOL_DATA_ALIGNMENT, NUV_OBR_MEMPOOL_DATA_ALIGNMENT,
                               {1, 65535, 0});
    NUV_OBR_MEMPOOL_DATA_ALIGNMENT(65540);
    EXPECT_EQ(NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), 4u);

    ExpectStored<bool>(NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS, NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS,
                       {true, false});
    ExpectStored<bool>(NUV_OBR_MEMPOOL_TRACE, NUV_OBR_MEMPOOL_TRACE, {true, false});
    ExpectStored<bool>(NUV_OBR_MEMPOOL_ON, NUV_OBR_MEMPOOL_ON, {false, true});
    EXPECT_FALSE(NUV_OBR_MEMPOOL_OFF());
    ExpectStored<bool>(NUV_OBR_MEMPOOL_OFF, NUV_OBR_MEMPOOL_OFF, {false, true});
    EXPECT_FALSE(NUV_OBR_MEMPOOL_ON());
    EXPECT_EQ(GetVersion(), version);
}

}  // namespace
