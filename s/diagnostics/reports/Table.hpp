// A table of a report: one list of columns determines the headings, the rule below them and the
// rows. It leaves the stream right-justified, with a blank as fill.

#ifndef OBR_DIAGNOSTICS_TABLE_HPP
#define OBR_DIAGNOSTICS_TABLE_HPP

#include <cstddef>
#include <cstdint>
#include <iomanip>
#include <ostream>
#include <string>

#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool {

// A value wider than its column is written whole and shifts the rest of its row.
struct Column {
    const char* heading;
    int width;
    char fill = ' ';  // Before a row's value.
};

// Values with a format of their own.
struct Percentage {
    double value;
};
struct Bar {
    std::uint32_t length;
    bool isCut = false;  // It stands for more than its length.
};

template <std::size_t numColumns>
class Table {
public:
    using Columns = Column[numColumns];

    // Writes the headings. Each row ends with `atEnd`.
    Table(std::ostream& output, std::uint32_t level, const Columns& list, const char* atEnd = " ")
        : stream(output), indent(Indent(level)), columns(list), rowEnd(atEnd) {
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

    // Writes a row: a value for each column.
    template <typename... Values>
    void WriteRow(const Values&... values) const {
        static_assert(sizeof...(Values) == numColumns, "A row has one value per column.");
        const Column* column = columns;
        const char* separator = indent.c_str();
        const auto write = [&](const auto& value) {
            stream << separator << std::setfill(column->fill);
            Write(column->width, value);
            stream << std::setfill(' ');
            separator = " ";
            ++column;
        };
        (write(values), ...);
        stream << rowEnd << std::endl;
    }

private:
    template <typename Value>
    void Write(int width, const Value& value) const {
        stream << std::setw(width) << value;
    }
    void Write(int width, const Percentage& percentage) const {
        stream << std::fixed << std::setprecision(3) << std::setw(width - 1) << percentage.value
               << "%";
    }
    void Write(int, const Bar& bar) const {
        stream << std::setfill('*') << std::setw(static_cast<int>(bar.length)) << "*"
               << (bar.isCut ? "+" : "");
    }

    std::ostream& stream;
    const std::string indent;
    const Columns& columns;
    const char* const rowEnd;
};

}  // namespace OBR::MemPool

#endif
