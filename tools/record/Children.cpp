#include "record/Children.hpp"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

namespace Recorder {

namespace {

constexpr std::size_t numReady = 32;

// The command line of a child.
std::string CommandOf(const Channel& channel) {
    std::string text(channel.command, sizeof(channel.command));
    text.erase(text.find_last_not_of('\0') + 1);
    std::replace(text.begin(), text.end(), '\0', ' ');
    return text;
}

}  // namespace

Child::Child(const Order& ofOrder, pid_t number)
    : order(ofOrder), pid(number), process(static_cast<int>(syscall(SYS_pidfd_open, number, 0))) {}

bool Child::HasEnded() const {
    pollfd one = {process.Number(), POLLIN, 0};
    return !process.IsOpen() || poll(&one, 1, 0) == 1;
}

bool Child::Drain(Channel& channel, bool atEnd) {
    time.Renew(pid);
    const std::uint64_t head = channel.head.load();
    if (channel.tail.load() == head) { return false; }
    if (recording == nullptr) {
        if (isLost) {
            channel.tail.store(head);
            return true;
        }
        isLost = true;
        command = CommandOf(channel);
        recording = std::make_unique<Recording>(order, order.tracePath + "." + std::to_string(pid),
                                                std::vector<std::string>(), command, channel);
        isLost = false;
    }
    NoteProgram(channel);
    return recording->Drain(atEnd);
}

bool Child::Finish(const Channel& channel, const TickRate& rate) {
    if (recording == nullptr) { return false; }
    NoteProgram(channel);
    recording->Finish(time, rate);
    recording->File().CommitBeside();
    return true;
}

void Child::Flush() {
    if (recording != nullptr) { recording->Flush(); }
}

// The program changes if the process executes another one. The last one names the trace.
void Child::NoteProgram(const Channel& channel) {
    const std::string now = CommandOf(channel);
    if (now != command) { recording->WriteProgram(command = now); }
}

Children::Children(const Order& ofOrder, Channel& ofProgram) : order(ofOrder), program(ofProgram) {
    Refill();
}

template <typename Step>
void Children::Try(Step step) {
    try {
        step();
    } catch (const System::Failure& first) {
        if (!failure.has_value()) { failure.emplace(first); }
    }
}

bool Children::Drain(const TickRate& rate, bool atEnd) {
    bool isAny = false;
    for (std::size_t index = 0; index != maxChildren; ++index) {
        ChildChannel& place = program.children[index];
        if (place.pid == 0) { continue; }
        std::optional<SharedChannel>& channel = channels[index];
        std::optional<Child>& child = children[index];
        if (!child.has_value()) { child.emplace(order, place.pid.load()); }
        const bool hasEnded = child->HasEnded();
        bool isDrained = false;
        Try([&] { isDrained = child->Drain(**channel, hasEnded); });
        isAny |= isDrained;
        if (!atEnd && (isDrained || !hasEnded)) { continue; }
        Try([&] { number += child->Finish(**channel, rate) ? 1 : 0; });
        child.reset();
        place.descriptor = 0;
        channel.reset();
        place.pid = 0;
    }
    Refill();
    return isAny;
}

void Children::Flush() {
    for (std::optional<Child>& child : children) {
        if (child.has_value()) { child->Flush(); }
    }
}

void Children::Check() const {
    if (failure.has_value()) { throw System::Failure(*failure); }
}

// Makes channels until enough are ready. If one cannot be made, there may be room later.
void Children::Refill() {
    if (!order.children) { return; }
    std::size_t ready = 0;
    for (std::size_t index = 0; index != maxChildren && ready != numReady; ++index) {
        ChildChannel& place = program.children[index];
        if (place.pid != 0) { continue; }
        if (!channels[index].has_value()) {
            try {
                channels[index].emplace(order);
            } catch (const System::Failure&) { return; }
            place.descriptor = channels[index]->Number();
        }
        ++ready;
    }
}

}  // namespace Recorder
