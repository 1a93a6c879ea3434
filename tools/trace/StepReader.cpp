// Counts bad lines, collects facts, and finds out whether the input is a trace at all.

#include "trace/StepReader.hpp"

#include <cstddef>
#include <numeric>
#include <stdexcept>
#include <utility>

#include "trace/OpenTrace.hpp"

namespace Trace {

std::uint64_t BadLines::Total() const {
    return std::accumulate(numFaults.begin(), numFaults.end(), std::uint64_t{0});
}

StepReader::StepReader(const std::string& path)
    : StepReader(OpenTrace(path), path == "-" ? "standard input" : path) {}

StepReader::StepReader(std::unique_ptr<EventSource> events, std::string traceName)
    : source(std::move(events)), name(std::move(traceName)) {}

bool StepReader::Next(Step& step) {
    Event event;
    while (source->Next(event)) {
        if (const auto fault = resolver.Resolve(event, step)) {
            AddBadLine(*fault);
            continue;
        }
        anyGood = true;
        if (step.kind == Kind::Info) {
            facts[std::string(event.key)] = event.text;
        } else if (step.kind == Kind::Time) {
            milliseconds = event.size;
        } else {
            return true;
        }
    }
    CheckEnd();
    return false;
}

std::string StepReader::Warning() const {
    const std::string warning = source->Warning();
    return warning.empty() ? "" : name + ": " + warning;
}

void StepReader::AddBadLine(Fault fault) {
    constexpr std::size_t maxShown = 5;
    ++badLines.numFaults[static_cast<std::size_t>(fault)];
    if (badLines.first.size() < maxShown) { badLines.first.push_back({source->Position(), fault}); }
}

void StepReader::CheckEnd() const {
    if (anyGood) { return; }
    std::string reason = source->Problem();
    if (!badLines.first.empty()) {
        const BadLine& line = badLines.first.front();
        reason = "no good trace line; line " + std::to_string(line.number) + ": " +
                 faultNames[static_cast<std::size_t>(line.fault)];
    } else if (reason.empty()) {
        reason = "not a trace";
    }
    throw std::runtime_error(name + ": " + reason);
}

}  // namespace Trace
