#include "record/Times.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <fstream>
#include <iomanip>
#include <sstream>

namespace Recorder {

namespace {

std::string Text(double number) {
    std::ostringstream text;
    text << std::fixed << std::setprecision(6) << number;
    return text.str();
}

// The ticks of the samples, without those of the timer.
double TicksWithoutTimer(const Channel& channel, const Samples& samples) {
    const auto timer = static_cast<double>(channel.timerTicks.load()) / numCalibrationEvents;
    const auto number = static_cast<double>(samples.number.load());
    return std::max(static_cast<double>(samples.ticks.load()) - number * timer, 0.0);
}

// The time of all calls for small blocks, from those that were timed, and twice its standard error.
// A call that takes longer than `limit` was interrupted: it counts with the mean of the others.
struct SmallCalls {
    SmallCalls(const Channel& channel, double limit) {
        double numUsed = 0;
        double squares = 0;
        for (std::size_t length = 0; length != numSampleLengths; ++length) {
            const auto inLength = static_cast<double>(channel.samples[length].number.load());
            number += inLength;
            if (inLength == 0 || std::ldexp(1, static_cast<int>(length)) > limit) { continue; }
            const auto sum = static_cast<double>(channel.samples[length].ticks.load());
            numUsed += inLength;
            ticks += sum;
            squares += sum * sum / inLength;
        }
        if (numUsed == 0) { return; }
        const auto timer = static_cast<double>(channel.timerTicks.load()) / numCalibrationEvents;
        const double all = samplePeriod * number / numUsed;
        ticks = std::max(ticks - numUsed * timer, 0.0) * all;
        error = 2 * std::sqrt(squares) * all;
    }

    double number = 0;
    double ticks = 0;
    double error = 0;
};

}  // namespace

void ProcessorTime::Renew(pid_t process) {
    clockid_t clock = {};
    timespec time = {};
    if (clock_getcpuclockid(process, &clock) != 0 || clock_gettime(clock, &time) != 0) { return; }
    const double now = static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
    if (now == seconds) { return; }
    seconds = now;
    double running = 0;
    double waiting = 0;
    std::ifstream("/proc/" + std::to_string(process) + "/schedstat") >> running >> waiting;
    if (running > 0) { partRunning = running / (running + waiting); }
}

void WriteInfo(Trace::CompactWriter& writer, std::string_view key, const std::string& text) {
    writer.Write({Trace::Kind::Info, 0, 0, 0, key, text});
}

// The recorder's part of the processor time is subtracted. It is only an estimate, so at most half
// of the whole is subtracted. The share is left out if there are too few samples for it.
void WriteTimes(Trace::CompactWriter& writer, const Channel& channel, const ProcessorTime& time,
                const TickRate& rate) {
    constexpr double leastCalls = 200;
    constexpr double leastSeconds = 0.01;
    constexpr double interrupted = 30e-6;
    // In the program an event takes longer than where it was measured: the program's
    // memory and the recorder's drive each other out of the caches.
    constexpr double eventCost = 1.5;
    // The share of the same calls differs by as much between two runs of a program.
    constexpr double leastError = 0.25;
    const double perSecond = rate.PerSecond();
    const double numEvents = static_cast<double>(channel.head.load()) / numCalibrationEvents;
    const double events = static_cast<double>(channel.eventTicks.load()) * numEvents / perSecond;
    const double walks = samplePeriod * TicksWithoutTimer(channel, channel.walks) / perSecond;
    const double unwinding = static_cast<double>(channel.unwindNanoseconds.load()) / 1e9;
    const double recorder = eventCost * events + walks + unwinding;
    const double errorOfRecorder = (recorder - unwinding) / 2;  // How far off it can be.
    const double whole = time.seconds;
    const double own = std::max(whole - recorder, whole / 2);
    if (whole > 0) { WriteInfo(writer, "cpu_seconds", Text(own)); }
    const SmallCalls small(channel, interrupted * perSecond);
    if (small.number >= leastCalls && whole >= leastSeconds) {
        const double large = static_cast<double>(channel.large.ticks.load()) / perSecond;
        const double inside = small.ticks / perSecond + large * time.partRunning;
        const double waiting = large * (1 - time.partRunning);
        const double share = std::min(inside / own, 1.0);
        const double error = std::hypot((small.error / perSecond + waiting) / own,
                                        share * errorOfRecorder / own, share * leastError);
        WriteInfo(writer, "allocation_share", Text(share));
        WriteInfo(writer, "allocation_share_error", Text(error));
    }
    WriteInfo(writer, "threads", std::to_string(channel.numThreads));
}

}  // namespace Recorder
