// Finds pools that two threads use at the same time. An operation holds a lock of its pool. If it
// finds the lock held by another thread, that is the fault. Threads that take turns, through a lock
// of the host or a join, never meet here.
//
// Operations are short, so those of two threads rarely overlap. When a pool changes threads, the
// first operation of the new thread therefore waits a moment while it holds the lock, so that the
// former thread may run into it. The number of waits is limited, so that hosts whose threads take
// turns stay fast.

#include <pthread.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <unordered_map>
#include <utility>

#include "MemPool/BucketMgr.hpp"
#include "MemPool/Checked.hpp"
#include "diagnostics/checked/Checkers.hpp"
#include "diagnostics/checked/Fault.hpp"

namespace OBR::MemPool::Checked {

namespace {

constexpr int maxWaits = 100;
constexpr std::chrono::milliseconds wait(1);

struct Thread {
    pid_t id = 0;
    char name[16] = "main";  // As long as a name can be.

    std::string Text() const { return std::to_string(id) + " (" + name + ")"; }
};

}  // namespace

struct Use::Pool {
    std::recursive_mutex mutex;
    Thread user;  // The thread of the last operation; id 0 before the first.
    int waits = 0;
    bool isReported = false;
};

Use::Pool& Use::Of(const BucketMgr& pool) {
    static std::mutex mutex;
    static auto& pools = *new std::unordered_map<const BucketMgr*, Pool>;  // Never destroyed.
    const std::lock_guard<std::mutex> guard(mutex);
    return pools[&pool];
}

Use::Use(const BucketMgr& bucketMgr) : pool(Of(bucketMgr)), lock(pool.mutex, std::try_to_lock) {
    const bool isShared = !lock.owns_lock();
    if (isShared) { lock.lock(); }
    thread_local const pid_t id = gettid();  // A system call for each operation takes too long.
    Thread user{id};
    if (pool.user.id == user.id) { return; }

    if (user.id != getpid()) { pthread_getname_np(pthread_self(), user.name, sizeof user.name); }
    const Thread former = std::exchange(pool.user, user);
    if (former.id == 0 || pool.isReported) { return; }
    if (isShared) {
        pool.isReported = true;
        Report(bucketMgr,
               "used by two threads at the same time: " + former.Text() + " and " + user.Text());
        Checkers::PrintStack();
    } else if (pool.waits < maxWaits) {
        ++pool.waits;
        std::this_thread::sleep_for(wait);
    }
}

void Use::IsLast() const {
    pool.user.id = 0;
    pool.waits = 0;
    pool.isReported = false;
}

}  // namespace OBR::MemPool::Checked
