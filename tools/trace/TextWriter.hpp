// Writes an event as a line of a trace.

#ifndef OBR_TOOLS_TRACE_TEXTWRITER_HPP
#define OBR_TOOLS_TRACE_TEXTWRITER_HPP

#include <string>

#include "trace/Event.hpp"

namespace Trace {

// Appends the line, its end included. A control character in a text would break the line and stands
// as "?". A Malformed event has no line.
void AppendLine(std::string& lines, const Event& event);

}  // namespace Trace

#endif
