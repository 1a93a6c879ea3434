#include "record/Times.hpp"

#include <algorithm>
#include <cstdint>
#include <ctime>
#include <iomanip>
#include <sstream>

namespace Recorder {

namespace {

std::string Text(double number) {
    std::ostringstream text;
    text << std::fixed << std::setprecision(6) << number;
    return text.str();
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

}  // namespace

void ProcessorTime::Renew(pid_t process) {
    clockid_t clock = {};
    timespec time = {};
    if (clock_getcpuclockid(process, &clock) != 0 || clock_gettime(clock, &time) != 0) { return; }
    seconds = static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

void WriteInfo(Trace::CompactWriter& writer, std::string_view key, const std::string& text) {
    writer.Write({Trace::Kind::Info, 0, 0, 0, key, text});
}

// The recorder's part of the processor time is subtracted. It is only an estimate, so at most half
// of the whole is subtracted. The share is left out if there are too few samples for it.
void WriteTimes(Trace::CompactWriter& writer, const Channel& channel, const ProcessorTime& time,
                const TickRate& rate) {
    const double whole = time.seconds;
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

}  // namespace Recorder
