// From compressed chunks to entries, and from entries to events.

#include "trace/CompactReader.hpp"

#include <cstddef>
#include <utility>

#include <zstd.h>

#include "trace/CompactForm.hpp"

namespace Trace {

namespace {

constexpr const char* brokenOff = "unexpected end of file";
constexpr const char* damaged = "damaged";

std::size_t Size(std::string_view bytes) {
    std::size_t size = 0;
    for (std::size_t index = 0; index != 4; ++index) {
        size |= std::size_t{static_cast<unsigned char>(bytes[index])} << 8 * index;
    }
    return size;
}

}  // namespace

bool CompactReader::Next(Event& event) {
    if (!ReadEvent(event)) { return false; }
    ++number;
    return true;
}

std::string CompactReader::Problem() const {
    const std::string problemOfBytes = input.Problem();
    return problemOfBytes.empty() ? problem : problemOfBytes;
}

bool CompactReader::ReadEvent(Event& event) {
    if (next) {
        event = *std::exchange(next, std::nullopt);
        return true;
    }
    while (!rest.empty() || NextChunk()) {
        const bool isEvent = ReadEntry(event);
        if (!isSound) {
            End(damaged);
            break;
        }
        if (isEvent) { return true; }
    }
    if (!isOwned) { return false; }
    isOwned = false;
    foreignFrees = std::to_string(numForeignFrees);
    event.kind = Kind::Info;
    event.key = "foreign_frees";
    event.text = foreignFrees;
    return true;
}

// Reads an entry; true if it is an event.
bool CompactReader::ReadEntry(Event& event) {
    const auto tag = static_cast<std::uint8_t>(rest.front());
    rest.remove_prefix(1);
    switch (static_cast<Entry>(tag & entryMask)) {
        case Entry::Pool:
            if (pools.size() == maxPools) { isSound = false; }
            pools.push_back(TakeNumber());
            return false;
        case Entry::NoPools:
            pools.clear();
            return false;
        case Entry::Created:
            event.kind = Kind::Created;
            TakePool(tag, event);
            return true;
        case Entry::Destroyed:
            event.kind = Kind::Destroyed;
            TakePool(tag, event);
            return true;
        case Entry::Cleared:
            event.kind = Kind::Cleared;
            TakePool(tag, event);
            return true;
        case Entry::Allocated:
            event.kind = Kind::Allocated;
            TakePool(tag, event);
            TakeBlock(tag, event);
            event.size = TakeNumber();
            return Own(event);
        case Entry::Freed:
            event.kind = Kind::Freed;
            TakePool(tag, event);
            TakeBlock(tag, event);
            return true;
        case Entry::Owned:
            isOwned = true;
            owners.clear();
            return false;
        case Entry::Released:
            TakeBlock(tag, event);
            return Release(event);
        case Entry::Thread:
            thread = TakeNumber();
            return false;
        case Entry::Named:
            event.kind = Kind::Named;
            TakePool(tag, event);
            event.text = TakeText();
            return true;
        case Entry::Info:
            event.kind = Kind::Info;
            event.key = TakeText();
            event.text = TakeText();
            return true;
        case Entry::Time:
            event.kind = Kind::Time;
            event.size = TakeNumber();
            return true;
    }
    isSound = false;
    return false;
}

// Decompresses the next chunk; false at the end of the trace.
bool CompactReader::NextChunk() {
    if (atEnd) { return false; }
    if (atStart) { input.Skip(compactMagic.size()); }
    atStart = false;
    if (!HasAhead(chunkHeaderSize)) { return End(brokenOff); }
    const std::size_t packedSize = Size(input.Ahead());
    const std::size_t plainSize = Size(input.Ahead().substr(chunkHeaderSize / 2));
    input.Skip(chunkHeaderSize);
    if (packedSize == 0 && plainSize == 0) {
        return End(HasAhead(1) ? "there is more after its end" : "");
    }
    if (plainSize == 0 || plainSize > maxPlainSize ||
        packedSize > ZSTD_compressBound(maxPlainSize)) {
        return End(damaged);
    }
    if (!HasAhead(packedSize)) { return End(brokenOff); }
    plain.resize(plainSize);
    if (ZSTD_decompress(plain.data(), plainSize, input.Ahead().data(), packedSize) != plainSize) {
        return End(damaged);
    }
    input.Skip(packedSize);
    rest = {plain.data(), plainSize};
    return true;
}

bool CompactReader::HasAhead(std::size_t size) {
    while (input.Ahead().size() < size) {
        if (!input.ReadMore()) { return false; }
    }
    return true;
}

bool CompactReader::End(const char* why) {
    atEnd = true;
    rest = {};
    problem = why;
    return false;
}

// Notes the pool and the thread of a block. The recorder may have missed the release of an earlier
// block at that address; that release then comes first.
bool CompactReader::Own(Event& event) {
    if (!isOwned || !isSound) { return true; }
    const auto [place, isNew] = owners.try_emplace(event.block);
    const std::uint64_t formerPool = place->second.pool;
    place->second = {event.pool, thread};
    if (isNew) { return true; }
    next = event;
    event.kind = Kind::Freed;
    event.pool = formerPool;
    return true;
}

bool CompactReader::Release(Event& event) {
    const auto place = owners.find(event.block);
    if (place == owners.end()) { return false; }
    event.kind = Kind::Freed;
    event.pool = place->second.pool;
    if (place->second.thread != thread) { ++numForeignFrees; }
    owners.erase(place);
    return true;
}

std::uint64_t CompactReader::TakeNumber() {
    std::uint64_t value = 0;
    for (unsigned int shift = 0; shift < 64 && !rest.empty(); shift += 7) {
        const auto byte = static_cast<unsigned char>(rest.front());
        rest.remove_prefix(1);
        value |= std::uint64_t{byte & 0x7FU} << shift;
        if (byte < 0x80) { return value; }
    }
    isSound = false;
    return 0;
}

std::string_view CompactReader::TakeText() {
    const std::uint64_t size = TakeNumber();
    if (size > rest.size()) {
        isSound = false;
        return {};
    }
    const std::string_view text = rest.substr(0, size);
    rest.remove_prefix(size);
    return text;
}

void CompactReader::TakePool(std::uint8_t tag, Event& event) {
    if ((tag & samePool) == 0) {
        const std::uint64_t index = TakeNumber();
        if (index >= pools.size()) {
            isSound = false;
            return;
        }
        lastPool = pools[index];
    }
    event.pool = lastPool;
}

void CompactReader::TakeBlock(std::uint8_t tag, Event& event) {
    std::uint64_t distance = TakeNumber();
    if ((tag & inUnits) != 0) { distance <<= unitShift; }
    lastBlock += (tag & backwards) != 0 ? 0 - distance : distance;
    event.block = lastBlock;
}

}  // namespace Trace
