// The part of the recorder in the process of `mempool record`: it starts the program, drains the
// channel, forwards signals and completes the trace.

#include "record/Session.hpp"

#include <poll.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <initializer_list>
#include <iomanip>
#include <memory>
#include <optional>
#include <set>
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

// The channel's memory, which has no name and is released with its last user.
class SharedChannel {
public:
    explicit SharedChannel(const Order& order)
        : descriptor(memfd_create("mempool-record", MFD_CLOEXEC)) {
        if (!descriptor.IsOpen() || ftruncate(descriptor.Number(), sizeof(Channel)) != 0) {
            Fail("shared memory");
        }
        void* const memory = mmap(nullptr, sizeof(Channel), PROT_READ | PROT_WRITE, MAP_SHARED,
                                  descriptor.Number(), 0);
        if (memory == MAP_FAILED) { Fail("shared memory"); }
        channel = static_cast<Channel*>(memory);
        channel->magic = channelMagic;
        channel->parentPid = getpid();
        channel->by = order.by;
        channel->depth = order.by == By::Stack ? order.depth : maxDepth;
        channel->recordsChildren = order.children ? 1 : 0;
        Skip(*channel, order.skipped);
    }
    SharedChannel(const SharedChannel&) = delete;
    SharedChannel& operator=(const SharedChannel&) = delete;
    ~SharedChannel() {
        if (channel != nullptr) { munmap(channel, sizeof(Channel)); }
    }

    Channel& operator*() const { return *channel; }
    Channel* operator->() const { return channel; }
    int Number() const { return descriptor.Number(); }

private:
    System::Descriptor descriptor;
    Channel* channel = nullptr;
};

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
    const std::string descriptors = "/proc/" + std::to_string(channel->parentPid) + "/fd/";
    setenv(channelVariable, (descriptors + std::to_string(channel.Number())).c_str(), 1);
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

// The command line of a child.
std::string CommandOf(const Channel& channel) {
    std::string text(channel.command, sizeof(channel.command));
    text.erase(text.find_last_not_of('\0') + 1);
    std::replace(text.begin(), text.end(), '\0', ' ');
    return text;
}

std::string CommandText(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) { text += (text.empty() ? "" : " ") + word; }
    return text;
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
    if (whole > 0) { WriteInfo(writer, "cpu_seconds", Text(own)); }
    const TimedCalls timed(channel);
    if (timed.number >= leastCalls && whole >= leastSeconds) {
        const double allocator = seconds(timed.ticks * samplePeriod);
        WriteInfo(writer, "allocation_share", Text(std::min(allocator / own, 1.0)));
    }
    WriteInfo(writer, "threads", std::to_string(channel.numThreads));
}

// The trace of one process.
class Recording {
public:
    // Opens the file, which is none of the inputs.
    Recording(const Order& order, const std::string& path, const std::vector<std::string>& inputs,
              const std::string& commandLine, Channel& ofChannel)
        : channel(ofChannel),
          file(path, inputs),
          writer([this](std::string_view bytes) { file.Write(bytes); }),
          collector(channel, writer, order.pools) {
        file.KeepIfCutShort();
        WriteProgram(commandLine);
        constexpr const char* names[] = {"all", "thread", "caller", "module", "stack"};
        WriteInfo(writer, "by", order.pools ? "pools" : names[static_cast<std::size_t>(order.by)]);
    }

    void WriteProgram(const std::string& commandLine) { WriteInfo(writer, "program", commandLine); }
    bool Drain(bool atEnd = false) { return collector.Drain(atEnd); }
    void Flush() { writer.Flush(); }

    // Writes the rest. `whole` is the processor time of the process.
    void Finish(double whole, const TickRate& rate) {
        WriteTimes(writer, channel, whole, rate);
        writer.Finish();
    }

    System::OutputFile& File() { return file; }
    std::uint64_t NumEvents() const { return collector.NumEvents(); }

private:
    Channel& channel;
    System::OutputFile file;
    Trace::CompactWriter writer;
    Collector collector;
};

// A child process. Nothing is written for it before its first event.
class Child {
public:
    Child(const Order& ofOrder, pid_t number)
        : order(ofOrder),
          pid(number),
          process(static_cast<int>(syscall(SYS_pidfd_open, number, 0))) {}

    bool HasEnded() const {
        pollfd one = {process.Number(), POLLIN, 0};
        return !process.IsOpen() || poll(&one, 1, 0) == 1;
    }

    // Drains the channel. Throws a System::Failure if the trace cannot be written; later calls
    // then drop the events.
    bool Drain(Channel& channel, bool atEnd) {
        seconds = std::max(seconds, ProcessorSeconds(pid));
        const std::uint64_t head = channel.head.load();
        if (channel.tail.load() == head) { return false; }
        if (recording == nullptr) {
            if (isLost) {
                channel.tail.store(head);
                return true;
            }
            isLost = true;
            command = CommandOf(channel);
            recording =
                std::make_unique<Recording>(order, order.tracePath + "." + std::to_string(pid),
                                            std::vector<std::string>(), command, channel);
            isLost = false;
        }
        NoteProgram(channel);
        return recording->Drain(atEnd);
    }

    // Returns whether there is a trace.
    bool Finish(const Channel& channel, const TickRate& rate) {
        if (recording == nullptr) { return false; }
        NoteProgram(channel);
        recording->Finish(seconds, rate);
        recording->File().CommitBeside();
        return true;
    }

    void Flush() {
        if (recording != nullptr) { recording->Flush(); }
    }

private:
    // The program changes if the process executes another one. The last one names the trace.
    void NoteProgram(const Channel& channel) {
        const std::string now = CommandOf(channel);
        if (now != command) { recording->WriteProgram(command = now); }
    }

    const Order& order;
    const pid_t pid;
    const System::Descriptor process;
    std::unique_ptr<Recording> recording;
    std::string command;
    double seconds = 0;
    bool isLost = false;
};

// Keeps channels ready in that of the program, and drains those that children have taken.
class Children {
public:
    Children(const Order& ofOrder, Channel& ofProgram) : order(ofOrder), program(ofProgram) {
        Refill();
    }

    // Drains all channels. Those of processes that have ended are finished, or all of them.
    bool Drain(const TickRate& rate, bool atEnd) {
        bool isAny = false;
        for (std::size_t index = 0; index != maxChildren; ++index) {
            ChildChannel& place = program.children[index];
            if (place.pid == 0) { continue; }
            std::optional<SharedChannel>& channel = channels[index];
            std::optional<Child>& child = children[index];
            if (!child.has_value()) { child.emplace(order, place.pid.load()); }
            const bool hasEnded = child->HasEnded();
            bool isDrained = false;
            Try([&] { isDrained = child->Drain(**channel, hasEnded); });
            isAny |= isDrained;
            if (!atEnd && (isDrained || !hasEnded)) { continue; }
            Try([&] { number += child->Finish(**channel, rate) ? 1 : 0; });
            child.reset();
            place.descriptor = 0;
            channel.reset();
            place.pid = 0;
        }
        Refill();
        return isAny;
    }

    void Flush() {
        for (std::optional<Child>& child : children) {
            if (child.has_value()) { child->Flush(); }
        }
    }

    bool AreRecorded() const { return order.children; }
    std::uint64_t Number() const { return number; }

    // Throws the first failure.
    void Check() const {
        if (failure.has_value()) { throw System::Failure(*failure); }
    }

private:
    static constexpr std::size_t numReady = 32;

    template <typename Step>
    void Try(Step step) {
        try {
            step();
        } catch (const System::Failure& first) {
            if (!failure.has_value()) { failure.emplace(first); }
        }
    }

    // Makes channels until enough are ready. If one cannot be made, there may be room later.
    void Refill() {
        if (!order.children) { return; }
        std::size_t ready = 0;
        for (std::size_t index = 0; index != maxChildren && ready != numReady; ++index) {
            ChildChannel& place = program.children[index];
            if (place.pid != 0) { continue; }
            if (!channels[index].has_value()) {
                try {
                    channels[index].emplace(order);
                } catch (const System::Failure&) { return; }
                place.descriptor = channels[index]->Number();
            }
            ++ready;
        }
    }

    const Order& order;
    Channel& program;
    std::array<std::optional<SharedChannel>, maxChildren> channels;
    std::array<std::optional<Child>, maxChildren> children;
    std::optional<System::Failure> failure;
    std::uint64_t number = 0;
};

bool IsRunning(pid_t program) {
    siginfo_t info = {};
    waitid(P_PID, static_cast<id_t>(program), &info, WEXITED | WNOHANG | WNOWAIT);
    return info.si_pid == 0;
}

// Drains the channels until the program ends, but does not wait for it. Flushes the traces
// regularly, so that little is lost if this process is killed.
void Follow(pid_t program, Recording& recording, Children& children, const TickRate& rate,
            const Signals& signals) {
    using namespace std::chrono_literals;
    constexpr auto shortest = 500us;
    const auto longest = children.AreRecorded() ? 2ms : 20ms;  // New children wait for channels.
    constexpr auto untilFlush = 500ms;
    std::chrono::nanoseconds pause = 0ns;
    Clock::time_point lastFlush = Clock::now();
    while (IsRunning(program)) {
        if (Clock::now() - lastFlush > untilFlush) {
            recording.Flush();
            children.Flush();
            lastFlush = Clock::now();
        }
        const bool isAnyOfChildren = children.Drain(rate, false);
        pause = recording.Drain() || isAnyOfChildren
                    ? 0ns
                    : std::clamp<std::chrono::nanoseconds>(2 * pause, shortest, longest);
        signals.Wait(pause, program);
    }
    while (recording.Drain(true)) {}
    // A child that is still running may not stop allocating.
    for (int round = 0; round != 100 && children.Drain(rate, false); ++round) {}
    children.Drain(rate, true);
}

// What is known of the children that are not recorded. `descendants` is the processor time of all.
void DescribeLost(Outcome& outcome, const Channel& channel, double descendants) {
    outcome.numLostChildren = channel.numLost;
    outcome.lostSeconds = descendants;
    std::set<std::string> names;
    for (const auto& name : channel.childNames) {
        if (*name != '\0' && names.insert(name).second) {
            outcome.lostNames += (outcome.lostNames.empty() ? "" : ", ") + std::string(name);
        }
    }
}

double Seconds(const timeval& time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
}

// The traces of children are beside that of the program, which needs a name.
void CheckCanRecordChildren(const std::string& path) {
    std::error_code none;
    if (path == "-" ||
        (std::filesystem::exists(path, none) && !std::filesystem::is_regular_file(path, none))) {
        throw System::Failure(System::ownFailure,
                              path +
                                  ": --children needs the name of a file, after which those of "
                                  "the children are named");
    }
}

}  // namespace

Outcome RecordProgram(const Order& order) {
    const std::string program = order.command.front();
    const std::string executed = System::CheckPreload(program, "recorded");
    const std::string recorder = FindRecorder(order.pools);
    if (order.children) { CheckCanRecordChildren(order.tracePath); }
    const Signals signals;
    const SharedChannel channel(order);
    Recording recording(order, order.tracePath, {System::FindProgram(program), "-"},
                        CommandText(order.command), *channel);
    recording.Flush();
    recording.File().Check();

    const auto children = std::make_unique<Children>(order, *channel);
    const TickRate rate;
    const pid_t child =
        System::Start(order.command, [&] { Prepare(order, channel, recorder, signals); });
    Follow(child, recording, *children, rate, signals);
    const double own = ProcessorSeconds(child);
    recording.Finish(own, rate);
    Outcome outcome;
    rusage all = {};
    wait4(child, &outcome.waitStatus, 0, &all);
    if (channel->isTaken == 0 && channel->numExecs == 0) {
        throw System::Failure(System::ownFailure, program +
                                                      ": has run, but did not load the "
                                                      "recorder: nothing recorded");
    }
    recording.File().Commit();
    children->Check();
    outcome.isCutByExec = channel->isTaken == 0;
    outcome.isAddressSanitized = System::IsAddressSanitized(executed);
    outcome.numEvents = recording.NumEvents();
    outcome.numThreads = channel->numThreads;
    outcome.traceSize = recording.File().Size();
    outcome.numChildren = children->Number();
    DescribeLost(outcome, *channel, Seconds(all.ru_utime) + Seconds(all.ru_stime) - own);
    return outcome;
}

}  // namespace Recorder
