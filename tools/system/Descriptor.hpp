// A file descriptor and its owner.

#ifndef OBR_TOOLS_SYSTEM_DESCRIPTOR_HPP
#define OBR_TOOLS_SYSTEM_DESCRIPTOR_HPP

#include <unistd.h>

#include <utility>

namespace System {

class Descriptor {
public:
    // A negative number stands for no file.
    explicit Descriptor(int number) : descriptor(number) {}
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    ~Descriptor() { Close(); }

    int Number() const { return descriptor; }
    bool IsOpen() const { return descriptor >= 0; }
    int Close() { return IsOpen() ? close(std::exchange(descriptor, -1)) : 0; }

private:
    int descriptor;
};

}  // namespace System

#endif
