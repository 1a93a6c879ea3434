// The pools of the process by name, and the handles that assignments have made.

#ifndef OBR_MEMPOOL_MGRREGISTRY_HPP
#define OBR_MEMPOOL_MGRREGISTRY_HPP

#include <map>
#include <string>
#include <vector>

#include <MemPool>

#include "MemPool/BucketMgr.hpp"

namespace OBR::MemPool {

// Invariants: one entry per living pool, under the pool's own name; a pool's `mgr` is the living
// handle that made it, or null. The entries own no pool and no handle.
//
// A handle of the host's may be destroyed after the library's exit step. The one object of this
// class is therefore never destroyed: from that step on it is an empty registry.
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

    // The living handle that made `pool`, if there is a living pool behind it, else null.
    static Mgr* HandleOf(const BucketMgr* pool);

    // The handles of all pools, but of those that have lost theirs, in the order of the pools'
    // names: visit(handle).
    template <typename Visit>
    void ForEachHandle(Visit visit) const {
        for (const auto& entry : pools) {
            if (Mgr* const handle = HandleOf(entry.second)) { visit(handle); }
        }
    }

    // Sharers are the living handles that have been the left-hand side of an assignment. Only they
    // can share a pool with its maker, and only they can be the maker of a pool they have left.
    const std::vector<Mgr*>& Sharers() const { return sharers; }
    void AddSharer(Mgr* handle);

    // For a handle that is being destroyed: no pool names it as its maker from now on.
    void ForgetHandle(Mgr* handle);

private:
    // Members of a union are not destroyed by themselves.
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
