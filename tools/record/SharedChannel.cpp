#include "record/SharedChannel.hpp"

#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "system/ExitStatus.hpp"

namespace Recorder {

namespace {

[[noreturn]] void Fail(const std::string& what) {
    throw System::Failure(System::ownFailure, what, errno);
}

void Skip(Channel& channel, const std::vector<std::string>& patterns) {
    std::size_t used = 0;
    for (const std::string& pattern : patterns) {
        const std::size_t size = pattern.size() + 1;
        if (used + size >= sizeof(channel.skipped)) {
            throw System::Failure(System::ownFailure, "--skip: the patterns are too long");
        }
        std::memcpy(channel.skipped + used, pattern.c_str(), size);
        used += size;
    }
}

}  // namespace

SharedChannel::SharedChannel(const Order& order)
    : descriptor(memfd_create("mempool-record", MFD_CLOEXEC)) {
    if (!descriptor.IsOpen() || ftruncate(descriptor.Number(), sizeof(Channel)) != 0) {
        Fail("shared memory");
    }
    void* const memory =
        mmap(nullptr, sizeof(Channel), PROT_READ | PROT_WRITE, MAP_SHARED, descriptor.Number(), 0);
    if (memory == MAP_FAILED) { Fail("shared memory"); }
    channel = static_cast<Channel*>(memory);
    channel->magic = channelMagic;
    channel->parentPid = getpid();
    channel->by = order.by;
    channel->depth = order.by == By::Stack ? order.depth : maxDepth;
    channel->recordsChildren = order.children ? 1 : 0;
    Skip(*channel, order.skipped);
}

SharedChannel::~SharedChannel() {
    if (channel != nullptr) { munmap(channel, sizeof(Channel)); }
}

}  // namespace Recorder
