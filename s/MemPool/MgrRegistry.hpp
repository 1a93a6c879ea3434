// The pools of the process by name, and the handles that were assigned to.

#ifndef OBR_MEMPOOL_MGRREGISTRY_HPP
#define OBR_MEMPOOL_MGRREGISTRY_HPP

#include <map>
#include <string>
#include <vector>

#include <MemPool>

#include "MemPool/BucketMgr.hpp"

namespace OBR::MemPool {

// Invariants: one entry per living pool, under the pool's own name; a pool's `mgr` is the living
// handle that built it, or null. The entries own neither pools nor handles.
//
// The host may destroy a handle after the library's exit step. The one object of this class is
// therefore never destroyed: after that step it is an empty registry.
class MgrRegistry {
public:
    using Pools = std::map<std::string, BucketMgr*>;

    MgrRegistry() : pools(), sharers() {}
    MgrRegistry(const MgrRegistry&) = delete;
    MgrRegistry& operator=(const MgrRegistry&) = delete;
    ~MgrRegistry() {}

    const Pools& All() const { return pools; }
    BucketMgr* Find(const std::string& name) const;
    void Add(const std::string& name, BucketMgr* pool) { pools.emplace(name, pool); }
    void Erase(const std::string& name) { pools.erase(name); }
    void ReleaseNodes() { pools.clear(); }

    // The living handle that built `pool`, if that handle has a living pool, else null.
    static Mgr* HandleOf(const BucketMgr* pool);

    // Calls visit(handle) for each pool that still has its handle, in the order of the names.
    template <typename Visit>
    void ForEachHandle(Visit visit) const {
        for (const auto& entry : pools) {
            if (Mgr* const handle = HandleOf(entry.second)) { visit(handle); }
        }
    }

    // Sharers are the living handles that were once assigned to. Only they can share a pool with
    // the handle that built it, and only they can have left a pool that they built.
    const std::vector<Mgr*>& Sharers() const { return sharers; }
    void AddSharer(Mgr* handle);

    // For a handle that is being destroyed: makes no pool refer to it any more.
    void ForgetHandle(Mgr* handle);

private:
    // Members of a union are not destroyed automatically.
    union {
        Pools pools;
    };
    union {
        std::vector<Mgr*> sharers;
    };
};

// Constructed before any code of the host can run.
extern MgrRegistry registry;

}  // namespace OBR::MemPool

#endif
