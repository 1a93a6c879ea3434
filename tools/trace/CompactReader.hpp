// Reads a trace in its compact form. A damaged trace is read up to the damage.

#ifndef OBR_TOOLS_TRACE_COMPACTREADER_HPP
#define OBR_TOOLS_TRACE_COMPACTREADER_HPP

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "trace/Event.hpp"
#include "trace/Input.hpp"

namespace Trace {

class CompactReader final : public EventSource {
public:
    // The input must begin with the magic.
    explicit CompactReader(Input bytes) : input(std::move(bytes)) {}

    bool Next(Event& event) override;
    // The line that `mempool text` prints for the event.
    std::uint64_t Position() const override { return number; }
    std::uint64_t Thread() const override { return thread; }
    std::string Problem() const override;

private:
    struct Owner {
        std::uint64_t pool;
        std::uint64_t thread;
    };

    bool ReadEvent(Event& event);
    bool ReadEntry(Event& event);
    bool NextChunk();
    bool HasAhead(std::size_t size);
    bool End(const char* why);

    bool Own(Event& event);
    bool Release(Event& event);

    std::uint64_t TakeNumber();
    std::string_view TakeText();
    void TakePool(std::uint8_t tag, Event& event);
    void TakeBlock(std::uint8_t tag, Event& event);

    Input input;
    std::vector<char> plain;  // The current chunk.
    std::string_view rest;    // Its entries that are not read yet.
    bool isSound = true;      // Whether all entries so far made sense.
    bool atStart = true;
    bool atEnd = false;
    const char* problem = "";
    std::uint64_t number = 0;

    std::vector<std::uint64_t> pools;  // Addresses, by index.
    std::uint64_t lastPool = 0;
    std::uint64_t lastBlock = 0;
    std::uint64_t thread = 0;

    bool isOwned = false;
    std::unordered_map<std::uint64_t, Owner> owners;  // Of live blocks, by address.
    std::uint64_t numForeignFrees = 0;
    std::string foreignFrees;   // The same as text.
    std::optional<Event> next;  // An event that was read already but comes after another one.
};

}  // namespace Trace

#endif
