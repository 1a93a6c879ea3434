// A trace as the tools read it: opened, resolved, its bad lines counted and its facts collected on
// the way.

#ifndef OBR_TOOLS_TRACE_STEPREADER_HPP
#define OBR_TOOLS_TRACE_STEPREADER_HPP

#include <array>
#include <cstdint>
#include <map>
#include <memory>
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
    // Opens the trace in the file; "-" is the standard input. See OpenTrace for its errors.
    explicit StepReader(const std::string& path);

    // For a trace from elsewhere, which messages call `traceName`.
    StepReader(std::unique_ptr<EventSource> events, std::string traceName);

    // Reads up to the next step; false at the end. A trace that ends without a good line is a
    // std::runtime_error: it is none.
    bool Next(Step& step);

    const std::string& Name() const { return name; }
    std::uint64_t Position() const { return source->Position(); }
    const Resolver& Blocks() const { return resolver; }
    Resolver& Blocks() { return resolver; }
    const BadLines& Bad() const { return badLines; }

    // What the trace tells about itself: keys and values of its Info events.
    const std::map<std::string, std::string>& Facts() const { return facts; }

    // Behind the end: a warning that the trace breaks off, or empty. All that came before is good.
    std::string Warning() const;

private:
    void AddBadLine(Fault fault);
    void CheckEnd() const;

    std::unique_ptr<EventSource> source;
    std::string name;
    Resolver resolver;
    BadLines badLines;
    std::map<std::string, std::string> facts;
    bool anyGood = false;
};

}  // namespace Trace

#endif
