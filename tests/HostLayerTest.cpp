// A host's own layer takes the place of the stand-in when it is linked: the start-up asks it for
// each variable in turn, and nothing else.

#include "HostLayer/HostEnv.hpp"

#include <MemPool>
#include <iostream>
#include <map>
#include <new>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "MemPool/Settings.hpp"

using namespace OBR::MemPool;

namespace {

// Local statics, since the start-up runs ahead of this file's own.
std::map<std::string, const char*>& Values() {
    static std::map<std::string, const char*> values;
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
    if (Asked().empty()) { earlyPool = new (early) Mgr("early"); }
    Asked().push_back(name);
    const auto value = Values().find(name);
    return value == Values().end() ? nullptr : value->second;
}

namespace {

const std::vector<std::string> order = {
    "NUV_OBR_MEMPOOL_ON",
    "NUV_MEMPOOL_ON",
    "NUV_OBR_MEMPOOL_TRACE",
    "NUV_OBR_MEMPOOL_BUCKET_SIZE",
    "NUV_OBR_MEMPOOL_MAX_RECORD_SIZE",
    "NUV_OBR_MEMPOOL_MIN_RECORD_SIZE",
    "NUV_OBR_MEMPOOL_DATA_ALIGNMENT",
    "NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS",
    "NUV_OBR_MEMPOOL_INFO",
};

// Starts the settings up once more, under these values. Returns the names asked for.
std::vector<std::string> StartUp(const std::map<std::string, const char*>& values) {
    Values() = values;
    Asked().assign(1, "");
    EnvInit();
    return {Asked().begin() + 1, Asked().end()};
}

TEST(HostLayer, TheStartUpFindsTheRegistryReadyAndAsksInOrder) {
    EXPECT_EQ(Asked(), order);
    EXPECT_EQ(GetNumMgrs(), 1u);
    EXPECT_EQ(GetMgr("early"), earlyPool);

    auto withoutSecond = order;
    withoutSecond.erase(withoutSecond.begin() + 1);
    EXPECT_EQ(StartUp({{"NUV_OBR_MEMPOOL_ON", "1"}}), withoutSecond);
}

TEST(HostLayer, TheStartUpStoresEveryDefaultButTheTrace) {
    StartUp({{"NUV_OBR_MEMPOOL_TRACE", "1"},
             {"NUV_OBR_MEMPOOL_ON", "1"},
             {"NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS", "1"}});
    StartUp({{"NUV_OBR_MEMPOOL_TRACE", "0"}});
    EXPECT_TRUE(NUV_OBR_MEMPOOL_TRACE());
    EXPECT_TRUE(NUV_OBR_MEMPOOL_OFF());
    EXPECT_FALSE(NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS());
    NUV_OBR_MEMPOOL_TRACE(false);
}

TEST(HostLayer, TheRefusalCarriesItsTextBeyondTheStartUp) {
    const std::string line =
        "EXCEPTION:../s/MemPool:3337: MIN_RECORD_SIZE >= MAX_RECORD_SIZE (2000>=1000)";
    std::ostringstream errors;
    std::streambuf* const former = std::cerr.rdbuf(errors.rdbuf());
    std::string refusal;
    try {
        StartUp({{"NUV_OBR_MEMPOOL_MIN_RECORD_SIZE", "2000"}});
    } catch (const char* text) { refusal = text; }
    std::cerr.rdbuf(former);
    EXPECT_EQ(refusal, line);
    EXPECT_EQ(errors.str(), line + "\n");
}

}  // namespace
