// Finds the caller of an allocation, the first return address outside of the run-time libraries of
// C and C++, or its whole stack.

#ifndef OBR_TOOLS_RECORD_CALLERS_HPP
#define OBR_TOOLS_RECORD_CALLERS_HPP

#include <cstdint>

#include "record/Channel.hpp"

namespace Recorder {

// The index into the channel's callers or stacks. The function that is called was entered from
// `returnAddress`, with `frame` as its canonical frame address.
std::uint64_t FindGroup(Channel& channel, const void* returnAddress, const void* frame);

}  // namespace Recorder

#endif
