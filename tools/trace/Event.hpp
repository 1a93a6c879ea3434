// An *event* is what a trace tells at one place: something happened to a pool or to a block, each
// named by its address. An *event source* gives them one after the other, whatever form the trace
// has.

#ifndef OBR_TOOLS_TRACE_EVENT_HPP
#define OBR_TOOLS_TRACE_EVENT_HPP

#include <cstdint>
#include <string>
#include <string_view>

namespace Trace {

enum class Kind : std::uint8_t {
    Created,    // A pool begins.
    Destroyed,  // A pool ends, with all that it holds.
    Allocated,
    Freed,
    Cleared,    // A pool drops all that it holds.
    Named,      // What a pool is called.
    Info,       // A fact about the whole recording.
    Malformed,  // It looks like an event but has no known form.
};

// Only the fields that its kind has mean anything. Both texts live until the next event is read.
struct Event {
    Kind kind = Kind::Malformed;
    std::uint64_t pool = 0;
    std::uint64_t block = 0;
    std::uint64_t size = 0;  // Bytes asked for. The largest number where 64 bits do not hold it.
    std::string_view key;    // Of Info, whose value is the text.
    std::string_view text;
};

class EventSource {
public:
    EventSource() = default;
    EventSource(const EventSource&) = delete;
    EventSource& operator=(const EventSource&) = delete;
    virtual ~EventSource() = default;

    // Reads the next event; false at the end, after which nothing more comes.
    virtual bool Next(Event& event) = 0;

    // Where the last event stands, for messages: the number of its line, from 1 on.
    virtual std::uint64_t Position() const = 0;

    // Behind the end: why it is not that of the whole trace, or empty if it is.
    virtual std::string Problem() const = 0;
};

}  // namespace Trace

#endif
