// Turns slots into events. Each group of the recording becomes a pool of the trace, whose address
// is just a number.

#include "record/Collector.hpp"

#include <linux/futex.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <cstring>

#include "trace/CutText.hpp"
#include "trace/PassingOn.hpp"

namespace Recorder {

namespace {

constexpr std::uint64_t lapMask = std::uint64_t{0xF} << lapShift;

Op OpOf(std::uint64_t what) {
    return static_cast<Op>(what >> opShift & 0xF);
}
std::uint64_t SizeOf(std::uint64_t what) {
    return what & maxSize;
}
std::uint64_t AddressOf(std::uint64_t where) {
    return where >> addressShift;
}

}  // namespace

Collector::Collector(Channel& fromChannel, Trace::CompactWriter& toWriter, bool ofPools)
    : channel(fromChannel), writer(toWriter), isOfPools(ofPools), knownPools(numStacks + 1) {
    if (!isOfPools) { writer.WriteOwned(); }
}

bool Collector::Drain(bool atEnd) {
    constexpr std::uint64_t most = 1U << 14;
    const std::uint64_t first = channel.tail.load(std::memory_order_relaxed);
    const std::uint64_t last = std::min(channel.head.load(std::memory_order_acquire), first + most);
    std::uint64_t index = first;
    if (first < last) { WriteTime(); }
    for (; index < last; ++index) {
        const Slot& slot = channel.slots[index % numSlots];
        const std::uint64_t what = slot.what.load(std::memory_order_acquire);
        if ((what & lapMask) == Lap(index)) {
            Write(index, slot.where.load(std::memory_order_relaxed), what);
        } else if (!atEnd) {
            break;
        }
    }
    if (index == first) { return false; }
    channel.tail.store(index, std::memory_order_release);
    channel.tailFutex.store(static_cast<std::uint32_t>(index));
    if (channel.numWaiting.load() != 0) {
        syscall(SYS_futex, &channel.tailFutex, FUTEX_WAKE, INT_MAX, nullptr, nullptr, 0);
    }
    return true;
}

// The channel is drained so often that the time of draining is that of the events.
void Collector::WriteTime() {
    using std::chrono::milliseconds;
    constexpr milliseconds interval{10};
    const auto now =
        std::chrono::duration_cast<milliseconds>(std::chrono::steady_clock::now() - start);
    if (now < nextTime) { return; }
    nextTime = now + interval;
    writer.Write({Trace::Kind::Time, 0, 0, static_cast<std::uint64_t>(now.count()), {}, {}});
}

void Collector::Write(std::uint64_t& index, std::uint64_t where, std::uint64_t what) {
    const std::uint64_t thread = where & maxThread;
    if (thread != lastThread) {
        writer.WriteThread(thread);
        lastThread = thread;
    }
    ++numEvents;
    if (OpOf(what) == Op::Released) { return writer.WriteReleased(AddressOf(where)); }
    if (OpOf(what) != Op::Allocated) { return WritePoolEvent(index, AddressOf(where), what); }
    const std::uint64_t pool = PoolOf(what >> groupShift & maxGroup, thread);
    writer.Write({Trace::Kind::Allocated, pool, AddressOf(where), SizeOf(what), {}, {}});
}

// Writes an event of a pool. Its Data slots follow it and were filled before it.
void Collector::WritePoolEvent(std::uint64_t& index, std::uint64_t pool, std::uint64_t what) {
    switch (OpOf(what)) {
        case Op::PoolCreated:
            pools.insert(pool);
            return writer.Write({Trace::Kind::Created, pool, 0, 0, {}, {}});
        case Op::PoolDestroyed:
            pools.erase(pool);
            return writer.Write({Trace::Kind::Destroyed, pool, 0, 0, {}, {}});
        case Op::PoolCleared:
            return writer.Write({Trace::Kind::Cleared, pool, 0, 0, {}, {}});
        case Op::PoolNamed: {
            std::string name(SizeOf(what), '\0');
            for (std::size_t place = 0; place < name.size(); place += sizeof(std::uint64_t)) {
                const std::uint64_t part = NextData(index).where;
                std::memcpy(name.data() + place, &part,
                            std::min(sizeof(part), name.size() - place));
            }
            return writer.Write({Trace::Kind::Named, pool, 0, 0, {}, name});
        }
        case Op::PoolAllocated: {
            const Slot& data = NextData(index);
            return writer.Write(
                {Trace::Kind::Allocated, pool, AddressOf(data.where), SizeOf(data.what), {}, {}});
        }
        case Op::PoolFreed:
            return writer.Write(
                {Trace::Kind::Freed, pool, AddressOf(NextData(index).where), 0, {}, {}});
        case Op::Executed:
            return EndPools();
        case Op::Allocated:
        case Op::Released:
        case Op::Data:
            break;
    }
}

// The memory of a program is gone when another one replaces it.
void Collector::EndPools() {
    for (const std::uint64_t pool : pools) {
        writer.Write({Trace::Kind::Destroyed, pool, 0, 0, {}, {}});
        if (!isOfPools) { knownPools[pool] = false; }
    }
    pools.clear();
    symbols = {};
    callerNames.clear();
    if (!isOfPools) { writer.WriteOwned(); }
}

const Slot& Collector::NextData(std::uint64_t& index) const {
    return channel.slots[++index % numSlots];
}

std::uint64_t Collector::NumberOfPool(std::uint64_t group, std::uint64_t thread) const {
    switch (channel.by) {
        case By::Caller:
        case By::Stack:
            return group + 1;
        case By::Module:
            return channel.callers[group].module + 1;
        case By::Thread:
            return thread;
        case By::All:
            break;
    }
    return 1;
}

// The pool of the trace, created at its first block.
std::uint64_t Collector::PoolOf(std::uint64_t group, std::uint64_t thread) {
    const std::uint64_t pool = NumberOfPool(group, thread);
    if (!knownPools[pool]) {
        knownPools[pool] = true;
        pools.insert(pool);
        writer.Write({Trace::Kind::Created, pool, 0, 0, {}, {}});
        const std::string name = NameOfPool(group, pool);
        writer.Write({Trace::Kind::Named, pool, 0, 0, {}, name});
        if (channel.by == By::Caller) { PassOver(channel.callers[group]); }
    }
    return pool;
}

// The recorder in the program knows exported names only. From now on it walks past this function,
// if it only passes memory on.
void Collector::PassOver(Caller& caller) {
    std::uint32_t state = Caller::Final;
    const char* const symbol = symbols.Symbol(channel.modules[caller.module], caller.address);
    if (caller.frameSize != 0 && Trace::PassesOn(symbol)) {
        caller.state.compare_exchange_strong(state, Caller::Passed);
    }
}

const std::string& Collector::NameOfCaller(std::uint64_t number) {
    const auto [place, isNew] = callerNames.try_emplace(number, "other callers");
    if (isNew && number != maxCaller) {
        constexpr std::size_t longest = 1000;  // So that the names of a stack fit into a text.
        const Caller& caller = channel.callers[number];
        std::string& name = place->second;
        name = Trace::CutText(
            symbols.Name(channel.modules[caller.module], caller.address, caller.function), longest);
        std::replace(name.begin(), name.end(), ';', ',');
    }
    return place->second;
}

std::string Collector::NameOfPool(std::uint64_t group, std::uint64_t pool) {
    switch (channel.by) {
        case By::Caller:
            return NameOfCaller(group);
        case By::Module: {
            const std::uint32_t module = channel.callers[group].module;
            return module == 0 ? "no module" : NameOf(channel.modules[module]);
        }
        case By::Stack: {
            // The outermost first, as tools that draw stacks take them.
            const Stack& stack = channel.stacks[group];
            std::string name = group == maxGroup ? "other stacks" : "";
            for (std::uint32_t index = stack.number.load(); index-- != 0;) {
                name += (name.empty() ? "" : ";") +
                        NameOfCaller(channel.frames[stack.first.load() + index]);
            }
            return name;
        }
        case By::Thread:
            return "thread " + std::to_string(pool);
        case By::All:
            break;
    }
    return "heap";
}

}  // namespace Recorder
