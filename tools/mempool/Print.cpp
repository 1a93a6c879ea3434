#include "mempool/Print.hpp"

#include <cstddef>
#include <cstdint>

namespace Tool {

void PrintBadLines(std::ostream& out, const std::string& path, const Replay::Recording& recording) {
    std::uint64_t total = 0;
    for (const std::uint64_t number : recording.numFaults) { total += number; }
    out << "   Bad lines: " << total << '\n';
    for (std::size_t fault = 0; fault < Trace::faultNames.size(); ++fault) {
        if (recording.numFaults[fault] == 0) { continue; }
        out << "      " << recording.numFaults[fault] << " x " << Trace::faultNames[fault] << '\n';
    }
    for (const Replay::BadLine& line : recording.badLines) {
        out << "   " << path << ':' << line.number << ": "
            << Trace::faultNames[static_cast<std::size_t>(line.fault)] << '\n';
    }
    if (total > recording.badLines.size()) { out << "   and more\n"; }
}

}  // namespace Tool
