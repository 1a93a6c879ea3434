// An *event* says what happened to a pool or to a block, each identified by its address. An *event
// source* reads the events of a trace in order, whatever the form of the trace.

#ifndef OBR_TOOLS_TRACE_EVENT_HPP
#define OBR_TOOLS_TRACE_EVENT_HPP

#include <cstdint>
#include <string>
#include <string_view>

namespace Trace {

// No switch over the kinds has a `default`, so that a new kind does not compile until every reader
// has decided what to do with it. tools/README.md lists the files.
enum class Kind : std::uint8_t {
    Created,    // A pool is created.
    Destroyed,  // A pool is destroyed, with all its blocks.
    Allocated,
    Freed,
    Cleared,    // A pool drops all its blocks.
    Named,      // The name of a pool.
    Info,       // A fact about the whole recording.
    Time,       // When the events that follow happened.
    Malformed,  // A line that begins like an event but has no known form. Must be the last kind.
};

// Only the fields of its kind are set. Both texts live until the next event is read.
struct Event {
    Kind kind = Kind::Malformed;
    std::uint64_t pool = 0;
    std::uint64_t block = 0;
    std::uint64_t size = 0;  // Requested bytes; the largest number if they need more than 64 bits.
                             // Of Time, milliseconds since the recording began.
    std::string_view key;    // Of Info; its value is in `text`.
    std::string_view text;
};

class EventSource {
public:
    EventSource() = default;
    EventSource(const EventSource&) = delete;
    EventSource& operator=(const EventSource&) = delete;
    virtual ~EventSource() = default;

    // Reads the next event; false at the end.
    virtual bool Next(Event& event) = 0;

    // The line number of the last event, from 1 on, for messages.
    virtual std::uint64_t Position() const = 0;

    // The number of the thread of the last event, or 0 if the trace does not have it.
    virtual std::uint64_t Thread() const { return 0; }

    // After the end: why the trace is not complete, or empty if it is.
    virtual std::string Problem() const = 0;

    // The same as a message for the user.
    std::string Warning() const {
        const std::string problem = Problem();
        return problem.empty() ? "" : problem + "; the events before that were read";
    }
};

}  // namespace Trace

#endif
