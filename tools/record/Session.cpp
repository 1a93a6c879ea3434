// The part of the recorder in the process of `mempool record`: it starts the program, drains the
// channel, forwards signals and completes the trace.

#include "record/Session.hpp"

#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <initializer_list>
#include <iomanip>
#include <sstream>
#include <string_view>

#include "record/Collector.hpp"
#include "record/Ticks.hpp"
#include "system/Child.hpp"
#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"
#include "system/OutputFile.hpp"
#include "system/ProgramFile.hpp"
#include "trace/CompactWriter.hpp"

namespace Recorder {

namespace {

using Clock = std::chrono::steady_clock;

[[noreturn]] void Fail(const std::string& what) {
    throw System::Failure(System::ownFailure, what, errno);
}

// The channel's memory, which has no name and is released with its last user.
class SharedChannel {
public:
    SharedChannel() : descriptor(memfd_create("mempool-record", 0)) {
        if (!descriptor.IsOpen() || ftruncate(descriptor.Number(), sizeof(Channel)) != 0) {
            Fail("shared memory");
        }
        void* const memory = mmap(nullptr, sizeof(Channel), PROT_READ | PROT_WRITE, MAP_SHARED,
                                  descriptor.Number(), 0);
        if (memory == MAP_FAILED) { Fail("shared memory"); }
        channel = static_cast<Channel*>(memory);
        channel->magic = channelMagic;
        channel->parentPid = getpid();
        channel->descriptor = descriptor.Number();
    }
    SharedChannel(const SharedChannel&) = delete;
    SharedChannel& operator=(const SharedChannel&) = delete;
    ~SharedChannel() { munmap(channel, sizeof(Channel)); }

    Channel& operator*() const { return *channel; }
    Channel* operator->() const { return channel; }
    int Number() const { return descriptor.Number(); }

private:
    System::Descriptor descriptor;
    Channel* channel = nullptr;
};

void Skip(Channel& channel, const std::vector<std::string>& patterns) {
    std::size_t used = 0;
    for (const std::string& pattern : patterns) {
        const std::size_t size = pattern.size() + 1;
        if (used + size >= sizeof(channel.skipped)) {
            throw System::Failure(System::ownFailure, "--skip: the patterns are too long");
        }
        std::memcpy(channel.skipped + used, pattern.c_str(), size);
        used += size;
    }
}

// Receives the signals of this process one by one, where it waits, and forwards them to the
// program.
class Signals {
public:
    Signals() {
        sigemptyset(&taken);
        for (const int number : {SIGCHLD, SIGINT, SIGQUIT, SIGTERM, SIGHUP, SIGUSR1, SIGUSR2}) {
            sigaddset(&taken, number);
        }
        sigset_t blocked = taken;
        sigaddset(&blocked, SIGPIPE);  // A write into a broken pipe fails instead.
        sigprocmask(SIG_BLOCK, &blocked, &former);
    }
    Signals(const Signals&) = delete;
    Signals& operator=(const Signals&) = delete;
    ~Signals() {
        // Discards the signal: the failed write is reported.
        sigset_t broken = {};
        sigaddset(&broken, SIGPIPE);
        const timespec atOnce = {};
        sigtimedwait(&broken, nullptr, &atOnce);
        Restore();
    }

    void Restore() const { sigprocmask(SIG_SETMASK, &former, nullptr); }

    // Waits for a signal, for at most `time`. The terminal sends its signals to the program too.
    void Wait(std::chrono::nanoseconds time, pid_t program) const {
        const timespec limit = {0, static_cast<long>(time.count())};
        siginfo_t info = {};
        const int number = sigtimedwait(&taken, &info, &limit);
        if (number > 0 && number != SIGCHLD && info.si_code <= 0) { kill(program, number); }
    }

private:
    sigset_t taken = {};
    sigset_t former = {};
};

// The path of the recorder, relative to the program `mempool`, as installed or as built.
std::string FindRecorder(bool pools) {
    const std::filesystem::path folder =
        std::filesystem::read_symlink("/proc/self/exe").parent_path();
    const std::string name = pools ? RECORDER_POOLS_NAME : RECORDER_NAME;
    for (const char* place : {RECORDER_INSTALLED, RECORDER_BUILT}) {
        const std::filesystem::path path = (folder / place / name).lexically_normal();
        if (!exists(path)) { continue; }
        if (path.string().find_first_of(" :") != std::string::npos) {
            throw System::Failure(System::ownFailure,
                                  path.string() +
                                      ": a blank or a colon in its path keeps the "
                                      "recorder from being loaded");
        }
        return path;
    }
    throw System::Failure(System::ownFailure, name + ": not found beside mempool");
}

// Runs in the child, before it becomes the program: sets what the recorder in the program needs.
void Prepare(const Order& order, const SharedChannel& channel, const std::string& recorder,
             const Signals& signals) {
    channel->pid = getpid();
    if (order.tracePath == "-") { dup2(STDERR_FILENO, STDOUT_FILENO); }
    const char* const preloaded = std::getenv("LD_PRELOAD");
    const bool isAlone = preloaded == nullptr || *preloaded == '\0';
    setenv("LD_PRELOAD", (isAlone ? recorder : recorder + ":" + preloaded).c_str(), 1);
    setenv(channelVariable, std::to_string(channel.Number()).c_str(), 1);
    signals.Restore();
}

std::string Text(double number) {
    std::ostringstream text;
    text << std::fixed << std::setprecision(6) << number;
    return text.str();
}

// The processor time of a process that has ended but has not been waited for, without its children.
double ProcessorSeconds(pid_t program) {
    clockid_t clock = {};
    timespec time = {};
    if (clock_getcpuclockid(program, &clock) != 0 || clock_gettime(clock, &time) != 0) { return 0; }
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

// Measures the ticks per second while the program runs.
class TickRate {
public:
    double PerSecond() const {
        const std::chrono::duration<double> seconds = Clock::now() - start;
        return static_cast<double>(Ticks() - startTicks) / seconds.count();
    }

private:
    Clock::time_point start = Clock::now();
    std::uint64_t startTicks = Ticks();
};

void WriteInfo(Trace::CompactWriter& writer, std::string_view key, const std::string& text) {
    writer.Write({Trace::Kind::Info, 0, 0, 0, key, text});
}

void WriteStart(Trace::CompactWriter& writer, const Order& order) {
    std::string commandLine;
    for (const std::string& word : order.command) {
        commandLine += (commandLine.empty() ? "" : " ") + word;
    }
    constexpr const char* names[] = {"all", "thread", "caller", "module", "stack"};
    WriteInfo(writer, "program", commandLine);
    WriteInfo(writer, "by", order.pools ? "pools" : names[static_cast<std::size_t>(order.by)]);
}

// The total of the timed calls. If there are few, a single call that was interrupted could dominate
// it, so the longest three count with the mean of the next shorter ones.
struct TimedCalls {
    explicit TimedCalls(const Channel& channel) {
        double numLongest = 3;
        double numReplaced = 0;
        for (std::size_t length = numSampleLengths; length-- != 0;) {
            const auto inLength = static_cast<double>(channel.samples[length].number.load());
            if (inLength == 0) { continue; }
            const double mean =
                static_cast<double>(channel.samples[length].ticks.load()) / inLength;
            const double left = std::min(inLength, numLongest);
            numLongest -= left;
            numReplaced += left;
            number += inLength;
            if (inLength == left) { continue; }
            ticks += mean * (inLength - left + numReplaced);
            numReplaced = 0;
        }
        const auto timer = static_cast<double>(channel.timerTicks.load()) / numCalibrationEvents;
        ticks = std::max(ticks - number * timer, 0.0);
    }

    double number = 0;
    double ticks = 0;
};

// The recorder's part of the processor time is subtracted. It is only an estimate, so at most half
// of the whole is subtracted. The share is left out if there are too few samples for it.
void WriteTimes(Trace::CompactWriter& writer, const Channel& channel, double whole,
                const TickRate& rate) {
    constexpr double leastCalls = 200;
    constexpr double leastSeconds = 0.01;
    const double perSecond = rate.PerSecond();
    const auto seconds = [&](double ticks) { return perSecond > 0 ? ticks / perSecond : 0; };
    const double numEvents = static_cast<double>(channel.head.load()) / numCalibrationEvents;
    const double events = static_cast<double>(channel.eventTicks.load()) * numEvents;
    const double recorder =
        seconds(events) + static_cast<double>(channel.unwindNanoseconds.load()) / 1e9;
    const double own = std::max(whole - recorder, whole / 2);
    WriteInfo(writer, "cpu_seconds", Text(own));
    const TimedCalls timed(channel);
    if (timed.number >= leastCalls && whole >= leastSeconds) {
        const double allocator = seconds(timed.ticks * samplePeriod);
        WriteInfo(writer, "allocation_share", Text(std::min(allocator / own, 1.0)));
    }
    WriteInfo(writer, "threads", std::to_string(channel.numThreads));
}

bool IsRunning(pid_t program) {
    siginfo_t info = {};
    waitid(P_PID, static_cast<id_t>(program), &info, WEXITED | WNOHANG | WNOWAIT);
    return info.si_pid == 0;
}

// Drains the channel until the program ends, but does not wait for it. Flushes the trace regularly,
// so that little is lost if this process is killed.
void Follow(pid_t program, Collector& collector, Trace::CompactWriter& writer,
            const Signals& signals) {
    using namespace std::chrono_literals;
    constexpr auto shortest = 500us;
    constexpr auto longest = 20ms;
    constexpr auto untilFlush = 500ms;
    std::chrono::nanoseconds pause = 0ns;
    Clock::time_point lastFlush = Clock::now();
    while (IsRunning(program)) {
        if (Clock::now() - lastFlush > untilFlush) {
            writer.Flush();
            lastFlush = Clock::now();
        }
        pause = collector.Drain()
                    ? 0ns
                    : std::clamp<std::chrono::nanoseconds>(2 * pause, shortest, longest);
        signals.Wait(pause, program);
    }
    while (collector.Drain(true)) {}
}

}  // namespace

Outcome RecordProgram(const Order& order) {
    const std::string program = order.command.front();
    const std::string executed = System::CheckPreload(program, "recorded");
    const std::string recorder = FindRecorder(order.pools);
    const Signals signals;
    System::OutputFile file(order.tracePath, {System::FindProgram(program), "-"});
    file.KeepIfCutShort();
    Trace::CompactWriter writer([&](std::string_view bytes) { file.Write(bytes); });
    WriteStart(writer, order);
    writer.Flush();
    file.Check();

    const SharedChannel channel;
    channel->by = order.by;
    channel->depth = order.by == By::Stack ? order.depth : maxDepth;
    Skip(*channel, order.skipped);
    Collector collector(*channel, writer, order.pools);
    const TickRate rate;
    const pid_t child =
        System::Start(order.command, [&] { Prepare(order, channel, recorder, signals); });
    Follow(child, collector, writer, signals);
    WriteTimes(writer, *channel, ProcessorSeconds(child), rate);
    Outcome outcome;
    waitpid(child, &outcome.waitStatus, 0);
    writer.Finish();
    if (channel->isTaken == 0 && channel->numExecs == 0) {
        throw System::Failure(System::ownFailure, program +
                                                      ": has run, but did not load the "
                                                      "recorder: nothing recorded");
    }
    file.Commit();
    outcome.isCutByExec = channel->isTaken == 0;
    outcome.isAddressSanitized = System::IsAddressSanitized(executed);
    outcome.numEvents = collector.NumEvents();
    outcome.numThreads = channel->numThreads;
    outcome.traceSize = file.Size();
    return outcome;
}

}  // namespace Recorder
