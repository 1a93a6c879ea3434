// Compares the accounts of pools and blocks with what the library reports.

#include "Accounts.hpp"

#include <algorithm>
#include <array>
#include <cstring>
#include <vector>

#include <gtest/gtest.h>

#include "../PoolFixture.hpp"

namespace Fuzz {

using namespace OBR::MemPool;

namespace {

constexpr std::uint32_t heapRecordHeader = 0xCC02BBAA;

}  // namespace

void Account::Add(std::uint8_t* data, const Block& block) {
    EXPECT_GE(block.usable, block.size);
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(data) % block.alignment, 0);
    std::memset(data, block.fill, block.usable);
    EXPECT_TRUE(live.emplace(data, block).second) << "A block is given out twice.";
}

void Account::ExpectFilled(Live::const_iterator one) const {
    const auto& [data, block] = *one;
    EXPECT_EQ(static_cast<std::size_t>(std::count(data, data + block.usable, block.fill)),
              block.usable)
        << "A block of " << block.usable << " bytes was written to.";
}

void Account::ExpectAllFilled() const {
    for (auto one = live.begin(); one != live.end(); ++one) { ExpectFilled(one); }
}

void Account::Check(bool thoroughly) const {
    constexpr std::uint32_t fewSteps = 600;
    const std::uint32_t recsOfBucket = pool->bucketSize / (pool->dataAlignment + 4) + 1;
    const bool isQuick = pool->numGroups + pool->GetNumBuckets() * recsOfBucket < fewSteps;
    if (!thoroughly && (!isQuick || Large() != nullptr)) { return; }
    const Blocks blocks = AllBlocks();
    ASSERT_EQ(blocks.size(), pool->enabled ? live.size() : 0);
    if (!pool->enabled) { return; }
    auto at = blocks.begin();
    for (const auto& [data, block] : live) {
        const auto [start, size] = *at++;
        ASSERT_LE(start, data);
        ASSERT_EQ(data + block.usable, start + size);
        if (!isOfHeap) { ASSERT_EQ(data, start); }
        // No more is taken than alignment and the smallest size class explain.
        const std::size_t rounded =
            (block.most + pool->dataAlignment - 1) / pool->dataAlignment * pool->dataAlignment;
        ASSERT_LE(size, std::max<std::size_t>(rounded, pool->minRecordSize + pool->dataAlignment));
    }
}

const std::uint8_t* Account::RecordOf(const std::uint8_t* data) const {
    const Blocks blocks = AllBlocks();
    const auto above = blocks.upper_bound(data);
    return above == blocks.begin() ? data : std::prev(above)->first;
}

const BucketMgr* Account::Large() const {
    const Mgr* const large = isOfHeap ? GetMgr((name + ", large buckets").c_str()) : nullptr;
    return large == nullptr ? nullptr : large->GetBucketMgr();
}

Blocks Account::AllBlocks() const {
    Blocks blocks = CheckInvariants(*pool);
    if (const BucketMgr* const large = Large()) { blocks.merge(CheckInvariants(*large)); }
    return blocks;
}

bool Account::StaysReadable(const void* data) const {
    const Bucket* bucket = pool->FindBucket(data);
    if (bucket == nullptr && Large() != nullptr) { bucket = Large()->FindBucket(data); }
    if (bucket == nullptr) { return false; }
    const std::uint32_t total = (bucket->size - 2u) / bucket->recSize;
    return pool->keepEmptyBuckets || total - bucket->numFree > 1;
}

Account& Accounts::Open(Mgr& builder, bool isOfHeap) {
    all.push_back(std::make_unique<Account>(
        Account{builder.GetBucketMgr(), builder.GetName(), &builder, isOfHeap}));
    return *all.back();
}

void Accounts::Close(const Account& account) {
    all.erase(std::find_if(all.begin(), all.end(),
                           [&account](const auto& one) { return one.get() == &account; }));
}

void Accounts::Forget(const Mgr* handle) {
    for (const auto& account : all) {
        if (account->builder == handle) { account->builder = nullptr; }
    }
}

bool Accounts::IsTaken(const char* name) const {
    return name != nullptr && std::any_of(all.begin(), all.end(), [name](const auto& account) {
               return account->name == name;
           });
}

std::size_t Accounts::NumBlocks() const {
    std::size_t number = 0;
    for (const auto& account : all) { number += account->live.size(); }
    return number;
}

void Accounts::WithBlockOfOther(
    Bytes& bytes, const Account* not_of,
    const std::function<void(const Account&, std::uint8_t*)>& visit) const {
    const std::uint32_t first = bytes.Byte();
    const std::uint32_t place = bytes.Byte();
    for (std::size_t n = 0; n < all.size(); ++n) {
        const Account& account = *all[(first + n) % all.size()];
        if (&account == not_of || account.live.empty()) { continue; }
        const std::size_t index = place % account.live.size();
        visit(account, std::next(account.live.begin(), static_cast<long>(index))->first);
        return;
    }
}

void Accounts::CheckRegistry(const std::function<bool(const Mgr*)>& hasPool) const {
    std::map<std::string, Mgr*> expected;
    std::size_t number = all.size();
    for (const auto& account : all) {
        if (const BucketMgr* const large = account->Large()) {
            expected[large->name] = large->mgr;
            ++number;
        }
        Mgr* const handle = hasPool(account->builder) ? account->builder : nullptr;
        EXPECT_EQ(GetMgr(account->name.c_str()), handle);
        if (handle != nullptr) { expected[account->name] = handle; }
    }
    EXPECT_EQ(GetNumMgrs(), number);
    EXPECT_EQ(GetMgr("no such pool"), nullptr);
    std::vector<Mgr*> wanted;
    for (const auto& [name, handle] : expected) { wanted.push_back(handle); }
    std::vector<Mgr*> handles;
    OBR::vector<Mgr*, std::allocator<Mgr*>> compact;
    GetMgrs(handles);
    GetMgrs(compact);
    EXPECT_EQ(handles, wanted);
    EXPECT_EQ(std::vector<Mgr*>(compact.begin(), compact.end()), wanted);
}

Foreign MakeForeign(Bytes& bytes) {
    // All bytes that a query may read as a header, including those before the tag of a Heap. They
    // are 0 except for the last 8 bytes before the pointer.
    constexpr std::size_t farthest = 2 * 65600;
    constexpr std::size_t most = 8;
    static std::array<std::uint8_t, farthest + most> arena;
    std::uint8_t* const data = arena.data() + farthest + bytes.Below(most);
    std::memset(data - 2 * most, 0, 2 * most);
    std::uint32_t header = 0;
    switch (bytes.Below(4)) {
        case 0:
            header = heapRecordHeader;
            break;
        case 1:
            header = 0x00010000 + bytes.Short();  // A used record's.
            break;
        case 2:
            header = 0xA55A0000 + bytes.Short();  // A moved block's.
            break;
        default:
            header = bytes.Word();
    }
    const std::uint32_t length = bytes.Word();
    std::memcpy(data - 4, &header, sizeof header);
    std::memcpy(data - 8, &length, sizeof length);
    return {data, header == heapRecordHeader, length};
}

bool HasHeapRecordHeader(const std::uint8_t* data) {
    return std::memcmp(data - 4, &heapRecordHeader, 4) == 0;
}

Sizes Sizes::InForce() {
    return {NUV_OBR_MEMPOOL_BUCKET_SIZE(), NUV_OBR_MEMPOOL_DATA_ALIGNMENT(),
            NUV_OBR_MEMPOOL_MAX_RECORD_SIZE(), NUV_OBR_MEMPOOL_MIN_RECORD_SIZE()};
}

bool Sizes::CanMakePool() const {
    const std::uint64_t multiple = std::max<std::uint64_t>(alignment, 1);
    const auto roundUp = [multiple](std::uint64_t value) {
        const std::uint64_t steps = (std::max<std::uint64_t>(value, 1) + multiple - 1) / multiple;
        return static_cast<std::uint32_t>(steps * multiple);
    };
    std::uint32_t maximum = roundUp(largest);
    if (maximum > largest) { maximum -= static_cast<std::uint32_t>(multiple); }
    return maximum + std::uint64_t{4} <= std::clamp<std::uint32_t>(bucket, 4, 65535) &&
           roundUp(smallest) <= maximum;
}

std::uint8_t FillByte(Bytes& bytes) {
    // Four bytes with either of these values would look like the header of a record or of a Heap's
    // block in a query about the middle of a block.
    const std::uint8_t fill = bytes.Byte();
    return fill == 0x01 || fill == 0x5A ? std::uint8_t{0xF1} : fill;
}

}  // namespace Fuzz
