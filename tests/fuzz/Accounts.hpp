// The expected state of the library: the living pools, their names and handles, and the blocks that
// each has handed out. Every block is filled with a byte of its own.

#ifndef OBR_TESTS_FUZZ_ACCOUNTS_HPP
#define OBR_TESTS_FUZZ_ACCOUNTS_HPP

#include <MemPoolHeap>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "../PoolFixture.hpp"
#include "Bytes.hpp"
#include "MemPool/BucketMgr.hpp"

namespace Fuzz {

using OBR::MemPool::Mgr;

struct Block {
    std::size_t size;       // Requested.
    std::size_t alignment;  // Of a block of a Heap, else 1.
    std::size_t usable;     // As the pool says. All of these bytes are filled.
    std::uint8_t fill;
    std::size_t capacity;  // What Realloc leaves in place: `usable`, or more in a heap that is off.
    std::size_t most;      // The most bytes that the pool may have been asked for.
};
using Live = std::map<std::uint8_t*, Block>;

struct Account {
    OBR::MemPool::BucketMgr* pool;
    std::string name;
    Mgr* builder;   // Null once it is destroyed.
    bool isOfHeap;  // Its blocks differ from the pool's.
    Live live = {};

    void Add(std::uint8_t* data, const Block& block);
    void ExpectFilled(Live::const_iterator block) const;
    void ExpectAllFilled() const;

    // Walks the pool: all its invariants hold, and it has these blocks and no others. Unless
    // `thoroughly`, a pool that takes long is left for later.
    void Check(bool thoroughly) const;

    // The block of the pool that the block at `data` of a Heap is the end of.
    const std::uint8_t* RecordOf(const std::uint8_t* data) const;

    // The pool of large buckets, null if the pool has none, and the blocks of both.
    const OBR::MemPool::BucketMgr* Large() const;
    OBR::MemPool::Blocks AllBlocks() const;

    // Whether the block at `data` lies in a bucket that stays once it is freed.
    bool StaysReadable(const void* data) const;
};

class Accounts {
public:
    // One for a pool that `builder` has built.
    Account& Open(Mgr& builder, bool isOfHeap);
    void Close(const Account& account);
    // A handle is destroyed: no pool names it any more.
    void Forget(const Mgr* handle);

    bool IsTaken(const char* name) const;
    std::size_t NumBlocks() const;
    const std::vector<std::unique_ptr<Account>>& All() const { return all; }

    // A block of any pool but one, as `visit(account, data)`, if there is one.
    void WithBlockOfOther(Bytes& bytes, const Account* not_of,
                          const std::function<void(const Account&, std::uint8_t*)>& visit) const;

    // Checks that the registry agrees. `hasPool` says whether a builder has a pool.
    void CheckRegistry(const std::function<bool(const Mgr*)>& hasPool) const;

private:
    std::vector<std::unique_ptr<Account>> all;
};

// A pointer that no pool handed out, to bytes that the input chooses. `isHeapRecord` says whether
// they look like the header of a heap record of `length` bytes.
struct Foreign {
    std::uint8_t* data;
    bool looksLikeHeapRecord;
    std::uint32_t length;
};
Foreign MakeForeign(Bytes& bytes);

// Whether the bytes before `data` look like the header of a heap record.
bool HasHeapRecordHeader(const std::uint8_t* data);

// The settings that the process has, and whether they can make a pool. Otherwise Mgr would end the
// process.
struct Sizes {
    std::uint32_t bucket, alignment, largest, smallest;

    static Sizes InForce();
    bool CanMakePool() const;
};

std::uint8_t FillByte(Bytes& bytes);

}  // namespace Fuzz

#endif
