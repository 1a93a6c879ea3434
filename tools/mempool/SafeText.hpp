// Makes the texts of a trace safe to print. A trace cannot be trusted: a name in it could contain
// an escape sequence for the terminal.

#ifndef OBR_TOOLS_MEMPOOL_SAFETEXT_HPP
#define OBR_TOOLS_MEMPOOL_SAFETEXT_HPP

#include <string>

namespace Tool {

// The text in UTF-8, with control characters as in JSON, and the replacement character for bytes
// that are not UTF-8.
std::string SafeText(const std::string& text);

}  // namespace Tool

#endif
