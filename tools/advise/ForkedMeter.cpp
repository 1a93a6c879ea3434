// The child writes its figure to a pipe and ends without side effects: it runs no exit handler,
// flushes no buffer, and its standard output is discarded.

#include "advise/ForkedMeter.hpp"

#include <fcntl.h>
#include <malloc.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>

#include <MemPool>

#include "replay/Measure.hpp"
#include "system/Child.hpp"
#include "system/Interruption.hpp"

namespace Advise {

namespace {

constexpr int statusOutOfMemory = 3;

// Seconds that a replay of the pools or of the heap may always take.
constexpr double leastLimit = 0.5;
constexpr double limitOfHeap = 3600;

// A short trace is replayed several times, so that a measurement takes about this long. Otherwise
// the clock and the caches of the processor would dominate it.
constexpr double leastNanoseconds = 2e7;

[[noreturn]] void BeChild(const std::function<double()>& work, int result) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    const int nowhere = open("/dev/null", O_WRONLY | O_CLOEXEC);
    dup2(nowhere, STDOUT_FILENO);
    try {
        const double figure = work();
        const bool isWritten = write(result, &figure, sizeof figure) == sizeof figure;
        _exit(isWritten ? EXIT_SUCCESS : EXIT_FAILURE);
    } catch (const std::bad_alloc&) { _exit(statusOutOfMemory); } catch (...) {
        _exit(EXIT_FAILURE);
    }
}

std::optional<double> ReadFigure(int result) {
    double figure = 0;
    ssize_t numRead = 0;
    do { numRead = read(result, &figure, sizeof figure); } while (numRead < 0 && errno == EINTR);
    return numRead == sizeof figure ? std::optional(figure) : std::nullopt;
}

double ProcessorSeconds(pid_t child) {
    clockid_t clock = 0;
    timespec used = {};
    if (clock_getcpuclockid(child, &clock) == 0) { clock_gettime(clock, &used); }
    return static_cast<double>(used.tv_sec) + 1e-9 * static_cast<double>(used.tv_nsec);
}

// Waits until the child writes its figure or ends. False if it is stopped or uses more processor
// time than that, which is checked from time to time. A timer in the child would be simpler, but
// makes Linux count the time of the process in coarse ticks.
bool EndsInTime(pid_t child, int result, double processorSeconds,
                const std::function<bool()>& isStopped) {
    constexpr int milliseconds = 20;
    pollfd pipe = {result, POLLIN, 0};
    while (poll(&pipe, 1, milliseconds) <= 0) {
        if (ProcessorSeconds(child) > processorSeconds || isStopped()) { return false; }
    }
    return true;
}

std::string ProblemOf(int status) {
    const bool hasNoMemory = WIFEXITED(status) && WEXITSTATUS(status) == statusOutOfMemory;
    return hasNoMemory ? "out of memory" : System::HowEnded(status);
}

}  // namespace

double Outcome::OrFail(const std::string& text) const {
    if (!figure.has_value()) { throw std::runtime_error(text + ": " + problem); }
    return *figure;
}

Outcome InChild(const std::function<double()>& work, double processorSeconds,
                const std::function<bool()>& isStopped) {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) { throw std::system_error(errno, std::generic_category()); }
    const pid_t child = fork();
    if (child == 0) { BeChild(work, ends[1]); }
    const int error = errno;
    close(ends[1]);
    if (child < 0) {
        close(ends[0]);
        throw std::system_error(error, std::generic_category(), "no process for a replay");
    }
    const bool isCut = !EndsInTime(child, ends[0], processorSeconds, isStopped);
    if (isCut) { kill(child, SIGKILL); }
    const std::optional<double> figure = ReadFigure(ends[0]);
    close(ends[0]);
    int status = 0;
    while (waitpid(child, &status, 0) < 0 && errno == EINTR) {}
    if (figure.has_value() && status == 0) { return {figure, ""}; }
    if (isCut) { return {std::nullopt, isStopped() ? "stopped" : "too slow"}; }
    return {std::nullopt, ProblemOf(status)};
}

ForkedMeter::ForkedMeter(const Replay::Recording& replayed, Replay::Layer measured, double seconds,
                         double limit)
    : recording(replayed),
      layer(measured),
      mostSeconds(seconds),
      mostOfHeapTime(limit),
      start(std::chrono::steady_clock::now()) {
#ifdef __GLIBC__
    malloc_trim(0);  // The replays must not use memory that was freed after reading the trace.
#endif
    // The number is the same for all measurements, since the first replay in a process is slower
    // than the others.
    const Outcome one = Time(Malloc());
    const double length = one.figure.value_or(0) * static_cast<double>(recording.steps.size());
    if (length > 0) {
        numReplays = static_cast<unsigned int>(std::ceil(leastNanoseconds / length));
    }
}

Outcome ForkedMeter::Time(const Side& side) {
    return Run(side, [&](const Replay::Recording& replayed, Replay::Layer on) {
        double total = 0;
        for (unsigned int replay = 0; replay < numReplays; ++replay) {
            total += Replay::NanosecondsPerEvent(replayed, on);
        }
        // A plan has fewer steps for the same events.
        return total / numReplays * static_cast<double>(replayed.steps.size()) /
               static_cast<double>(recording.steps.size());
    });
}

Outcome ForkedMeter::Held(const Side& side) {
    return Run(side, [](const Replay::Recording& replayed, Replay::Layer on) {
        return static_cast<double>(Replay::BytesHeld(replayed, on));
    });
}

double ForkedMeter::Elapsed() const {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

bool ForkedMeter::IsStopped() const {
    return System::Interruption::Signal() != 0 || Elapsed() > mostSeconds;
}

Outcome ForkedMeter::Run(const Side& side, const Work& work) {
    const auto* const planned = std::get_if<Planned>(&side);
    const auto* const settings =
        planned != nullptr ? &planned->settings : std::get_if<OBR::MemPool::PoolSettings>(&side);
    const bool isHeap = std::holds_alternative<Malloc>(side);
    const Replay::Layer replayed = settings != nullptr ? layer
                                   : isHeap            ? Replay::Layer::System
                                                       : Replay::Layer::Mimalloc;
    const double before = Elapsed();
    Outcome outcome = InChild(
        [&] {
            if (settings != nullptr) { Replay::UsePools(*settings); }
            return work(planned != nullptr ? *planned->recording : recording, replayed);
        },
        isHeap ? limitOfHeap : std::max(leastLimit, mostOfHeapTime * heapSeconds),
        [this] { return IsStopped(); });
    if (isHeap) { heapSeconds = std::max(heapSeconds, Elapsed() - before); }
    return outcome;
}

}  // namespace Advise
