// The process of `mempool record` beside that of the program: it starts the program, drains the
// channel, passes signals on and ends the trace.

#include "record/Session.hpp"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <initializer_list>
#include <iomanip>
#include <sstream>
#include <string_view>
#include <system_error>
#include <utility>

#include "record/Collector.hpp"
#include "record/Ticks.hpp"
#include "trace/CompactWriter.hpp"

namespace Record {

namespace {

using Clock = std::chrono::steady_clock;

constexpr int ownFailure = 125;

[[noreturn]] void Fail(const std::string& what) {
    throw Refusal(ownFailure, what + ": " + std::generic_category().message(errno));
}

class Descriptor {
public:
    explicit Descriptor(int number) : descriptor(number) {}
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    ~Descriptor() { Close(); }

    int Number() const { return descriptor; }
    bool IsOpen() const { return descriptor >= 0; }
    int Close() { return descriptor < 0 ? 0 : close(std::exchange(descriptor, -1)); }

private:
    int descriptor;
};

// The file of the trace. What goes wrong is kept until the program has ended: it shall not notice.
class TraceFile {
public:
    explicit TraceFile(std::string filePath)
        : path(std::move(filePath)),
          file(open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666)) {
        if (!file.IsOpen()) { Fail(path); }
    }

    void Write(std::string_view bytes) {
        while (!bytes.empty() && error == 0) {
            const ssize_t number = write(file.Number(), bytes.data(), bytes.size());
            if (number < 0 && errno == EINTR) { continue; }
            if (number < 0) { error = errno; }
            bytes.remove_prefix(number < 0 ? 0 : static_cast<std::size_t>(number));
            size += number < 0 ? 0 : static_cast<std::uint64_t>(number);
        }
    }
    void Close() {
        if (file.Close() != 0 && error == 0) { error = errno; }
    }
    void Check() const {
        if (error == 0) { return; }
        throw Refusal(ownFailure, path + ": " + std::generic_category().message(error));
    }
    std::uint64_t Size() const { return size; }

private:
    const std::string path;
    Descriptor file;
    int error = 0;
    std::uint64_t size = 0;
};

// The channel's memory, which has no name and goes with the last of its users.
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
    }
    SharedChannel(const SharedChannel&) = delete;
    SharedChannel& operator=(const SharedChannel&) = delete;
    ~SharedChannel() { munmap(channel, sizeof(Channel)); }

    Channel& operator*() const { return *channel; }
    Channel* operator->() const { return channel; }
    int Number() const { return descriptor.Number(); }

private:
    Descriptor descriptor;
    Channel* channel = nullptr;
};

// Signals that reach this process are taken one by one where it waits, and pass to the program.
class Signals {
public:
    Signals() {
        sigemptyset(&taken);
        for (const int number : {SIGCHLD, SIGINT, SIGQUIT, SIGTERM, SIGHUP, SIGUSR1, SIGUSR2}) {
            sigaddset(&taken, number);
        }
        sigset_t blocked = taken;
        sigaddset(&blocked, SIGPIPE);  // A trace into a pipe that nobody reads is a failed write.
        sigprocmask(SIG_BLOCK, &blocked, &former);
    }
    Signals(const Signals&) = delete;
    Signals& operator=(const Signals&) = delete;
    ~Signals() {
        // The write that failed is told as such.
        sigset_t broken = {};
        sigaddset(&broken, SIGPIPE);
        const timespec atOnce = {};
        sigtimedwait(&broken, nullptr, &atOnce);
        Restore();
    }

    void Restore() const { sigprocmask(SIG_SETMASK, &former, nullptr); }

    // Waits for a signal, but not for long. Those of the terminal have reached the program as well.
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

// Where the recorder is: beside the program `mempool`, as installed or as built.
std::string FindRecorder(bool pools) {
    const std::filesystem::path folder =
        std::filesystem::read_symlink("/proc/self/exe").parent_path();
    const std::string name = pools ? RECORDER_POOLS_NAME : RECORDER_NAME;
    for (const char* place : {RECORDER_INSTALLED, RECORDER_BUILT}) {
        const std::filesystem::path path = (folder / place / name).lexically_normal();
        if (!exists(path)) { continue; }
        if (path.string().find_first_of(" :") != std::string::npos) {
            throw Refusal(ownFailure, path.string() +
                                          ": a blank or a colon in its path keeps the "
                                          "recorder from being loaded");
        }
        return path;
    }
    throw Refusal(ownFailure, name + ": not found beside mempool");
}

// Turns the forked child into the program. What fails is told through `errors`.
[[noreturn]] void Become(const Order& order, const SharedChannel& channel,
                         const std::string& recorder, const Signals& signals, int errors) {
    channel->pid = getpid();
    const char* const preloaded = std::getenv("LD_PRELOAD");
    const bool isAlone = preloaded == nullptr || *preloaded == '\0';
    setenv("LD_PRELOAD", (isAlone ? recorder : recorder + ":" + preloaded).c_str(), 1);
    setenv(channelVariable, std::to_string(channel.Number()).c_str(), 1);
    std::vector<char*> arguments;
    for (const std::string& word : order.command) {
        arguments.push_back(const_cast<char*>(word.c_str()));
    }
    arguments.push_back(nullptr);
    signals.Restore();
    execvp(arguments.front(), arguments.data());
    const int error = errno;
    [[maybe_unused]] const ssize_t written = write(errors, &error, sizeof(error));
    _exit(ownFailure);
}

pid_t Start(const Order& order, const SharedChannel& channel, const std::string& recorder,
            const Signals& signals) {
    int ends[2] = {};
    if (pipe2(ends, O_CLOEXEC) != 0) { Fail("pipe"); }
    const Descriptor reading(ends[0]);
    Descriptor writing(ends[1]);
    const pid_t program = fork();
    if (program < 0) { Fail("fork"); }
    if (program == 0) { Become(order, channel, recorder, signals, writing.Number()); }
    writing.Close();
    int error = 0;
    if (read(reading.Number(), &error, sizeof(error)) == 0) { return program; }
    waitpid(program, nullptr, 0);
    throw Refusal(error == ENOENT ? 127 : 126,
                  order.command.front() + ": " + std::generic_category().message(error));
}

std::string Text(double number) {
    std::ostringstream text;
    text << std::fixed << std::setprecision(6) << number;
    return text.str();
}

// The processor time of a process that has ended and is still known, without that of its children.
double ProcessorSeconds(pid_t program) {
    clockid_t clock = {};
    timespec time = {};
    if (clock_getcpuclockid(program, &clock) != 0 || clock_gettime(clock, &time) != 0) { return 0; }
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

// How many ticks a second has, from the time that the program took.
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
    constexpr const char* names[] = {"all", "caller", "module", "thread"};
    WriteInfo(writer, "program", commandLine);
    WriteInfo(writer, "by", order.pools ? "pools" : names[static_cast<std::size_t>(order.by)]);
}

// What the timed calls took together. Of few of them a single one that was interrupted would be
// the most: the longest three are taken for as long as those next to them.
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

// The recorder's part of the processor time is not the program's own. It is known to a fraction,
// so that no more than half of the whole is taken for it. The share is left out where it would
// be a guess.
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

// Drains the channel until the program ends, which is not waited for yet.
void Follow(pid_t program, Collector& collector, Trace::CompactWriter& writer,
            const Signals& signals) {
    using namespace std::chrono_literals;
    constexpr auto shortest = 500us;
    constexpr auto longest = 20ms;
    constexpr auto idleUntilFlush = 500ms;
    std::chrono::nanoseconds pause = shortest;
    std::chrono::nanoseconds idle = 0ns;
    while (IsRunning(program)) {
        if (collector.Drain()) {
            pause = shortest;
            idle = 0ns;
            signals.Wait(0ns, program);
            continue;
        }
        signals.Wait(pause, program);
        idle += pause;
        pause = std::min<std::chrono::nanoseconds>(2 * pause, longest);
        if (idle > idleUntilFlush) {
            writer.Flush();
            idle = 0ns;
        }
    }
    while (collector.Drain(true)) {}
}

}  // namespace

Outcome RecordProgram(const Order& order) {
    CheckProgram(order.command.front());
    const std::string recorder = FindRecorder(order.pools);
    const Signals signals;
    TraceFile file(order.tracePath);
    Trace::CompactWriter writer([&](std::string_view bytes) { file.Write(bytes); });
    WriteStart(writer, order);
    writer.Flush();
    file.Check();

    const SharedChannel channel;
    channel->by = order.by;
    Collector collector(*channel, writer);
    if (!order.pools) { writer.WriteOwned(); }
    const TickRate rate;
    const pid_t program = Start(order, channel, recorder, signals);
    Follow(program, collector, writer, signals);
    WriteTimes(writer, *channel, ProcessorSeconds(program), rate);
    int status = 0;
    waitpid(program, &status, 0);
    writer.Finish();
    file.Close();
    file.Check();
    if (channel->isTaken == 0) {
        throw Refusal(ownFailure, order.command.front() +
                                      ": has run, but did not load the recorder: nothing recorded");
    }
    Outcome outcome;
    outcome.exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : 0;
    outcome.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    outcome.numEvents = collector.NumEvents();
    outcome.numThreads = channel->numThreads;
    outcome.traceSize = file.Size();
    return outcome;
}

}  // namespace Record
