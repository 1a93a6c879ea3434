// Opens a trace of any form.

#ifndef OBR_TOOLS_TRACE_OPENTRACE_HPP
#define OBR_TOOLS_TRACE_OPENTRACE_HPP

#include <memory>
#include <string>

#include "trace/Event.hpp"
#include "trace/Input.hpp"

namespace Trace {

// Chooses the reader by the first bytes of the input.
std::unique_ptr<EventSource> MakeReader(Input input);

// Opens a file, plain or compressed by gzip; "-" is the standard input. Throws a
// std::runtime_error, whose text begins with the path, if the file cannot be read.
std::unique_ptr<EventSource> OpenTrace(const std::string& path);

}  // namespace Trace

#endif
