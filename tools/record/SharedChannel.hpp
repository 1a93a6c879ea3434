// The channel's memory, which has no name and is released with its last user.

#ifndef OBR_TOOLS_RECORD_SHAREDCHANNEL_HPP
#define OBR_TOOLS_RECORD_SHAREDCHANNEL_HPP

#include "record/Channel.hpp"
#include "record/Order.hpp"
#include "system/Descriptor.hpp"

namespace Recorder {

class SharedChannel {
public:
    // Throws a System::Failure if there is no memory, or if the patterns to skip are too long.
    explicit SharedChannel(const Order& order);
    SharedChannel(const SharedChannel&) = delete;
    SharedChannel& operator=(const SharedChannel&) = delete;
    ~SharedChannel();

    Channel& operator*() const { return *channel; }
    Channel* operator->() const { return channel; }
    int Number() const { return descriptor.Number(); }

private:
    System::Descriptor descriptor;
    Channel* channel = nullptr;
};

}  // namespace Recorder

#endif
