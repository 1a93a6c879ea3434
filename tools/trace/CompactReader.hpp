// Reads a trace in its compact form. A damaged one is read as far as it goes.

#ifndef OBR_TOOLS_TRACE_COMPACTREADER_HPP
#define OBR_TOOLS_TRACE_COMPACTREADER_HPP

#include <cstdint>
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
    // The input begins with the magic.
    explicit CompactReader(Input bytes) : input(std::move(bytes)) {}

    bool Next(Event& event) override;
    std::uint64_t Position() const override { return number; }  // As in the trace's text.
    std::string Problem() const override;

private:
    struct Owner {
        std::uint64_t pool;
        std::uint64_t thread;
    };

    bool ReadEvent(Event& event);
    bool ReadRecord(Event& event);
    bool NextBlock();
    bool HasAhead(std::size_t size);
    bool End(const char* why);

    bool Own(Event& event);
    bool Release(Event& event);

    std::uint64_t TakeNumber();
    std::string_view TakeText();
    void TakePool(std::uint8_t tag, Event& event);
    void TakeBlock(std::uint8_t tag, Event& event);

    Input input;
    std::vector<char> plain;  // The block that is read.
    std::string_view rest;    // What is still to be read of it.
    bool isSound = true;      // No record of it was cut.
    bool atStart = true;
    bool atEnd = false;
    const char* problem = "";
    std::uint64_t number = 0;

    std::vector<std::uint64_t> pools;  // Their addresses, by their indices.
    std::uint64_t lastPool = 0;
    std::uint64_t lastBlock = 0;
    std::uint64_t thread = 0;

    bool isOwned = false;
    std::unordered_map<std::uint64_t, Owner> owners;  // Of the blocks that live.
    std::uint64_t numForeignFrees = 0;
    std::string foreignFrees;  // Its text.
    Event kept;                // An event that another one had to go ahead of.
    bool hasKept = false;
};

}  // namespace Trace

#endif
