// The form that all tables of the reports share, and the part that the two histograms share. What
// is set on the stream here stays set: right-justified, with a blank as fill.

#ifndef OBR_DIAGNOSTICS_TABLE_HPP
#define OBR_DIAGNOSTICS_TABLE_HPP

#include <cstdint>
#include <initializer_list>
#include <iosfwd>
#include <string>

namespace OBR::MemPool {

struct Column {
    const char* heading;
    int width;
};

// The line of headings and the rule below it. A blank follows each column, the last one too.
void WriteTableHead(std::ostream& stream, const std::string& indent,
                    std::initializer_list<Column> columns);

// A row's running number, filled on the left, and the blank behind it.
void WriteId(std::ostream& stream, std::uint32_t id, char fill);

// A histogram of data sizes: running number, size, frequency, and a bar of asterisks.
struct Histogram {
    int sizeWidth;
    int freqWidth;
    char idFill;

    void WriteHead(std::ostream& stream, const std::string& indent) const;

    // Leaves the line open behind the bar.
    void WriteRow(std::ostream& stream, const std::string& indent, std::uint32_t id,
                  std::uint32_t size, std::uint32_t frequency, std::uint32_t bar) const;
};

}  // namespace OBR::MemPool

#endif
