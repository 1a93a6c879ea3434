// Operations on the process: settings, building and destroying pools, handles that share them,
// names and reports.

#include <algorithm>
#include <iostream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "../PoolFixture.hpp"
#include "MemPool/MgrRegistry.hpp"
#include "MemPool/Settings.hpp"
#include "World.hpp"

namespace Fuzz {

using namespace OBR::MemPool;

namespace {

// Takes standard output for as long as it lives.
class Capture final : public std::stringbuf {
public:
    Capture() : former(std::cout.rdbuf(this)) {}
    ~Capture() override { std::cout.rdbuf(former); }

private:
    std::streambuf* const former;
};

// The number after a label of a report.
std::size_t Figure(const std::string& report, const std::string& label) {
    const std::size_t place = report.find(label);
    EXPECT_NE(place, std::string::npos) << label;
    return place == std::string::npos ? 0 : std::stoul(report.substr(place + label.size()));
}

}  // namespace

// Sizes that a pool can have, so that short inputs reach more.
World::World(Bytes& input) : bytes(input) {
    constexpr Sizes starts[] = {{4010, 4, 1000, 8}, {200, 4, 100, 8},  {103, 1, 50, 8},
                                {300, 3, 90, 40},   {24, 4, 20, 20},   {4010, 16, 19, 4},
                                {500, 32, 490, 64}, {65535, 8, 60, 12}};
    const Sizes start = bytes.OneOf(starts);
    Settings::pool.bucketSize = start.bucket;
    Settings::pool.dataAlignment = static_cast<std::uint16_t>(start.alignment);
    Settings::pool.maxRecordSize = start.largest;
    Settings::pool.minRecordSize = start.smallest;
    const std::uint8_t switches = bytes.Byte();
    Settings::pool.keepEmptyBuckets = (switches & 1) != 0;
    Settings::trace = (switches & 2) != 0;
    Settings::off = (switches & 4) != 0;
}

// The pools that are left at the end are walked completely. Pools that have lost all handles live
// until the process ends; here they are destroyed by the steps that a handle would take.
World::~World() {
    CheckRegistry();
    for (const auto& account : accounts.All()) {
        account->Check(true);
        account->ExpectAllFilled();
    }
    for (HeapPlace& place : heaps) {
        if (place.heap != nullptr) { Destroy(place); }
    }
    for (Handle& handle : handles) {
        if (handle.mgr != nullptr) { Destroy(handle); }
    }
    while (!accounts.All().empty()) {
        const Account& account = *accounts.All().back();
        registry.Erase(account.name);
        if (!account.pool->enabled) {
            for (const auto& [data, block] : account.live) { ::operator delete[](data); }
        }
        delete account.pool;
        accounts.Close(account);
    }
    EXPECT_EQ(GetNumMgrs(), 0);
}

void World::Step() {
    const std::uint32_t choice = bytes.Byte();
    Handle& handle = handles[choice / 8 % handles.size()];
    HeapPlace& place = heaps[choice / 8 % heaps.size()];
    switch (choice % 8) {
        case 0:
            ChangeSetting();
            break;
        case 1:
            Assign(handle, handles[bytes.Below(handles.size())]);
            break;
        case 2:
            CheckRegistry();
            break;
        case 3:
        case 4:
            StepOf(place);
            break;
        default:
            StepOf(handle);
    }
}

void World::ChangeSetting() {
    constexpr std::uint32_t sizes[] = {
        0,     1,     3,   4,   5,    8,    12,   16,         20,         24,    77,
        100,   104,   300, 996, 1000, 1004, 4010, 32767,      65531,      65532, 65535,
        65536, 70000, ~0u, ~3u, ~4u,  7,    50,   0x7FFFFFFF, 0x80000000, 2};
    const std::uint32_t which = bytes.Below(8);
    const std::uint32_t size = bytes.Bit() ? bytes.Short() : bytes.OneOf(sizes);
    const bool isSet = size % 2 != 0;
    switch (which) {
        case 0:
            NUV_OBR_MEMPOOL_BUCKET_SIZE(size);
            EXPECT_EQ(NUV_OBR_MEMPOOL_BUCKET_SIZE(), size);
            break;
        case 1:
            NUV_OBR_MEMPOOL_DATA_ALIGNMENT(size);
            EXPECT_EQ(NUV_OBR_MEMPOOL_DATA_ALIGNMENT(), size & 0xFFFF);
            break;
        case 2:
            NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(size);
            EXPECT_EQ(NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), size);
            break;
        case 3:
            NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(size);
            EXPECT_EQ(NUV_OBR_MEMPOOL_MIN_RECORD_SIZE(), size);
            break;
        case 4:
            NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(isSet);
            EXPECT_EQ(NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(), isSet);
            break;
        case 5:
            NUV_OBR_MEMPOOL_OFF(isSet);
            EXPECT_EQ(NUV_OBR_MEMPOOL_ON(), !isSet);
            break;
        case 6:
            NUV_OBR_MEMPOOL_ON(isSet);
            EXPECT_EQ(NUV_OBR_MEMPOOL_OFF(), !isSet);
            break;
        default:
            NUV_OBR_MEMPOOL_TRACE(isSet);
            EXPECT_EQ(NUV_OBR_MEMPOOL_TRACE(), isSet);
    }
}

const char* World::Name() {
    constexpr const char* names[] = {nullptr, "", "a", "b", "a name that has to be on the heap"};
    return bytes.OneOf(names);
}

void World::Build(Handle& handle) {
    const char* const name = Name();
    // Either would end the process.
    if (accounts.IsTaken(name) || !Sizes::InForce().CanMakePool()) { return; }
    if (!Succeeds([&] { handle.mgr = std::make_unique<Mgr>(name); })) { return; }
    handle.account = &accounts.Open(*handle.mgr, false);
    EXPECT_EQ(handle.mgr->IsEnabled(), NUV_OBR_MEMPOOL_ON());
    if (name != nullptr) { EXPECT_STREQ(handle.mgr->GetName(), name); }
}

// A pool ends with the first of its handles. The blocks of a disabled one live on; they are freed
// here, while there is a pool to do that.
void World::Destroy(Handle& handle) {
    Account* const account = handle.account;
    if (account != nullptr) {
        account->ExpectAllFilled();
        account->Check(true);
        for (const auto& [data, block] : account->live) {
            if (!account->pool->enabled) { EXPECT_TRUE(handle.mgr->Free(data)); }
        }
        for (Handle& other : handles) {
            if (other.account == account) { other.account = nullptr; }
        }
        accounts.Close(*account);
    }
    accounts.Forget(handle.mgr.get());
    handle.mgr.reset();
    for (const Handle& other : handles) {
        if (other.mgr != nullptr && other.account == nullptr) {
            EXPECT_EQ(other.mgr->GetBucketMgr(), nullptr);
        }
    }
}

void World::Assign(Handle& handle, const Handle& other) {
    if (handle.mgr == nullptr || other.mgr == nullptr) { return; }
    if (Succeeds([&] { *handle.mgr = *other.mgr; })) { handle.account = other.account; }
    EXPECT_EQ(handle.mgr->GetBucketMgr(),
              handle.account != nullptr ? handle.account->pool : nullptr);
}

bool World::HasPool(const Mgr* handle) const {
    for (const Handle& one : handles) {
        if (one.mgr != nullptr && one.mgr.get() == handle) { return one.account != nullptr; }
    }
    return handle != nullptr;  // A Heap's.
}

void World::CheckRegistry() const {
    accounts.CheckRegistry([this](const Mgr* handle) { return HasPool(handle); });
}

void World::ReportOn(const Mgr& mgr, const Account& account) {
    constexpr std::uint32_t manyBytes = 20000;
    const bool isDetailed =
        bytes.Bit() && account.pool->GetNumBuckets() * account.pool->bucketSize < manyBytes;
    const Capture capture;
    isDetailed ? mgr.DbgDetailed() : mgr.Dbg();
    const std::string report = capture.str();
    EXPECT_EQ(report.find("MemPool::Mgr " + account.name + "\n"), report.find("MemPool"));
    EXPECT_EQ(Figure(report, "Used Recs   : ") + Figure(report, "Ext Recs    : "),
              account.pool->enabled ? account.live.size() : 0);
    EXPECT_EQ(Figure(report, "Num Buckets : "), account.pool->GetNumBuckets());
}

// A size of any class, the bounds of the pool's buckets among them.
std::uint32_t World::Size(const Account& account) {
    const std::uint32_t largest = account.pool->maxRecordSize;
    switch (bytes.Below(4)) {
        case 0:
            return bytes.Byte() % 40;
        case 1:
            return bytes.Byte();
        case 2:
            return std::max(largest, 16u) - bytes.Below(16);
        default:
            return bytes.Short() % (3 * largest + 1);
    }
}

Live::iterator World::OneBlock(Account& account) {
    if (account.live.empty()) { return account.live.end(); }
    return std::next(account.live.begin(), bytes.Below(account.live.size()));
}

}  // namespace Fuzz
