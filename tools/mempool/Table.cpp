#include "mempool/Table.hpp"

#include <algorithm>
#include <ostream>
#include <sstream>
#include <stdexcept>
#include <utility>

namespace Tool {

namespace {

constexpr const char* indent = "   ";
constexpr const char* separator = "  ";

// Columns of a terminal, as fmt counts them: fewer than bytes where a character has several.
std::size_t Width(const std::string& text) {
    const std::size_t padded = fmt::formatted_size("{:{}}", text, text.size());
    return text.size() - (padded - text.size());
}

std::vector<std::string> Lines(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) { lines.push_back(line); }
    return lines;
}

}  // namespace

Table::Table(std::vector<Column> list) : columns(std::move(list)) {
    std::vector<std::vector<std::string>> headings;  // Of each column, its lines.
    std::size_t numLines = 0;
    for (const Column& column : columns) {
        headings.push_back(Lines(column.heading));
        numLines = std::max(numLines, headings.back().size());
    }
    for (std::size_t line = 0; line < numLines; ++line) {
        std::vector<std::string> cells;
        for (const std::vector<std::string>& heading : headings) {
            const std::size_t skipped = numLines - heading.size();  // It is on the last lines.
            cells.push_back(line < skipped ? "" : heading[line - skipped]);
        }
        AddCells(std::move(cells));
    }
}

void Table::AddCells(std::vector<std::string> cells) {
    if (cells.size() > columns.size()) { throw std::out_of_range("a row with too many cells"); }
    for (std::size_t i = 0; i < cells.size(); ++i) {
        columns[i].width = std::max(columns[i].width, Width(cells[i]));
    }
    rows.push_back(std::move(cells));
}

void Table::Write(std::ostream& out) const {
    for (const std::vector<std::string>& row : rows) {
        std::string line;
        for (std::size_t i = 0; i < row.size(); ++i) {
            line += i == 0 ? indent : separator;
            const Column& column = columns[i];
            line += column.align == Align::Left ? fmt::format("{:<{}}", row[i], column.width)
                                                : fmt::format("{:>{}}", row[i], column.width);
        }
        out << line.substr(0, line.find_last_not_of(' ') + 1) << '\n';
    }
}

}  // namespace Tool
