#include "mempool/Print.hpp"

#include <cstddef>
#include <cstdlib>
#include <string>

namespace Tool {

void PrintBadLines(std::ostream& out, const std::string& trace, const Trace::BadLines& bad) {
    out << "   Bad lines: " << bad.Total() << '\n';
    for (std::size_t fault = 0; fault < Trace::faultNames.size(); ++fault) {
        if (bad.numFaults[fault] == 0) { continue; }
        out << "      " << bad.numFaults[fault] << " x " << Trace::faultNames[fault] << '\n';
    }
    for (const Trace::BadLine& line : bad.first) {
        out << "   " << trace << ':' << line.number << ": "
            << Trace::faultNames[static_cast<std::size_t>(line.fault)] << '\n';
    }
    if (bad.Total() > bad.first.size()) { out << "   and more\n"; }
}

int WarnOfBrokenTrace(const Trace::StepReader& reader) {
    const std::string warning = reader.Warning();
    if (warning.empty()) { return EXIT_SUCCESS; }
    std::cerr << "mempool: " << warning << '\n';
    return EXIT_FAILURE;
}

}  // namespace Tool
