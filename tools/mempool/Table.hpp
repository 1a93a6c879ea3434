// A table of text: one list of columns determines the headings and the form of the rows.

#ifndef OBR_TOOLS_MEMPOOL_TABLE_HPP
#define OBR_TOOLS_MEMPOOL_TABLE_HPP

#include <cstddef>
#include <cstdint>
#include <iosfwd>
#include <string>
#include <vector>

#include <fmt/format.h>

namespace Tool {

enum class Align : std::uint8_t { Right, Left };

struct Column {
    std::string heading;    // A newline in it begins a second line.
    std::size_t width = 0;  // The minimum; the column is as wide as its widest cell.
    Align align = Align::Right;
};

class Table {
public:
    explicit Table(std::vector<Column> list);

    // Adds a row of a value for each column, formatted as fmt does by default.
    template <typename... Values>
    void AddRow(const Values&... values) {
        AddCells({fmt::format("{}", values)...});
    }

    // Missing cells at the end are empty. Throws std::out_of_range if there are more cells than
    // columns.
    void AddCells(std::vector<std::string> cells);

    // Writes the headings, if there are any, and the rows, without blanks at the ends of lines.
    void Write(std::ostream& out) const;

private:
    std::vector<Column> columns;
    std::vector<std::vector<std::string>> rows;  // The headings are the first ones.
};

}  // namespace Tool

#endif
