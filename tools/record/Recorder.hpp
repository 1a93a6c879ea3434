// The recorder in the program: whether it records, and how an event gets into the channel. It
// allocates nothing from the program's heap.

#ifndef OBR_TOOLS_RECORD_RECORDER_HPP
#define OBR_TOOLS_RECORD_RECORDER_HPP

#include <atomic>
#include <cstdint>

#include "record/Channel.hpp"
#include "record/Ticks.hpp"

#define RECORDER_API extern "C" __attribute__((visibility("default")))

namespace Recorder {

// On a page of its own, which the kernel clears in a child, so that no child fills the channel of
// its parent, however it is created.
struct Active {
    std::atomic<Channel*> channel;
    std::atomic<bool> isSearched;
};
inline Active inactive = {};
inline Active* active = &inactive;

// Kept in a child: the path of the program's channel, and the last channel that this process or
// its parent has filled.
inline char channelPath[64] = "";
inline Channel* known = nullptr;

struct ThreadState {
    std::uint32_t number;     // From 1 on, in the order of their first events; 0 before that.
    std::uint32_t countdown;  // Calls until one is timed.
    std::uint32_t random;
    bool isWarm;  // The last call was timed to warm the caches; the next one counts.
};
// In the static thread-local memory, so that its first use allocates nothing.
inline thread_local ThreadState threadState __attribute__((tls_model("initial-exec"))) = {};

// The channel, or null while nothing is recorded.
inline Channel* ActiveChannel() {
    return active->channel.load(std::memory_order_relaxed);
}

// Finds the channel, once the environment can be read.
void Attach();

// The channel of a program that is recorded, or null.
inline Channel* OpenChannel() {
    if (__builtin_expect(ActiveChannel() == nullptr, 0)) { Attach(); }
    return ActiveChannel();
}

// Slow paths.
void NumberThread(Channel& channel);
bool WaitForRoom(Channel& channel, std::uint64_t index);

inline std::uint64_t ThreadNumber(Channel& channel) {
    if (__builtin_expect(threadState.number == 0, 0)) { NumberThread(channel); }
    return threadState.number;
}

inline void Fill(Channel& channel, std::uint64_t index, std::uint64_t where, std::uint64_t what) {
    Slot& slot = channel.slots[index % numSlots];
    slot.where.store(where, std::memory_order_relaxed);
    slot.what.store(what | Lap(index), std::memory_order_release);
}

// Takes `number` consecutive slots and sets `index` to that of the first. False if recording has
// ended.
inline bool Take(Channel& channel, std::uint64_t number, std::uint64_t& index) {
    index = channel.head.fetch_add(number, std::memory_order_acq_rel);
    const std::uint64_t last = index + number - 1;
    const bool hasRoom = last - channel.tail.load(std::memory_order_acquire) < numSlots;
    return __builtin_expect(hasRoom, 1) || WaitForRoom(channel, last);
}

inline std::uint64_t Where(Channel& channel, const void* address) {
    return reinterpret_cast<std::uint64_t>(address) << addressShift | ThreadNumber(channel);
}
inline std::uint64_t What(Op op, std::uint64_t size, std::uint64_t group) {
    return (size < maxSize ? size : maxSize) | group << groupShift |
           static_cast<std::uint64_t>(op) << opShift;
}

inline void Put(Channel& channel, Op op, const void* block, std::uint64_t size,
                std::uint64_t group) {
    std::uint64_t index = 0;
    if (Take(channel, 1, index)) {
        Fill(channel, index, Where(channel, block), What(op, size, group));
    }
}

// Whether this call for a small block is timed. Two calls in a row are timed, and the second one
// counts: the first warms the cache for the timing code, which rarely runs.
inline bool IsSampled() {
    if (__builtin_expect(threadState.countdown != 0, 1)) {
        --threadState.countdown;
        return false;
    }
    return true;
}

// Times the allocator's part of a call, and the recorder's if that looks for callers. Otherwise the
// recorder's part overlaps with the program's code, and costs a fraction of what a clock would
// show.
class Sample {
public:
    Sample(Channel& toChannel, bool ofLarge) : channel(toChannel), isLarge(ofLarge) {}
    Sample(const Sample&) = delete;
    Sample& operator=(const Sample&) = delete;
    ~Sample() { End(); }

    // The program's own loads, for which the end of the call would wait, are done.
    void EnterAllocator() { entered = TicksWhenDone(); }
    void LeaveAllocator() {
        left = TicksWhenDone();
        inside = left - entered;
    }
    void EndWalk() { walk = TicksWhenDone() - left; }

private:
    void End();

    Channel& channel;
    const bool isLarge;
    std::uint64_t entered = 0;
    std::uint64_t left = 0;
    std::uint64_t inside = 0;
    std::uint64_t walk = 0;  // 0 if there was none.
};

}  // namespace Recorder

#endif
