// The numbers in environment variables of a checked run.

#ifndef OBR_DIAGNOSTICS_VARIABLES_HPP
#define OBR_DIAGNOSTICS_VARIABLES_HPP

namespace OBR::MemPool::Checked {

// The value of a variable that is a number from `least` to `most`; `otherwise` if it is not set. If
// it is anything else, a line on standard error says so, and `otherwise` counts.
int NumberOf(const char* variable, int least, int most, int otherwise);

}  // namespace OBR::MemPool::Checked

#endif
