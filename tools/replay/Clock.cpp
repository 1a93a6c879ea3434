#include "replay/Clock.hpp"

#include <time.h>

namespace Replay {

double ProcessorNanoseconds() {
    timespec now;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return 1e9 * static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec);
}

}  // namespace Replay
