// What a user stops before it is done.

#ifndef OBR_TOOLS_SYSTEM_INTERRUPTION_HPP
#define OBR_TOOLS_SYSTEM_INTERRUPTION_HPP

#include <signal.h>

namespace System {

// While this lives, SIGINT and SIGTERM do not end this process but are noted. There is one at a
// time.
class Interruption {
public:
    Interruption();
    Interruption(const Interruption&) = delete;
    Interruption& operator=(const Interruption&) = delete;
    ~Interruption();

    // The last of these signals since then, 0 for none.
    static int Signal();

private:
    struct sigaction formerInterrupt = {};
    struct sigaction formerTerminate = {};
};

}  // namespace System

#endif
