// What a recorded process did with its processor time, as facts of its trace.

#ifndef OBR_TOOLS_RECORD_TIMES_HPP
#define OBR_TOOLS_RECORD_TIMES_HPP

#include <sys/types.h>

#include <chrono>
#include <string>
#include <string_view>

#include "record/Channel.hpp"
#include "record/Ticks.hpp"
#include "trace/CompactWriter.hpp"

namespace Recorder {

// Measures the ticks per second while the program runs.
class TickRate {
public:
    double PerSecond() const {
        const std::chrono::duration<double> passed = std::chrono::steady_clock::now() - start;
        return static_cast<double>(Ticks() - startTicks) / passed.count();
    }

private:
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    std::uint64_t startTicks = Ticks();
};

// The processor time of one process, without its children.
struct ProcessorTime {
    // Reads the times of a process that has not been waited for. If it has been, they stay.
    void Renew(pid_t process);

    double seconds = 0;
    // The part of the time in which its first thread ran while it could have run. The rest of the
    // time another process had the processor.
    double partRunning = 1;
};

void WriteInfo(Trace::CompactWriter& writer, std::string_view key, const std::string& text);

// Writes the processor time, the estimated share of the allocation calls and its error, and the
// number of threads.
void WriteTimes(Trace::CompactWriter& writer, const Channel& channel, const ProcessorTime& time,
                const TickRate& rate);

}  // namespace Recorder

#endif
