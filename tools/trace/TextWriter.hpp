// Writes an event as a line of a trace.

#ifndef OBR_TOOLS_TRACE_TEXTWRITER_HPP
#define OBR_TOOLS_TRACE_TEXTWRITER_HPP

#include <cstdint>
#include <string>

#include "trace/Event.hpp"

namespace Trace {

// Appends the line with its end. A control character in a text becomes "?", since it could break
// the line. A Malformed event has no line.
void AppendLine(std::string& lines, const Event& event);

// Appends an address in the form of a line.
void AppendAddress(std::string& text, std::uint64_t address);

}  // namespace Trace

#endif
