// Operations of a host on a Heap and its blocks, through the calls for C, for C++ and for
// containers.

#include <MemPoolHeap>

#include <algorithm>
#include <cstring>
#include <stdexcept>

#include <gtest/gtest.h>

#include "../PoolFixture.hpp"
#include "World.hpp"

namespace Fuzz {

using namespace OBR::MemPool;

namespace {

// The most bytes that a heap requests from its pool for a block.
std::size_t MostFor(std::size_t size, std::size_t alignment) {
    const std::size_t least = std::max<std::size_t>(size, 1);
    return alignment < 8 ? least : (least + 7) / 8 * 8 + alignment - 4;
}

// What an address is aligned to, up to what a heap can be asked for.
std::size_t AlignmentAt(const void* address) {
    const auto bits = reinterpret_cast<std::uintptr_t>(address) | 4096;
    return bits & (0 - bits);
}

// In a disabled heap, the bytes after a block that its alignment leaves count too.
std::size_t CapacityOf(const Heap& heap, const void* block) {
    return heap.GetMgr().IsEnabled() ? heap.UsableSize(block)
                                     : detail::PlainHeader::Of(block)->Capacity();
}

}  // namespace

void World::StepOf(HeapPlace& place) {
    if (place.heap == nullptr) { return Build(place); }
    const std::uint32_t choice = bytes.Byte();
    if (choice >= 250) { return Destroy(place); }
    Account& account = *place.account;
    if (choice < 90) {
        Take(place);
    } else if (choice < 130) {
        Resize(place);
    } else if (choice < 190) {
        GiveBack(place);
    } else if (choice < 220) {
        RefuseForeign(place);
    } else if (choice < 235) {
        ReportOn(place.heap->GetMgr(), account);
        CheckStats(place);
    } else {
        account.ExpectAllFilled();
        place.heap->FreeAll();
        account.live.clear();
    }
    account.Check(false);
}

// With its own settings or those of the process. Settings that no pool can have are refused.
void World::Build(HeapPlace& place) {
    const char* const name = Name();
    const std::uint8_t said = bytes.Byte();
    HeapSettings settings;
    Sizes sizes = Sizes::InForce();
    const auto say = [&](std::uint32_t bit, HeapSettings& (HeapSettings::*word)(std::size_t),
                         std::uint32_t& size) {
        if ((said >> bit & 1) == 0) { return; }
        size = bytes.Short();
        (settings.*word)(size);
    };
    say(0, &HeapSettings::BucketSize, sizes.bucket);
    say(1, &HeapSettings::MaxRecordSize, sizes.largest);
    say(2, &HeapSettings::MinRecordSize, sizes.smallest);
    say(3, &HeapSettings::DataAlignment, sizes.alignment);
    const bool isOn = (said & 16) != 0 || NUV_OBR_MEMPOOL_ON();
    settings.On(isOn);
    if ((said & 32) != 0) { settings.KeepEmptyBuckets((said & 64) != 0); }
    place.alignment = (said & 128) != 0 ? std::size_t{1} << bytes.Below(14) : 8;
    settings.Alignment(place.alignment);
    obr_heap_settings inC = {};
    inC.struct_size = sizeof inC;
    inC.pools = isOn ? OBR_HEAP_ON : OBR_HEAP_OFF;
    if ((said & 32) != 0) {
        inC.keep_empty_buckets = (said & 64) != 0 ? OBR_HEAP_ON : OBR_HEAP_OFF;
    }
    inC.bucket_size = (said & 1) != 0 ? sizes.bucket : 0;
    inC.max_record_size = sizes.largest;
    inC.min_record_size = sizes.smallest;
    inC.data_alignment = sizes.alignment;
    inC.alignment = place.alignment;
    const bool isSameInC = sizes.bucket * sizes.largest * sizes.smallest * sizes.alignment != 0;

    const bool isWrong = sizes.alignment > 65532 || place.alignment < 8 || place.alignment > 4096;
    sizes.alignment = std::max((sizes.alignment + 3) / 4 * 4, 4u);
    // A name whose pool has lost its handle is not seen, and would end the process.
    if (accounts.IsTaken(name) && GetMgr(name) == nullptr) { return; }
    bool isRefused = false;
    const bool succeeds = Succeeds([&] {
        if (isSameInC && bytes.Byte() % 2 == 0) {
            place.owner.reset(obr_heap_new(name, &inC));
            if (place.owner == nullptr && HeapSpy::refuseIn == 0) { throw std::bad_alloc(); }
            isRefused = place.owner == nullptr;
            return;
        }
        try {
            place.owner.reset(new obr_heap{Heap(name, settings)});
        } catch (const std::invalid_argument&) { isRefused = true; }
    });
    if (!succeeds) { return; }
    EXPECT_EQ(isRefused, isWrong || !sizes.CanMakePool() || accounts.IsTaken(name));
    if (isRefused) { return; }
    place.heap = &place.owner->heap;
    const bool hasSecond = (said & 1) == 0 && sizes.bucket == PoolSettings().bucketSize;
    place.canFail = !hasSecond && sizes.bucket < detail::largeBucketSize;
    place.account = &accounts.Open(place.heap->GetMgr(), true);
    const BucketMgr& pool = *place.account->pool;
    EXPECT_EQ(pool.enabled, isOn);
    EXPECT_EQ(pool.bucketSize, std::min(sizes.bucket, 65535u));
    EXPECT_EQ(pool.dataAlignment, sizes.alignment);
    EXPECT_EQ(pool.keepEmptyBuckets,
              (said & 32) != 0 ? (said & 64) != 0 : NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS());
}

void World::Destroy(HeapPlace& place) {
    place.account->ExpectAllFilled();
    place.account->Check(true);
    CheckStats(place);
    accounts.Close(*place.account);
    place.account = nullptr;
    place.heap = nullptr;
    place.owner.reset();
}

void World::Take(HeapPlace& place) {
    if (!HasRoom()) { return; }
    Heap& heap = *place.heap;
    std::size_t size = Size(*place.account);
    const std::uint32_t way = bytes.Below(12);
    std::size_t alignment = way == 5 ? 8 : place.alignment;
    if (way == 1 || way == 2 || way == 4 || way == 11) {
        alignment = std::size_t{1} << bytes.Below(14);
    }
    const bool isZero = way == 3 || way == 10;
    if (isZero) { size = size / 3 * 3; }
    if (way == 5) { size = size / sizeof(std::uint64_t) * sizeof(std::uint64_t); }
    std::uint8_t* data = nullptr;
    const auto take = [&] {
        void* taken = nullptr;
        switch (way) {
            case 1:
                taken = heap.Allocate(size, alignment);
                break;
            case 2:
                taken = Resource(heap).allocate(size, alignment);
                break;
            case 3:
                taken = heap.Calloc(3, size / 3);
                break;
            case 4:
                taken = heap.Malloc(size, alignment);
                break;
            case 6:
                taken = heap.Realloc(nullptr, size);
                break;
            case 7:
                taken = heap.Call(nullptr, 0, std::max<std::size_t>(size, 1));
                break;
            case 5:
                taken = Allocator<std::uint64_t>(heap).allocate(size / sizeof(std::uint64_t));
                break;
            case 8:
                taken = obr_heap_malloc(place.owner.get(), size);
                break;
            case 9:
                taken =
                    obr_heap_call(place.owner.get(), nullptr, 0, std::max<std::size_t>(size, 1));
                break;
            case 10:
                taken = obr_heap_calloc(place.owner.get(), 3, size / 3);
                break;
            case 11:
                taken = obr_heap_aligned_alloc(place.owner.get(), alignment, size);
                break;
            default:
                taken = heap.Malloc(size);
        }
        if (taken == nullptr) { throw std::bad_alloc(); }
        data = static_cast<std::uint8_t*>(taken);
    };
    if (alignment > 4096) {
        EXPECT_THROW(take(), std::bad_alloc);
        return;
    }
    if (!Succeeds(take, place.canFail)) { return; }
    if (isZero) { EXPECT_EQ(std::count(data, data + size, 0), static_cast<long>(size)); }
    const std::size_t usable = obr_heap_usable_size(place.owner.get(), data);
    if (!place.account->pool->enabled) { EXPECT_EQ(usable, std::max<std::size_t>(size, 1)); }
    place.account->Add(data, {size, alignment, usable, FillByte(bytes), CapacityOf(heap, data),
                              MostFor(size, alignment)});
}

// A block stays in place if it has room and does not shrink to less than half. It keeps bytes and
// alignment in any case, and fewer bytes are always granted.
void World::Resize(HeapPlace& place) {
    Account& account = *place.account;
    const auto one = OneBlock(account);
    if (one == account.live.end()) { return; }
    std::uint8_t* const data = one->first;
    Block block = one->second;
    const std::size_t size = std::max(Size(account), 1u);
    const bool enabled = account.pool->enabled;
    const bool grows = size > block.capacity;
    const std::size_t before = enabled ? block.capacity : block.usable;
    const bool isMuchLess = (size < before / 2 || size < block.capacity / 8) && block.capacity > 64;
    const std::size_t quarters = size - block.capacity > block.capacity / 4 * 3 ? 0
                                 : block.capacity < 1024                        ? 1
                                                                                : 3;
    const std::size_t withRoom = block.capacity + block.capacity / 4 * quarters;
    std::uint8_t* moved = nullptr;
    bool isRefused = false;
    account.ExpectFilled(one);
    Succeeds(
        [&] {
            moved = static_cast<std::uint8_t*>(
                size % 2 == 0 ? place.heap->Call(data, block.size, size)
                              : obr_heap_call(place.owner.get(), data, block.size, size));
            isRefused = HeapSpy::refuseIn == 0;
            if (isRefused) { throw std::bad_alloc(); }
        },
        place.canFail);
    if (moved == nullptr) {
        EXPECT_TRUE(isRefused && grows);
        return account.ExpectFilled(one);
    }
    const std::size_t kept = std::min(size, block.usable);
    EXPECT_EQ(std::count(moved, moved + kept, block.fill), static_cast<long>(kept));
    EXPECT_EQ(moved == data, !grows && (!isMuchLess || isRefused));
    if (moved != data) {
        const bool getsRoom = grows && !isRefused && withRoom > size;
        block.capacity = getsRoom ? withRoom : size;
        block.most = MostFor(block.capacity, std::max<std::size_t>(AlignmentAt(data), 8));
    }
    block.size = size;
    block.usable = place.heap->UsableSize(moved);
    const std::size_t capacity = CapacityOf(*place.heap, moved);
    EXPECT_GE(capacity, block.capacity);
    block.capacity = capacity;
    if (!enabled) { EXPECT_EQ(block.usable, size); }
    account.live.erase(one);
    account.Add(moved, block);
}

void World::GiveBack(HeapPlace& place) {
    Account& account = *place.account;
    Heap& heap = *place.heap;
    const auto one = OneBlock(account);
    if (one == account.live.end()) { return; }
    const auto [data, block] = *one;
    account.ExpectFilled(one);
    account.live.erase(one);
    const bool staysReadable =
        account.pool->enabled && account.StaysReadable(account.RecordOf(data));
    switch (bytes.Below(6)) {
        case 0:
            heap.Deallocate(data, block.size, block.alignment);
            break;
        case 1:
            Resource(heap).deallocate(data, block.size, block.alignment);
            break;
        case 2:
            EXPECT_EQ(heap.Realloc(data, 0), nullptr);
            break;
        case 3:
            EXPECT_TRUE(obr_heap_free(place.owner.get(), data));
            break;
        case 4:
            EXPECT_EQ(obr_heap_call(place.owner.get(), data, block.size, 0), nullptr);
            break;
        default:
            EXPECT_TRUE(heap.Free(data));
    }
    if (!staysReadable) { return; }
    EXPECT_FALSE(heap.Free(data)) << "freed twice";
    EXPECT_EQ(heap.UsableSize(data), 0);
    EXPECT_EQ(heap.Realloc(data, block.size + 1), nullptr);
}

void World::RefuseForeign(HeapPlace& place) {
    Heap& heap = *place.heap;
    const bool enabled = place.account->pool->enabled;
    const std::size_t tooLarge = Heap::MaxSize() + 1 + bytes.Short();
    const std::size_t noAlignment = bytes.Short() | 3;
    EXPECT_EQ(heap.Malloc(tooLarge), nullptr);
    EXPECT_EQ(heap.Calloc(tooLarge, tooLarge), nullptr);
    EXPECT_THROW(heap.Allocate(1, noAlignment), std::bad_alloc);
    EXPECT_FALSE(heap.Free(nullptr));
    EXPECT_EQ(heap.UsableSize(nullptr), 0);
    heap.Deallocate(nullptr, 1);

    const auto refuse = [&](void* data, std::uint32_t length) {
        EXPECT_EQ(heap.UsableSize(data), enabled ? length : 0);
        if (enabled && length != 0) { return; }  // Taken for a heap record, and freed as one.
        EXPECT_FALSE(heap.Free(data));
        EXPECT_EQ(heap.Realloc(data, 1 + bytes.Byte()), nullptr);
        EXPECT_EQ(heap.Realloc(data, 0), nullptr);
    };
    const Foreign foreign = MakeForeign(bytes);
    refuse(foreign.data, foreign.looksLikeHeapRecord ? foreign.length : 0);

    accounts.WithBlockOfOther(bytes, place.account, [&](const Account& other, std::uint8_t* data) {
        const std::size_t usable = other.live.at(data).usable;
        if (usable >= 4) { refuse(data + 4 + bytes.Byte() % (usable - 3), 0); }
        // A heap record of another pool looks like one of this pool.
        const bool isHeapRecord = other.pool->enabled && HasHeapRecordHeader(other.RecordOf(data));
        if (!isHeapRecord) { refuse(data, 0); }
    });
}

void World::CheckStats(const HeapPlace& place) const {
    const HeapStats stats = place.heap->GetStats();
    const Account& account = *place.account;
    EXPECT_EQ(stats.usedRecords + stats.heapRecords, account.live.size());
    const BucketMgr* const large = account.Large();
    EXPECT_EQ(stats.buckets,
              account.pool->GetNumBuckets() + (large == nullptr ? 0 : large->GetNumBuckets()));
    std::size_t bytesUsed = 0;
    if (account.pool->enabled) {
        for (const auto& [data, size] : account.AllBlocks()) { bytesUsed += size; }
    } else {
        for (const auto& [data, block] : account.live) { bytesUsed += block.usable; }
    }
    EXPECT_EQ(stats.bytesUsed, bytesUsed);
    obr_heap_statistics inC = {};
    inC.struct_size = sizeof inC;
    EXPECT_TRUE(obr_heap_stats(place.owner.get(), &inC));
    EXPECT_EQ(std::memcmp(&inC.buckets, &stats, sizeof stats), 0);
    EXPECT_GE(stats.bytesHeld, stats.bytesUsed);
}

}  // namespace Fuzz
