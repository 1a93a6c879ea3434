// Operations of a host on the blocks of a Mgr, including errors that the library answers.

#include <gtest/gtest.h>

#include "../PoolFixture.hpp"
#include "World.hpp"

namespace Fuzz {

using namespace OBR::MemPool;

void World::StepOf(Handle& handle) {
    if (handle.mgr == nullptr) { return Build(handle); }
    const std::uint32_t choice = bytes.Byte();
    if (choice >= 250 || handle.account == nullptr) { return Destroy(handle); }
    Account& account = *handle.account;
    if (choice < 100) {
        Alloc(handle);
    } else if (choice < 190) {
        Free(handle);
    } else if (choice < 220) {
        AskAboutOthers(handle);
    } else if (choice < 235) {
        ReportOn(*handle.mgr, account);
    } else {
        account.ExpectAllFilled();
        handle.mgr->Clear();
        if (account.pool->enabled) { account.live.clear(); }
        EXPECT_FALSE(handle.mgr->CollectGarbage());
    }
    account.Check(false);
}

void World::Alloc(Handle& handle) {
    if (!HasRoom()) { return; }
    Account& account = *handle.account;
    constexpr std::uint32_t largestSize = 0x3FFFFFFF;
    std::uint32_t size = Size(account);
    void* data = nullptr;
    if (bytes.Byte() == 0xFF) {  // More than the memory of the process.
        HeapSpy::refuseIn = 1;
        EXPECT_THROW(handle.mgr->Alloc(largestSize - size), std::bad_alloc);
        return;
    }
    if (!Succeeds([&] { data = handle.mgr->Alloc(size); })) { return; }
    const std::size_t usable = account.pool->enabled ? handle.mgr->GetSize(data) : size;
    if (account.pool->enabled) { EXPECT_EQ(handle.mgr->Contains(data), usable != 0); }
    account.Add(static_cast<std::uint8_t*>(data),
                {size, 1, usable, FillByte(bytes), usable, std::max(size, 1U)});
}

void World::Free(Handle& handle) {
    Account& account = *handle.account;
    const auto one = OneBlock(account);
    if (one == account.live.end()) { return; }
    std::uint8_t* const data = one->first;
    const std::size_t usable = one->second.usable;
    account.ExpectFilled(one);
    if (!account.pool->enabled) {
        account.live.erase(one);
        EXPECT_TRUE(handle.mgr->Free(data));
        return;
    }
    const bool staysReadable = account.StaysReadable(data);
    // A heap record of no bytes waits for Clear.
    EXPECT_EQ(handle.mgr->Free(data), usable != 0);
    if (usable != 0) { account.live.erase(one); }
    if (staysReadable) {
        EXPECT_FALSE(handle.mgr->Free(data)) << "freed twice";
        EXPECT_FALSE(handle.mgr->Contains(data));
        EXPECT_EQ(handle.mgr->GetSize(data), 0);
    }
}

// Null, pointers that no pool handed out, blocks of other pools and the middles of blocks. A
// disabled pool frees all of them.
void World::AskAboutOthers(Handle& handle) {
    Mgr& mgr = *handle.mgr;
    const bool enabled = mgr.IsEnabled();
    EXPECT_FALSE(mgr.Contains(nullptr) || mgr.Free(nullptr));
    EXPECT_EQ(mgr.GetSize(nullptr), 0);

    const Foreign foreign = MakeForeign(bytes);
    const std::uint32_t length = foreign.looksLikeHeapRecord ? foreign.length : 0;
    EXPECT_EQ(mgr.Contains(foreign.data), length != 0);
    EXPECT_EQ(mgr.GetSize(foreign.data), length);
    if (length == 0 && enabled) { EXPECT_FALSE(mgr.Free(foreign.data)); }

    accounts.WithBlockOfOther(bytes, handle.account, [&](const Account& other, std::uint8_t* data) {
        const bool isHeapRecord = HasHeapRecordHeader(data);
        const std::uint32_t size = isHeapRecord ? other.pool->GetSize(data) : 0;
        EXPECT_EQ(mgr.Contains(data), size != 0);
        EXPECT_EQ(mgr.GetSize(data), size);
        if (enabled && !isHeapRecord) { EXPECT_FALSE(mgr.Free(data)); }

        // Four bytes of the block itself lie before these.
        const std::size_t usable = other.live.at(data).usable;
        if (usable < 4) { return; }
        std::uint8_t* const inside = data + 4 + bytes.Byte() % (usable - 3);
        EXPECT_FALSE(mgr.Contains(inside));
        EXPECT_EQ(mgr.GetSize(inside), 0);
        if (enabled) { EXPECT_FALSE(mgr.Free(inside)); }
    });
}

}  // namespace Fuzz
