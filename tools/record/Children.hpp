// The child processes that are recorded, each into a trace of its own.

#ifndef OBR_TOOLS_RECORD_CHILDREN_HPP
#define OBR_TOOLS_RECORD_CHILDREN_HPP

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "record/Order.hpp"
#include "record/Recording.hpp"
#include "record/SharedChannel.hpp"
#include "record/Times.hpp"
#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"

namespace Recorder {

// A child process. Nothing is written for it before its first event.
class Child {
public:
    Child(const Order& ofOrder, pid_t number);

    bool HasEnded() const;

    // Drains the channel. Throws a System::Failure if the trace cannot be written; later calls
    // then drop the events.
    bool Drain(Channel& channel, bool atEnd);

    // Returns whether there is a trace.
    bool Finish(const Channel& channel, const TickRate& rate);

    void Flush();

private:
    void NoteProgram(const Channel& channel);

    const Order& order;
    const pid_t pid;
    const System::Descriptor process;
    std::unique_ptr<Recording> recording;
    std::string command;
    ProcessorTime time;
    bool isLost = false;
};

// Keeps channels ready in that of the program, and drains those that children have taken.
class Children {
public:
    Children(const Order& ofOrder, Channel& ofProgram);

    // Drains all channels. Those of processes that have ended are finished, or all of them.
    bool Drain(const TickRate& rate, bool atEnd);

    void Flush();
    bool AreRecorded() const { return order.children; }
    std::uint64_t Number() const { return number; }

    // Throws the first failure.
    void Check() const;

private:
    template <typename Step>
    void Try(Step step);
    void Refill();

    const Order& order;
    Channel& program;
    std::array<std::optional<SharedChannel>, maxChildren> channels;
    std::array<std::optional<Child>, maxChildren> children;
    std::optional<System::Failure> failure;
    std::uint64_t number = 0;
};

}  // namespace Recorder

#endif
