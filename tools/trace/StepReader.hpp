// Reads a trace for the tools: resolves events to steps, counts bad lines, and collects facts.

#ifndef OBR_TOOLS_TRACE_STEPREADER_HPP
#define OBR_TOOLS_TRACE_STEPREADER_HPP

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "trace/Event.hpp"
#include "trace/Resolver.hpp"

namespace Trace {

struct BadLine {
    std::uint64_t number;
    Fault fault;
};

struct BadLines {
    std::array<std::uint64_t, faultNames.size()> numFaults = {};
    std::vector<BadLine> first;

    std::uint64_t Total() const;
};

class StepReader {
public:
    // Opens a file as OpenTrace does.
    explicit StepReader(const std::string& path);

    // Messages call the trace `traceName`.
    StepReader(std::unique_ptr<EventSource> events, std::string traceName);

    // Reads the next step, never an Info or a Time; false at the end. Throws std::runtime_error if
    // the input has no valid line at all: it is not a trace.
    bool Next(Step& step);

    const std::string& Name() const { return name; }
    std::uint64_t Position() const { return source->Position(); }
    std::uint64_t Thread() const { return source->Thread(); }

    // When the last step happened, since the recording began. Empty if the trace does not say it.
    std::optional<std::uint64_t> Milliseconds() const { return milliseconds; }

    const Resolver& Blocks() const { return resolver; }
    Resolver& Blocks() { return resolver; }
    const BadLines& Bad() const { return badLines; }

    // Keys and values of the Info events.
    const std::map<std::string, std::string>& Facts() const { return facts; }

    // After the end: a warning if the trace is incomplete, else empty. The steps read are valid.
    std::string Warning() const;

private:
    void AddBadLine(Fault fault);
    void CheckEnd() const;

    std::unique_ptr<EventSource> source;
    std::string name;
    Resolver resolver;
    BadLines badLines;
    std::map<std::string, std::string> facts;
    std::optional<std::uint64_t> milliseconds;
    bool anyGood = false;
};

}  // namespace Trace

#endif
