// Opens a trace in whatever form it has.

#ifndef OBR_TOOLS_TRACE_OPENTRACE_HPP
#define OBR_TOOLS_TRACE_OPENTRACE_HPP

#include <memory>
#include <string>

#include "trace/Event.hpp"
#include "trace/Input.hpp"

namespace Trace {

// Chooses the reader by the first bytes.
std::unique_ptr<EventSource> MakeReader(Input input);

// The trace in the file, plain or compressed; "-" is the standard input. A file that cannot be read
// at all is a std::runtime_error, whose text begins with the path.
std::unique_ptr<EventSource> OpenTrace(const std::string& path);

}  // namespace Trace

#endif
