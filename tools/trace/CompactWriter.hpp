// Writes a trace in its compact form, in bounded memory.

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
    // Receives the bytes of the file in order. It may throw; the trace ends there.
    using Sink = std::function<void(std::string_view bytes)>;

    // Writes the beginning of the file.
    explicit CompactWriter(Sink byteSink);

    // A Malformed event is ignored. A text is cut at its largest size.
    void Write(const Event& event);

    // For a recorder, which does not know the pool of a block that is freed. After WriteOwned the
    // reader finds the pool of a released block, and counts the blocks that another thread releases
    // in the fact "foreign_frees".
    void WriteOwned() { Tag(Entry::Owned, 0); }
    void WriteReleased(std::uint64_t block) {
        TagWithBlock(Entry::Released, 0, block);
        FlushIfFull();
    }
    void WriteThread(std::uint64_t number);

    // Writes what is still in memory, so that it is not lost.
    void Flush();

    // Flushes and writes the end of the file.
    void Finish();

private:
    std::uint8_t PoolFlag(std::uint64_t address);
    void Tag(Entry entry, std::uint8_t flags) {
        plain.push_back(static_cast<char>(static_cast<std::uint8_t>(entry) | flags));
    }
    void TagWithPool(Entry entry, std::uint64_t pool);
    void TagWithBlock(Entry entry, std::uint8_t flags, std::uint64_t block);
    void AppendNumber(std::uint64_t number);
    void AppendText(std::string_view text);
    void FlushIfFull() {
        if (plain.size() >= fullChunkSize) { Flush(); }
    }
    void WriteHeader(std::size_t packedSize);

    const Sink sink;
    const std::unique_ptr<ZSTD_CCtx, std::size_t (*)(ZSTD_CCtx*)> context;
    std::vector<char> plain;
    std::vector<char> packed;
    std::unordered_map<std::uint64_t, std::uint64_t> poolIndices;  // By address.
    std::uint64_t lastPool = 0;  // The address. Unset while there are no indices.
    std::uint64_t lastPoolIndex = 0;
    std::uint64_t lastBlock = 0;
};

}  // namespace Trace

#endif
