// The environment variables of the checked library that are numbers.

#ifndef OBR_DIAGNOSTICS_VARIABLES_HPP
#define OBR_DIAGNOSTICS_VARIABLES_HPP

namespace OBR::MemPool::Checked {

// The value of a variable, a number from `least` to `most`; `otherwise` if it is not set. Any other
// value is reported on standard error, and `otherwise` is returned.
int NumberOf(const char* variable, int least, int most, int otherwise);

}  // namespace OBR::MemPool::Checked

#endif
