// The part of the recorder in the process of `mempool record`: it starts the program, drains the
// channel, forwards signals and completes the trace.

#include "record/Session.hpp"

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <initializer_list>
#include <memory>
#include <set>

#include "record/Children.hpp"
#include "record/Recording.hpp"
#include "record/SharedChannel.hpp"
#include "record/Times.hpp"
#include "system/Child.hpp"
#include "system/ExitStatus.hpp"
#include "system/ProgramFile.hpp"

namespace Recorder {

namespace {

using Clock = std::chrono::steady_clock;

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

std::string CommandText(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) { text += (text.empty() ? "" : " ") + word; }
    return text;
}

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
    outcome.lostSeconds = std::max(0., descendants);  // The two clocks differ a little.
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
    ProcessorTime own;
    own.Renew(child);
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
    DescribeLost(outcome, *channel, Seconds(all.ru_utime) + Seconds(all.ru_stime) - own.seconds);
    return outcome;
}

}  // namespace Recorder
