// The memory that a recorded program shares with `mempool record`, which drains it while the
// program runs. The program's threads fill *slots* of a ring without a lock: a thread takes the
// next number, which is the slot's place in the order of all slots, and fills the slot. A signal
// handler may therefore interrupt another event at any point, and no thread waits for another one,
// only for room in the ring.

#ifndef OBR_TOOLS_RECORD_CHANNEL_HPP
#define OBR_TOOLS_RECORD_CHANNEL_HPP

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace Recorder {

// Holds the path of the program's channel, for the recorder in the program and in its children.
constexpr const char* channelVariable = "MEMPOOL_RECORD_CHANNEL";

// From Caller on, a block's group is found on the stack.
enum class By : std::uint32_t { All, Thread, Caller, Module, Stack };

enum class Op : std::uint8_t {
    Allocated,  // Block, size, group.
    Released,   // Block.
    PoolCreated,
    PoolDestroyed,
    PoolCleared,
    PoolAllocated,  // Pool; a Data slot with the block and the size follows.
    PoolFreed,      // Pool; a Data slot follows too.
    PoolNamed,      // Pool, size of the name; Data slots with 8 bytes each follow.
    Data,           // Only as a part of another event.
    Executed,       // Another program has replaced this one.
};

// `where` has the thread's number in the low 16 bits, and above it the address. `what` holds, from
// the low bits on, the size, the group, the op and the lap.
struct Slot {
    std::atomic<std::uint64_t> where;
    std::atomic<std::uint64_t> what;  // Stored last. Its lap shows that the slot is filled.
};
constexpr unsigned int addressShift = 16;
constexpr std::uint64_t maxThread = 0xFFFF;  // The number of all later threads.
constexpr unsigned int sizeBits = 36;
constexpr std::uint64_t maxSize =
    (std::uint64_t{1} << sizeBits) - 1;  // Stands for larger ones too.
constexpr unsigned int groupShift = sizeBits;
constexpr std::uint64_t maxGroup = 0xFFFFF;
constexpr unsigned int opShift = 56;
constexpr unsigned int lapShift = 60;

constexpr std::size_t numSlots = std::size_t{1} << 19;

// The lap of the ring: 1 to 15, then 1 again. A new ring has only 0.
constexpr std::uint64_t Lap(std::uint64_t index) {
    return (1 + index / numSlots % 15) << lapShift;
}
static_assert(Lap(14 * numSlots) >> lapShift == 15 && Lap(15 * numSlots) == Lap(0),
              "The number of a lap has its bits to itself.");

// A call site, by its return address. If a walk goes on past it, the entry has the distance on the
// stack to the next return address. That is so in the run-time libraries of C and C++, and, for
// whole stacks, everywhere but in the outermost frame.
struct Caller {
    enum State : std::uint32_t { Unknown, Final, Passed, Variable };

    std::atomic<std::uint64_t> address;  // 0 while the place in the table is free.
    std::atomic<std::uint32_t> state;    // Stored last.
    std::uint32_t module;                // Index into the modules.
    std::uint64_t frameSize;             // That distance, if Passed.
    std::uint64_t function;              // Where its function begins, 0 if that is unknown.
};
constexpr std::size_t numCallers = 1U << 16;
constexpr std::size_t maxCaller = numCallers - 1;  // The last stands for all others.

// The callers of a block, the innermost first. Stacks with equal hashes count as the same.
struct Stack {
    std::atomic<std::uint64_t> hash;    // 0 while the place in the table is free.
    std::atomic<std::uint32_t> first;   // Index into the frames.
    std::atomic<std::uint32_t> number;  // Of its frames. Stored last.
};
constexpr std::size_t numStacks = maxGroup + 1;  // The last stands for all others.
constexpr std::size_t maxDepth = 64;
constexpr std::size_t numFrames = std::size_t{1} << 24;

struct Module {
    std::uint64_t base;
    char path[504];  // Cut if it is longer.
};
constexpr std::size_t numModules = 1024;  // The first stands for code outside of any.

// Timed calls of about the same length.
struct Samples {
    std::atomic<std::uint64_t> number;
    std::atomic<std::uint64_t> ticks;
};
constexpr std::size_t numSampleLengths = 20;

// A channel that is ready for a child process, or has been taken by one.
struct ChildChannel {
    std::atomic<std::int32_t> descriptor;  // In the process that drains it; 0 for no channel.
    std::atomic<std::int32_t> pid;         // Of the child, 0 if there is none yet.
};
constexpr std::size_t maxChildren = 256;  // That are recorded at a time.

constexpr std::size_t numChildNames = 8;
constexpr std::size_t childNameSize = 32;

struct Channel {
    // Read at every event, and rarely written.
    alignas(64) std::uint64_t magic;
    std::atomic<std::uint64_t> tail;  // Slots drained.
    By by;
    std::uint32_t depth;                     // The most frames of a stack, up to maxDepth.
    std::uint32_t recordsChildren;           // Each child takes a channel of its own.
    std::atomic<std::int32_t> pid;           // Of the process, and of no child of it.
    std::int32_t parentPid;                  // Of the process that drains the channel.
    std::atomic<std::uint32_t> isTaken;      // Set by the recorder of each program, once.
    std::atomic<std::uint32_t> numExecs;     // How often another program has replaced this one.
    std::atomic<std::uint32_t> tailFutex;    // The low bits of the tail, to wait on.
    std::atomic<std::uint32_t> numWaiting;   // Threads that wait.
    std::atomic<std::uint32_t> modulesUsed;  // The index of the last one.
    std::atomic<std::uint32_t> modulesLock;
    std::atomic<std::uint32_t> framesUsed;

    // Written at every event.
    alignas(64) std::atomic<std::uint64_t> head;  // Slots taken.
    std::atomic<std::uint32_t> numThreads;

    // The cost of the recorder itself: the ticks of numCalibrationEvents events and those that as
    // many measurements add, taken at its start, and the processor time of all unwinding.
    alignas(64) std::atomic<std::uint64_t> eventTicks;
    std::atomic<std::uint64_t> timerTicks;
    std::atomic<std::uint64_t> unwindNanoseconds;

    // Patterns of functions that are not callers, each ended by a 0, then an empty one.
    char skipped[1024];

    // Children that are not recorded, and the files of the first programs that they executed.
    std::atomic<std::uint32_t> numLost;
    std::atomic<std::uint32_t> numNamed;
    char childNames[numChildNames][childNameSize];

    char command[1024];  // Of a child: its words, each ended by a 0.
    ChildChannel children[maxChildren];

    // The timed calls of the allocator for small blocks, by the power of two of their ticks, which
    // include the timer's.
    Samples samples[numSampleLengths];
    Samples large;  // All calls for large blocks.
    Samples walks;  // The recorder's part of the timed calls, if it looks for callers.

    alignas(64) Slot slots[numSlots];
    Caller callers[numCallers];
    Module modules[numModules];
    Stack stacks[numStacks];
    std::uint16_t frames[numFrames];  // Indices of callers.
};
constexpr std::uint64_t channelMagic = 0x3333'4C4E'4843'504D;

constexpr std::uint64_t numCalibrationEvents = 1024;

// Of the calls for small blocks one in so many is timed, on average.
constexpr std::uint32_t samplePeriod = 64;

// A block of so many bytes or more is large. Its calls are rare, but one of them can take as long
// as millions of others: glibc then merges all the small blocks that were freed.
constexpr std::size_t largeSize = 1024;

}  // namespace Recorder

#endif
