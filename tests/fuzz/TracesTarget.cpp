// The fuzz target of the readers and writers of traces. Any bytes are read to their end. The result
// does not depend on the pieces in which they come, nor on compression. A trace that is written
// again reads the same. Its steps are consistent.

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <stdexcept>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <zlib.h>
#include <zstd.h>

#include "Bytes.hpp"
#include "trace/CompactForm.hpp"
#include "trace/CompactWriter.hpp"
#include "trace/OpenTrace.hpp"
#include "trace/StepReader.hpp"
#include "trace/TextWriter.hpp"

namespace {

using Trace::Kind;

// Bytes from memory, in pieces.
class Pieces final : public Trace::ByteSource {
public:
    Pieces(std::string_view bytes, std::size_t size) : rest(bytes), pieceSize(size) {}
    std::size_t Read(char* bytes, std::size_t size) override {
        const std::size_t number = rest.copy(bytes, std::min(size, pieceSize));
        rest.remove_prefix(number);
        return number;
    }
    std::string Problem() const override { return ""; }

private:
    std::string_view rest;
    const std::size_t pieceSize;
};

std::unique_ptr<Trace::EventSource> Reader(std::string_view bytes, std::size_t pieceSize) {
    Trace::Input input(std::make_unique<Pieces>(bytes, pieceSize));
    input.ReadMore();
    return Trace::MakeReader(std::move(input));
}

// An event that outlives the next one: the fields of its kind, and its place.
struct Line {
    Kind kind;
    std::string line;  // As it is written.
    std::uint64_t position;

    friend bool operator==(const Line& a, const Line& b) {
        return std::tie(a.kind, a.line, a.position) == std::tie(b.kind, b.line, b.position);
    }
};

std::vector<Line> ReadAll(Trace::EventSource& source) {
    std::vector<Line> all;
    Trace::Event event;
    while (source.Next(event)) {
        Line line = {event.kind, {}, source.Position()};
        Trace::AppendLine(line.line, event);
        EXPECT_EQ(line.line.empty(), event.kind == Kind::Malformed);
        all.push_back(std::move(line));
    }
    EXPECT_FALSE(source.Next(event)) << "Nothing follows the end.";
    return all;
}

std::string LinesOf(const std::vector<Line>& events) {
    std::string lines;
    for (const Line& event : events) { lines += event.line; }
    return lines;
}

// Follows the steps and knows which blocks are alive.
class Follower {
public:
    explicit Follower(Trace::StepReader& stepReader) : reader(stepReader) {}

    void Follow(const Trace::Step& step) {
        switch (step.kind) {
            case Kind::Created:
                EXPECT_EQ(step.pool + 1, reader.Blocks().Pools().size());
                EXPECT_TRUE(pools.try_emplace(step.pool).second);
                break;
            case Kind::Allocated:
                EXPECT_LE(step.block.size, 0x3FFFFFFF);
                EXPECT_TRUE(live.insert(step.block.index).second);
                pools.at(step.pool)[step.block.index] = step.block.size;
                break;
            case Kind::Freed:
                EXPECT_EQ(pools.at(step.pool).at(step.block.index), step.block.size);
                pools.at(step.pool).erase(step.block.index);
                live.erase(step.block.index);
                break;
            case Kind::Cleared:
            case Kind::Destroyed:
                Drop(pools.at(step.pool));
                if (step.kind == Kind::Destroyed) { pools.erase(step.pool); }
                break;
            default:
                EXPECT_EQ(step.kind, Kind::Named);
                EXPECT_EQ(pools.count(step.pool), 1);
        }
        most = std::max(most, live.size());
        EXPECT_EQ(reader.Blocks().NumBlocks(), most);
    }

    void End() {
        std::size_t number = 0;
        while (reader.Blocks().EndPool()) {
            for (const Trace::Block& block : reader.Blocks().Dropped()) { live.erase(block.index); }
            ++number;
        }
        EXPECT_EQ(number, pools.size());
        EXPECT_TRUE(live.empty());
    }

private:
    using Pool = std::map<std::uint32_t, std::uint32_t>;  // Sizes by index.

    void Drop(Pool& pool) {
        const std::vector<Trace::Block>& dropped = reader.Blocks().Dropped();
        EXPECT_TRUE(std::equal(pool.begin(), pool.end(), dropped.begin(), dropped.end(),
                               [](const auto& entry, const Trace::Block& block) {
                                   return entry.first == block.index && entry.second == block.size;
                               }));
        for (const auto& [index, size] : pool) { live.erase(index); }
        pool.clear();
    }

    Trace::StepReader& reader;
    std::map<std::uint32_t, Pool> pools;
    std::set<std::uint32_t> live;
    std::size_t most = 0;
};

void FollowSteps(std::string_view bytes, std::size_t pieceSize, const std::vector<Line>& events) {
    Trace::StepReader reader(Reader(bytes, pieceSize), "input");
    Follower follower(reader);
    Trace::Step step = {};
    std::uint64_t numSteps = 0;
    bool isTrace = true;
    try {
        for (; reader.Next(step); ++numSteps) { follower.Follow(step); }
    } catch (const std::runtime_error&) { isTrace = false; }
    follower.End();
    const auto isNoStep = [](const Line& event) {
        return event.kind == Kind::Info || event.kind == Kind::Time;
    };
    const auto numOthers = std::count_if(events.begin(), events.end(), isNoStep);
    EXPECT_EQ(numSteps + static_cast<std::uint64_t>(numOthers) + reader.Bad().Total(),
              events.size());
    EXPECT_EQ(isTrace, reader.Bad().Total() < events.size());
}

// The trace in a file of these bytes.
std::vector<Line> ReadFile(std::string_view bytes, bool& isWhole) {
    const int file = memfd_create("trace", MFD_CLOEXEC);
    EXPECT_EQ(write(file, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    std::vector<Line> events;
    try {
        const auto source = Trace::OpenTrace("/proc/self/fd/" + std::to_string(file));
        events = ReadAll(*source);
        isWhole = source->Problem().empty();
    } catch (const std::runtime_error&) { isWhole = false; }
    close(file);
    return events;
}

std::string Compressed(std::string_view bytes) {
    constexpr int gzipFormat = 15 + 16;
    z_stream stream = {};
    EXPECT_EQ(deflateInit2(&stream, 1, Z_DEFLATED, gzipFormat, 1, Z_DEFAULT_STRATEGY), Z_OK);
    std::string packed(deflateBound(&stream, bytes.size()), '\0');
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
    stream.avail_in = static_cast<uInt>(bytes.size());
    stream.next_out = reinterpret_cast<Bytef*>(packed.data());
    stream.avail_out = static_cast<uInt>(packed.size());
    EXPECT_EQ(deflate(&stream, Z_FINISH), Z_STREAM_END);
    packed.resize(stream.total_out);
    deflateEnd(&stream);
    return packed;
}

// A compressed trace gives the same events, and one that is cut off gives the first of them.
void ReadCompressed(std::string_view bytes, std::size_t numCut, const std::vector<Line>& events,
                    bool isSound) {
    std::string packed = Compressed(bytes);
    numCut %= packed.size();
    packed.resize(packed.size() - numCut);
    bool isWhole = false;
    std::vector<Line> read = ReadFile(packed, isWhole);
    // The last event can be the reader's own count of what it has read.
    if (numCut != 0 && !read.empty() && read.back().kind == Kind::Info) { read.pop_back(); }
    ASSERT_LE(read.size(), events.size());
    EXPECT_TRUE(std::equal(read.begin(), read.end(), events.begin()));
    if (numCut != 0) { return; }
    EXPECT_EQ(isWhole, isSound);
    EXPECT_EQ(read.size(), events.size());
}

std::string CompactOf(Trace::EventSource& source) {
    std::string file;
    Trace::CompactWriter writer([&file](std::string_view part) { file += part; });
    Trace::Event event;
    while (source.Next(event)) { writer.Write(event); }
    writer.Finish();
    return file;
}

// The compact form of these events gives them again. If it is cut off, it gives the first of them,
// and reports that.
void ReadCompact(const std::string& compact, std::size_t numCut, const std::vector<Line>& events) {
    numCut %= compact.size();
    const std::string_view bytes(compact.data(), compact.size() - numCut);
    const auto source = Reader(bytes, bytes.size());
    const std::vector<Line> read = ReadAll(*source);
    EXPECT_EQ(source->Problem().empty(), numCut == 0 || bytes.size() < Trace::compactMagic.size());
    auto place = events.begin();
    for (const Line& one : read) {
        place = std::find_if(place, events.end(),
                             [](const Line& event) { return event.kind != Kind::Malformed; });
        ASSERT_NE(place, events.end());
        ASSERT_EQ(one.line, place->line);
        ++place;
    }
    if (numCut == 0) { EXPECT_EQ(LinesOf(read), LinesOf(events)); }
}

// A trace in its compact form whose records are these bytes, in one block or in two.
std::string CompactOf(std::string_view records, std::size_t firstSize) {
    std::string file(Trace::compactMagic);
    const std::string_view plains[] = {records.substr(0, firstSize),
                                       records.substr(std::min(firstSize, records.size()))};
    for (const std::string_view plain : plains) {
        if (plain.empty()) { continue; }
        std::string packed(ZSTD_compressBound(plain.size()), '\0');
        packed.resize(ZSTD_compress(packed.data(), packed.size(), plain.data(), plain.size(), 1));
        for (const std::size_t size : {packed.size(), plain.size()}) {
            for (int shift = 0; shift != 32; shift += 8) {
                file += static_cast<char>(size >> shift);
            }
        }
        file += packed;
    }
    return file.append(Trace::chunkHeaderSize, '\0');
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Fuzz::Bytes input(data, size);
    const std::uint8_t form = input.Byte();
    const std::size_t pieceSize = input.Byte() + 1u;
    const std::uint32_t numCut = input.Short();
    std::string_view bytes = input.Rest();
    const bool isRecords = form % 2 == 1;
    const std::string file = isRecords ? CompactOf(bytes, form < 128 ? form : bytes.size()) : "";
    if (isRecords) { bytes = file; }

    const auto source = Reader(bytes, pieceSize);
    const std::vector<Line> events = ReadAll(*source);
    EXPECT_EQ(ReadAll(*Reader(bytes, bytes.size() + 1)), events);

    const std::string lines = LinesOf(events);
    EXPECT_EQ(LinesOf(ReadAll(*Reader(lines, pieceSize))), lines);

    FollowSteps(bytes, pieceSize, events);
    bool isWhole = false;
    switch (numCut % 4) {
        case 0:
            ReadCompressed(bytes, numCut / 4, events, source->Problem().empty());
            break;
        case 1:
            ReadFile(bytes, isWhole);
            break;
        case 2:
            ReadCompact(CompactOf(*Reader(bytes, pieceSize)), 0, events);
            break;
        default:
            ReadCompact(CompactOf(*Reader(bytes, pieceSize)), numCut / 4, events);
    }
    return 0;
}
