// How the common parts of the tables are written.

#include "diagnostics/reports/Table.hpp"

#include <iomanip>
#include <ostream>

namespace OBR::MemPool {

void WriteTableHead(std::ostream& stream, const std::string& indent,
                    std::initializer_list<Column> columns) {
    stream << std::left << indent;
    for (const Column& column : columns) {
        stream << std::setw(column.width) << column.heading << " ";
    }
    stream << std::endl;

    stream << std::right << std::setfill('=') << indent;
    for (const Column& column : columns) {
        stream << std::setw(column.width) << "="
               << " ";
    }
    stream << std::setfill(' ') << std::endl;
}

void WriteId(std::ostream& stream, std::uint32_t id, char fill) {
    stream << std::setfill(fill) << std::setw(5) << id << std::setfill(' ') << " ";
}

void Histogram::WriteHead(std::ostream& stream, const std::string& indent) const {
    WriteTableHead(stream, indent,
                   {{"Id", 5}, {"Size", sizeWidth}, {"Freq", freqWidth}, {"Magnitude", 50}});
}

void Histogram::WriteRow(std::ostream& stream, const std::string& indent, std::uint32_t id,
                         std::uint32_t size, std::uint32_t frequency, std::uint32_t bar) const {
    stream << indent;
    WriteId(stream, id, idFill);
    stream << std::setw(sizeWidth) << size << " " << std::setw(freqWidth) << frequency << " ";
    stream << std::setfill('*') << std::setw(static_cast<int>(bar)) << "*" << std::setfill(' ');
}

}  // namespace OBR::MemPool
