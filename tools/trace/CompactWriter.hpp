// Writes a trace in its compact form, with little memory however long the trace is.

#ifndef OBR_TOOLS_TRACE_COMPACTWRITER_HPP
#define OBR_TOOLS_TRACE_COMPACTWRITER_HPP

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <unordered_map>
#include <vector>

#include <zstd.h>

#include "trace/CompactForm.hpp"
#include "trace/Event.hpp"

namespace Trace {

class CompactWriter {
public:
    // Takes the bytes of the file in their order. It may throw; the trace ends there then.
    using Sink = std::function<void(std::string_view bytes)>;

    // Writes the beginning of the file at once.
    explicit CompactWriter(Sink byteSink);

    // A Malformed event is passed over.
    void Write(const Event& event);

    // For a recorder, which does not know where a block lies that is given back: after
    // WriteOwned, a Released block is read as one that is freed from its pool, and one that is
    // released by another thread than its own is counted in the fact "foreign_frees".
    void WriteOwned() { Tag(Record::Owned, 0); }
    void WriteReleased(std::uint64_t block) {
        TagWithBlock(Record::Released, 0, block);
        FlushIfFull();
    }
    void WriteThread(std::uint64_t number);

    // Passes on what is not yet written, so that it is not lost whatever happens next.
    void Flush();

    // Flushes and writes the end of the file.
    void Finish();

private:
    std::uint8_t PoolFlag(std::uint64_t address);
    void Tag(Record record, std::uint8_t flags) {
        plain.push_back(static_cast<char>(static_cast<std::uint8_t>(record) | flags));
    }
    void TagWithPool(Record record, std::uint64_t pool);
    void TagWithBlock(Record record, std::uint8_t flags, std::uint64_t block);
    void AppendNumber(std::uint64_t number);
    void AppendText(std::string_view text);
    void FlushIfFull() {
        if (plain.size() >= fullBlockSize) { Flush(); }
    }
    void WriteHeader(std::size_t packedSize);

    const Sink sink;
    const std::unique_ptr<ZSTD_CCtx, std::size_t (*)(ZSTD_CCtx*)> context;
    std::vector<char> plain;
    std::vector<char> packed;
    std::unordered_map<std::uint64_t, std::uint64_t> poolIndices;  // By their addresses.
    std::uint64_t lastPool = 0;  // The address; means nothing while there are no indices.
    std::uint64_t lastPoolIndex = 0;
    std::uint64_t lastBlock = 0;
};

}  // namespace Trace

#endif
