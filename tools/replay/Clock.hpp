// The clock of all measurements, in a file of its own so that a test can link another one.

#ifndef OBR_TOOLS_REPLAY_CLOCK_HPP
#define OBR_TOOLS_REPLAY_CLOCK_HPP

namespace Replay {

// The processor time of this process, which other programs on the machine do not affect.
double ProcessorNanoseconds();

}  // namespace Replay

#endif
