// Finds the channel, removes the recorder from the program's environment, and has the slow paths of
// an event.

#include "record/Recorder.hpp"

#include <fcntl.h>
#include <linux/futex.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace Recorder {

namespace {

// Removes a variable from the environment.
void Forget(char** place) {
    do { place[0] = place[1]; } while (*place++ != nullptr);
}

// The text after "NAME=" in a variable of that name, or null.
char* ValueOf(char* variable, const char* name) {
    const std::size_t size = std::strlen(name);
    return std::strncmp(variable, name, size) == 0 && variable[size] == '=' ? variable + size + 1
                                                                            : nullptr;
}

// Restores the environment for the programs that this one executes. The recorder is the first of
// the preloaded libraries.
void RestoreEnvironment() {
    for (char** place = environ; *place != nullptr;) {
        char* const preloaded = ValueOf(*place, "LD_PRELOAD");
        char* const others = preloaded != nullptr ? std::strchr(preloaded, ':') : nullptr;
        if (others != nullptr) {
            std::copy(others + 1, others + std::strlen(others) + 1, preloaded);
        }
        if (ValueOf(*place, channelVariable) != nullptr || (preloaded != nullptr && !others)) {
            Forget(place);
        } else {
            ++place;
        }
    }
}

// The channel at the path, or null. The caller releases it.
Channel* Map(const char* path) {
    const int descriptor = open(path, O_RDWR | O_CLOEXEC);
    if (descriptor < 0) { return nullptr; }
    void* const memory =
        mmap(nullptr, sizeof(Channel), PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
    close(descriptor);
    if (memory == MAP_FAILED) { return nullptr; }
    auto* const channel = static_cast<Channel*>(memory);
    if (channel->magic == channelMagic) { return channel; }
    munmap(memory, sizeof(Channel));
    return nullptr;
}

// Takes a channel that is ready, or the one that this process had before it executed this program.
Channel* TakeReady(Channel& program) {
    const std::int32_t own = getpid();
    for (const bool isFirstTry : {true, false}) {
        for (ChildChannel& child : program.children) {
            std::int32_t pid = isFirstTry ? own : 0;
            const std::int32_t descriptor = child.descriptor.load();
            if (descriptor == 0 || !child.pid.compare_exchange_strong(pid, own)) { continue; }
            char path[64];
            std::snprintf(path, sizeof(path), "/proc/%d/fd/%d", program.parentPid, descriptor);
            Channel* const channel = Map(path);
            if (channel == nullptr) { continue; }
            channel->pid = own;
            if (channel->isTaken.exchange(1) == 0) { return channel; }
            munmap(channel, sizeof(Channel));  // Of a process that had this number before.
        }
    }
    return nullptr;
}

// Waits until a channel is ready, but not for long: too many children may be running.
Channel* TakeChannelOfChild(Channel& program) {
    constexpr int mostTries = 5000;
    const timespec pause = {0, 1000000};
    for (int tries = 0; tries != mostTries; ++tries) {
        Channel* const channel = TakeReady(program);
        if (channel != nullptr || access(channelPath, F_OK) != 0) { return channel; }
        nanosleep(&pause, nullptr);
    }
    ++program.numLost;
    return nullptr;
}

// Notes the command line of a child, which its trace has as its program.
void NoteCommand(Channel& channel) {
    const int file = open("/proc/self/cmdline", O_RDONLY | O_CLOEXEC);
    std::memset(channel.command, 0, sizeof(channel.command));
    [[maybe_unused]] const ssize_t size = read(file, channel.command, sizeof(channel.command) - 1);
    close(file);
}

// The channel for this process, or null.
Channel* TakeChannel() {
    Channel* const program = Map(channelPath);
    if (program == nullptr) { return nullptr; }
    if (program->pid == getpid()) {
        if (program->isTaken.exchange(1) == 0) { return program; }
    } else if (program->recordsChildren != 0) {
        Channel* const channel = TakeChannelOfChild(*program);
        if (channel != nullptr) { NoteCommand(*channel); }
        munmap(program, sizeof(Channel));
        return channel;
    }
    munmap(program, sizeof(Channel));
    return nullptr;
}

void Activate(Channel* channel) {
    known = channel;
    if (active != &inactive) {  // A child has the page of its parent, cleared.
        active->channel.store(channel, std::memory_order_relaxed);
        return;
    }
    const auto pageSize = static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
    void* const page =
        mmap(nullptr, pageSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (page == MAP_FAILED || madvise(page, pageSize, MADV_WIPEONFORK) != 0) { return; }
    static_cast<Active*>(page)->channel.store(channel, std::memory_order_relaxed);
    static_cast<Active*>(page)->isSearched = true;
    active = static_cast<Active*>(page);
}

// The ticks of the shortest of a few rounds, which was not interrupted.
template <typename Round>
std::uint64_t LeastTicks(Round round) {
    std::uint64_t least = ~std::uint64_t{0};
    for (int number = 0; number != 5; ++number) { least = std::min(least, round()); }
    return least;
}

// Takes about as long as a short call.
std::uint64_t Compute(std::uint64_t number) {
    for (int step = 0; step != 32; ++step) {
        number = number * 3 + 1;
        asm volatile("" : "+r"(number));  // No step is left out.
    }
    return number;
}

// The ticks that so many measurements add to what they measure. Part of reading the clock overlaps
// with the measured code, so that an empty measurement would show too many.
std::uint64_t TimerTicks() {
    return LeastTicks([] {
        std::uint64_t ticks = 0;
        std::uint64_t number = 0;
        for (std::uint64_t reading = 0; reading != numCalibrationEvents; ++reading) {
            const std::uint64_t start = TicksWhenDone();
            number = Compute(number);
            ticks += TicksWhenDone() - start;
        }
        const std::uint64_t start = TicksWhenDone();
        for (std::uint64_t work = 0; work != numCalibrationEvents; ++work) {
            number = Compute(number);
        }
        const std::uint64_t worked = TicksWhenDone() - start;
        return ticks - std::min(ticks, worked);
    });
}

// The ticks of so many events into a channel that is not drained. Its memory is touched for the
// first time, like that of the real channel.
std::uint64_t EventTicks() {
    void* const memory = mmap(nullptr, sizeof(Channel), PROT_READ | PROT_WRITE,
                              MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    if (memory == MAP_FAILED) { return 0; }
    auto* const channel = static_cast<Channel*>(memory);
    const ThreadState state = threadState;
    const std::uint64_t least = LeastTicks([channel, memory] {
        const std::uint64_t start = Ticks();
        for (std::uint64_t event = 0; event != numCalibrationEvents; ++event) {
            Put(*channel, Op::Released, memory, 0, 0);
        }
        return Ticks() - start;
    });
    threadState = state;
    munmap(memory, sizeof(Channel));
    return least;
}

// The former program of this process and its threads have ended, so a slot that they have not
// filled never will be. After its last events are drained, its code addresses are forgotten.
void TakeOver(Channel& channel) {
    channel.numThreads.store(0);
    const std::uint64_t head = channel.head.load();
    for (std::uint64_t index = channel.tail.load(); index != head; ++index) {
        if (!WaitForRoom(channel, index)) { return; }
        const std::uint64_t what = channel.slots[index % numSlots].what.load();
        if (what >> lapShift != Lap(index) >> lapShift) {
            Fill(channel, index, 0, What(Op::Data, 0, 0));
        }
    }
    Put(channel, Op::Executed, nullptr, 0, 0);
    WaitForRoom(channel, head + numSlots);  // Waits until all slots before it are drained.
    if (channel.by >= By::Caller) {
        for (Caller& caller : channel.callers) {
            caller.address.store(0);
            caller.state.store(Caller::Unknown);
        }
    }
    if (channel.by == By::Stack) {
        for (Stack& stack : channel.stacks) {
            stack.number.store(0);
            stack.hash.store(0);
        }
        channel.framesUsed.store(0);
    }
    channel.modulesUsed.store(0);
    channel.modulesLock.store(0);
}

}  // namespace

void Attach() {
    const bool isChild = known != nullptr;
    if (environ == nullptr || active->isSearched.exchange(true)) { return; }
    if (isChild && known->recordsChildren == 0) { return; }
    const int oldErrno = errno;
    const char* const path = std::getenv(channelVariable);
    if (path != nullptr && !isChild) { std::strncpy(channelPath, path, sizeof(channelPath) - 1); }
    Channel* const channel = *channelPath == '\0' ? nullptr : TakeChannel();
    // Children that are recorded find the recorder in the environment.
    if (path != nullptr && (channel == nullptr || channel->recordsChildren == 0)) {
        RestoreEnvironment();
    }
    if (channel != nullptr) {
        threadState = {};
        if (channel->numExecs != 0) { TakeOver(*channel); }
        channel->timerTicks.store(TimerTicks());
        channel->eventTicks.store(EventTicks());
        Activate(channel);
    }
    errno = oldErrno;
}

// For a program that allocates nothing.
__attribute__((constructor)) static void AttachAtStart() {
    Attach();
}

void NumberThread(Channel& channel) {
    const std::uint32_t number = channel.numThreads.fetch_add(1) + 1;
    threadState.number = number < maxThread ? number : maxThread;
    threadState.random = number;
}

// Sleeps until the slot is drained. If the process that drains the channel has ended, recording
// ends and the program goes on.
bool WaitForRoom(Channel& channel, std::uint64_t index) {
    const int oldErrno = errno;
    const timespec limit = {0, 100000000};
    bool isDrained = true;
    ++channel.numWaiting;
    while (true) {
        const std::uint32_t seen = channel.tailFutex.load();
        if (index < channel.tail.load(std::memory_order_acquire) + numSlots) { break; }
        syscall(SYS_futex, &channel.tailFutex, FUTEX_WAIT, seen, &limit, nullptr, 0);
        if (getppid() != channel.parentPid && access(channelPath, F_OK) != 0) {
            active->channel.store(nullptr, std::memory_order_relaxed);
            isDrained = false;
            break;
        }
    }
    --channel.numWaiting;
    errno = oldErrno;
    return isDrained;
}

// A call for a small block that seems to take very long was interrupted. The length is limited.
void Sample::End() {
    constexpr std::uint64_t longest = (std::uint64_t{1} << numSampleLengths) - 1;
    if (isLarge) {
        channel.large.number.fetch_add(1, std::memory_order_relaxed);
        channel.large.ticks.fetch_add(inside, std::memory_order_relaxed);
        return;
    }
    ThreadState& state = threadState;
    state.isWarm = !state.isWarm;
    if (state.isWarm) { return; }
    // The next sample is 32 to 95 calls away, so that samples do not follow a pattern of the
    // program.
    state.random = state.random * 1664525U + 1013904223U;
    state.countdown = samplePeriod / 2 + (state.random >> 26) - 1;

    const std::uint64_t counted = std::min(inside, longest);
    Samples& samples = channel.samples[63 - __builtin_clzll(counted | 1)];
    samples.number.fetch_add(1, std::memory_order_relaxed);
    samples.ticks.fetch_add(counted, std::memory_order_relaxed);
    // Unwinding takes longer, and its time is known.
    constexpr std::uint64_t longestWalk = 8192;
    if (walk != 0 && walk < longestWalk) {
        channel.walks.number.fetch_add(1, std::memory_order_relaxed);
        channel.walks.ticks.fetch_add(walk, std::memory_order_relaxed);
    }
}

}  // namespace Recorder
