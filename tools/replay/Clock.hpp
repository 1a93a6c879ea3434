// The clock of all measurements. It stands in a file of its own so that a test can link another.

#ifndef OBR_TOOLS_REPLAY_CLOCK_HPP
#define OBR_TOOLS_REPLAY_CLOCK_HPP

namespace Replay {

// Time that the processor has spent on this program: others on the machine do not count.
double ProcessorNanoseconds();

}  // namespace Replay

#endif
