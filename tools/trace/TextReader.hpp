// Reads a trace of lines. A program writes them among other output, so a line without the mark is
// ignored, and so is what precedes the mark. A line takes a few MiB of memory at most.

#ifndef OBR_TOOLS_TRACE_TEXTREADER_HPP
#define OBR_TOOLS_TRACE_TEXTREADER_HPP

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "trace/Event.hpp"
#include "trace/Input.hpp"

namespace Trace {

class TextReader final : public EventSource {
public:
    explicit TextReader(Input bytes) : input(std::move(bytes)) {}

    bool Next(Event& event) override;
    std::uint64_t Position() const override { return number; }
    std::string Problem() const override { return input.Problem(); }

private:
    bool NextLine(std::string_view& line);
    void Shorten();

    Input input;
    std::size_t lineSize = 0;  // Bytes of the last line with its end, not skipped yet.
    bool isTooLong = false;    // Whether the last line is too long; its bytes are dropped.
    std::uint64_t number = 0;  // Of the last line.
};

}  // namespace Trace

#endif
