// From events to entries, and from entries to compressed chunks.

#include "trace/CompactWriter.hpp"

#include <algorithm>
#include <cstddef>
#include <new>
#include <stdexcept>
#include <utility>

#include "trace/CutText.hpp"

namespace Trace {

namespace {

constexpr int compressionLevel = 1;  // The recorded program shares the processors.

}  // namespace

CompactWriter::CompactWriter(Sink byteSink)
    : sink(std::move(byteSink)), context(ZSTD_createCCtx(), ZSTD_freeCCtx) {
    if (context == nullptr) { throw std::bad_alloc(); }
    ZSTD_CCtx_setParameter(context.get(), ZSTD_c_compressionLevel, compressionLevel);
    ZSTD_CCtx_setParameter(context.get(), ZSTD_c_checksumFlag, 1);
    plain.reserve(maxPlainSize);
    packed.resize(chunkHeaderSize + ZSTD_compressBound(maxPlainSize));
    sink(compactMagic);
}

void CompactWriter::Write(const Event& event) {
    switch (event.kind) {
        case Kind::Created:
            TagWithPool(Entry::Created, event.pool);
            break;
        case Kind::Destroyed:
            TagWithPool(Entry::Destroyed, event.pool);
            break;
        case Kind::Cleared:
            TagWithPool(Entry::Cleared, event.pool);
            break;
        case Kind::Allocated:
            TagWithBlock(Entry::Allocated, PoolFlag(event.pool), event.block);
            AppendNumber(event.size);
            break;
        case Kind::Freed:
            TagWithBlock(Entry::Freed, PoolFlag(event.pool), event.block);
            break;
        case Kind::Named:
            TagWithPool(Entry::Named, event.pool);
            AppendText(event.text);
            break;
        case Kind::Info:
            Tag(Entry::Info, 0);
            AppendText(event.key);
            AppendText(event.text);
            break;
        case Kind::Time:
            Tag(Entry::Time, 0);
            AppendNumber(event.size);
            break;
        case Kind::Malformed:
            break;
    }
    FlushIfFull();
}

void CompactWriter::WriteThread(std::uint64_t number) {
    Tag(Entry::Thread, 0);
    AppendNumber(number);
}

void CompactWriter::Flush() {
    if (plain.empty()) { return; }
    const std::size_t size =
        ZSTD_compress2(context.get(), packed.data() + chunkHeaderSize,
                       packed.size() - chunkHeaderSize, plain.data(), plain.size());
    if (ZSTD_isError(size) != 0) { throw std::runtime_error(ZSTD_getErrorName(size)); }
    WriteHeader(size);
    plain.clear();
    sink({packed.data(), chunkHeaderSize + size});
}

void CompactWriter::Finish() {
    Flush();
    WriteHeader(0);
    sink({packed.data(), chunkHeaderSize});
}

// Finds the index of the pool, or gives it one. Returns samePool if it is the last one again, else
// 0.
std::uint8_t CompactWriter::PoolFlag(std::uint64_t address) {
    if (address == lastPool && !poolIndices.empty()) { return samePool; }
    auto place = poolIndices.find(address);
    if (place == poolIndices.end()) {
        if (poolIndices.size() == maxPools) {
            poolIndices.clear();
            Tag(Entry::NoPools, 0);
        }
        place = poolIndices.emplace(address, poolIndices.size()).first;
        Tag(Entry::Pool, 0);
        AppendNumber(address);
    }
    lastPool = address;
    lastPoolIndex = place->second;
    return 0;
}

void CompactWriter::TagWithPool(Entry entry, std::uint64_t pool) {
    const std::uint8_t flag = PoolFlag(pool);
    Tag(entry, flag);
    if (flag == 0) { AppendNumber(lastPoolIndex); }
}

// Writes the tag, the pool's index that PoolFlag has found (if the entry has one), and the block.
void CompactWriter::TagWithBlock(Entry entry, std::uint8_t flags, std::uint64_t block) {
    const bool hasPool = entry != Entry::Released && (flags & samePool) == 0;
    std::uint64_t distance = block - lastBlock;
    lastBlock = block;
    if (distance >> 63 != 0) {
        distance = 0 - distance;
        flags |= backwards;
    }
    constexpr std::uint64_t unit = 1U << unitShift;
    if (distance % unit == 0) {
        distance >>= unitShift;
        flags |= inUnits;
    }
    Tag(entry, flags);
    if (hasPool) { AppendNumber(lastPoolIndex); }
    AppendNumber(distance);
}

void CompactWriter::AppendNumber(std::uint64_t number) {
    while (number >= 0x80) {
        plain.push_back(static_cast<char>(number | 0x80));
        number >>= 7;
    }
    plain.push_back(static_cast<char>(number));
}

void CompactWriter::AppendText(std::string_view text) {
    text = WholeCharacters(text, maxTextSize);
    AppendNumber(text.size());
    plain.insert(plain.end(), text.begin(), text.end());
}

void CompactWriter::WriteHeader(std::size_t packedSize) {
    const std::size_t sizes[] = {packedSize, plain.size()};
    char* place = packed.data();
    for (const std::size_t size : sizes) {
        for (unsigned int shift = 0; shift != 32; shift += 8) {
            *place++ = static_cast<char>(size >> shift);
        }
    }
}

}  // namespace Trace
