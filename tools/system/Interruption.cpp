#include "system/Interruption.hpp"

#include <csignal>

namespace System {

namespace {

volatile std::sig_atomic_t last = 0;

}  // namespace

Interruption::Interruption() {
    last = 0;
    struct sigaction note = {};
    note.sa_handler = [](int number) { last = number; };
    sigaction(SIGINT, &note, &formerInterrupt);
    sigaction(SIGTERM, &note, &formerTerminate);
}

Interruption::~Interruption() {
    sigaction(SIGINT, &formerInterrupt, nullptr);
    sigaction(SIGTERM, &formerTerminate, nullptr);
}

int Interruption::Signal() {
    return last;
}

}  // namespace System
