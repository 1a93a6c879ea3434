// Texts of a trace on their way to a terminal. A trace comes from anywhere, and what is called a
// name there could be a command to the terminal.

#ifndef OBR_TOOLS_MEMPOOL_SAFETEXT_HPP
#define OBR_TOOLS_MEMPOOL_SAFETEXT_HPP

#include <string>

namespace Tool {

// The text in UTF-8 with escapes as of JSON in place of control characters, and the sign for it
// where it is no UTF-8.
std::string SafeText(const std::string& text);

}  // namespace Tool

#endif
