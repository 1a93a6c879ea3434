// mempool-replay: replays recorded traces through the pools and through the heap, and compares.
//
// A trace is what a program prints with NUV_OBR_MEMPOOL_TRACE set: lines "xmpt:..." among its other
// output. A *line* tells what happened to an address; an *event* is what a replay does about it,
// with the pool and the block as indices, so that a replay looks nothing up. A *side* carries the
// events out: PoolSide through one Mgr a traced pool, HeapSide through operator new[] and delete[].
//
// In the order of reading: the heap counts what it lends, a trace is read, replayed, compared.

#include <malloc.h>
#include <time.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <iomanip>
#include <iostream>
#include <istream>
#include <limits>
#include <memory>
#include <new>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <streambuf>
#include <string>
#include <string_view>
#include <tuple>
#include <unordered_map>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>
#include <MemPool>

// The heap of this program, the library's requests included. It counts only while it is told to,
// which no timed replay does.

namespace {

bool counting = false;
std::int64_t heldBytes = 0;  // Lent while counting, as the allocator rounds them.

void* Lend(std::size_t size) {
    void* const block = std::malloc(std::max(size, std::size_t{1}));
    if (block == nullptr) { throw std::bad_alloc(); }
    if (counting) { heldBytes += static_cast<std::int64_t>(malloc_usable_size(block)); }
    return block;
}

void TakeBack(void* block) noexcept {
    if (counting) { heldBytes -= static_cast<std::int64_t>(malloc_usable_size(block)); }
    std::free(block);
}

}  // namespace

void* operator new(std::size_t size) {
    return Lend(size);
}
void* operator new[](std::size_t size) {
    return Lend(size);
}
void operator delete(void* block) noexcept {
    TakeBack(block);
}
void operator delete[](void* block) noexcept {
    TakeBack(block);
}
void operator delete(void* block, std::size_t) noexcept {
    TakeBack(block);
}
void operator delete[](void* block, std::size_t) noexcept {
    TakeBack(block);
}

namespace {

// One line of a terminal that is written over and over. Nothing is shown in a file or a pipe.
class Progress {
public:
    explicit Progress(std::string tracePath) : path(std::move(tracePath)) {}
    ~Progress() { Clear(); }

    void Show(const std::string& text) const {
        Clear();
        if (isTerminal) { std::cerr << path << ": " << text << std::flush; }
    }
    void Clear() const {
        if (isTerminal) { std::cerr << "\r\033[K" << std::flush; }
    }

private:
    const std::string path;
    const bool isTerminal = isatty(STDERR_FILENO) != 0;
};

// Traces and their lines.

constexpr std::uint64_t maxBlockSize = 0x3FFFFFFF;  // The largest that a pool takes.

enum class Kind : std::uint8_t { PoolCreated, BlockAllocated, BlockFreed, PoolDestroyed };

struct Event {
    Kind kind;
    std::uint32_t pool;   // Index into Trace::pools.
    std::uint32_t block;  // Index below Trace::numBlocks, given anew once the block is gone.
    std::uint32_t size;   // Bytes asked for.
};

// Why a line is left out of the replay.
enum class Fault { Malformed, TooLarge, UnknownPool, PoolTwice, NotAllocated, BlockTwice };
constexpr std::array faultNames = {
    "truncated or malformed", "size above 1073741823",          "unknown pool",
    "pool created twice",     "free of what was not allocated", "pointer allocated twice",
};

struct BadLine {
    std::uint64_t number;
    Fault fault;
};

struct TracedPool {
    std::string name;                       // Its address, as the trace shows it.
    std::vector<std::uint32_t> neverFreed;  // Its blocks when it was destroyed, or at the end.
};

struct Trace {
    std::vector<Event> events;
    std::vector<TracedPool> pools;  // Each pool ever created.
    std::uint32_t numBlocks = 0;

    // The first moment with the most bytes asked for, and among those with the most blocks.
    std::size_t peakEvents = 0;  // Events up to and including it.
    std::uint64_t peakBytes = 0;
    std::uint64_t peakBlocks = 0;

    std::array<std::uint64_t, faultNames.size()> numFaults = {};
    std::vector<BadLine> badLines;  // The first few.
};

struct Line {
    char word = 0;  // 'c', 'a', 'f' or 'd'.
    std::uint64_t pool = 0;
    std::uint64_t data = 0;
    std::uint64_t size = 0;
};

// The fields of a line, taken from the front. Once one is missing, the line is not well formed.
class Fields {
public:
    explicit Fields(std::string_view text) : rest(text) {}

    char Letter() {
        const char letter = rest.empty() ? '\0' : rest.front();
        rest.remove_prefix(rest.empty() ? 0 : 1);
        return letter;
    }
    void Colon() {
        if (Letter() != ':') { wellFormed = false; }
    }
    std::uint64_t Address() { return Number(rest.substr(0, addressDigits), 16, addressDigits); }
    std::uint64_t Size() { return Number(rest, 10, 1); }

    bool AllTaken() const { return wellFormed && rest.empty(); }

private:
    static constexpr std::size_t addressDigits = 16;

    // A number that no 64 bits hold is as good as the largest: it is too large in any case.
    std::uint64_t Number(std::string_view digits, int base, std::size_t minDigits) {
        std::uint64_t value = 0;
        const char* const first = digits.data();
        const auto [end, error] = std::from_chars(first, first + digits.size(), value, base);
        const auto numDigits = static_cast<std::size_t>(end - first);
        if (numDigits < minDigits) { wellFormed = false; }
        rest.remove_prefix(numDigits);
        return error == std::errc() ? value : std::numeric_limits<std::uint64_t>::max();
    }

    std::string_view rest;
    bool wellFormed = true;
};

// The line behind its "xmpt:".
std::optional<Line> ParseLine(std::string_view text) {
    Fields fields(text);
    Line line;
    line.word = fields.Letter();
    fields.Colon();
    line.pool = fields.Address();
    const bool ofBlock = line.word == 'a' || line.word == 'f';
    if (ofBlock) {
        fields.Colon();
        line.data = fields.Address();
        fields.Colon();
    }
    if (line.word == 'a') { line.size = fields.Size(); }
    const bool known = ofBlock || line.word == 'c' || line.word == 'd';
    return known && fields.AllTaken() ? std::optional(line) : std::nullopt;
}

std::uint64_t NumNeverFreed(const Trace& trace) {
    std::uint64_t number = 0;
    for (const TracedPool& pool : trace.pools) { number += pool.neverFreed.size(); }
    return number;
}

// Turns lines into the events of a trace. It knows which pools and blocks live, and by which index.
class TraceBuilder {
public:
    // Adds the line's event, or nothing if the line makes no sense after those before it.
    std::optional<Fault> Add(const Line& line) {
        const auto pool = livePools.find(line.pool);
        if (line.word == 'c') {
            if (pool != livePools.end()) { return Fault::PoolTwice; }
            CreatePool(line.pool);
            return std::nullopt;
        }
        if (pool == livePools.end()) { return Fault::UnknownPool; }
        if (line.word == 'a') { return Allocate(pool->second, line); }
        if (line.word == 'f') { return Free(pool->second, line); }
        DestroyPool(pool->second);
        livePools.erase(pool);
        return std::nullopt;
    }

    void AddBadLine(std::uint64_t number, Fault fault) {
        constexpr std::size_t maxShown = 5;
        ++trace.numFaults[static_cast<std::size_t>(fault)];
        if (trace.badLines.size() < maxShown) { trace.badLines.push_back({number, fault}); }
    }

    Trace Finish() {
        for (const auto& [address, pool] : livePools) { EndPool(pool); }
        return std::move(trace);
    }

private:
    struct Block {
        std::uint32_t index;
        std::uint32_t size;
    };
    struct LivePool {
        std::uint32_t index;
        std::unordered_map<std::uint64_t, Block> blocks;  // By their addresses.
    };

    void CreatePool(std::uint64_t address) {
        const auto index = static_cast<std::uint32_t>(trace.pools.size());
        std::ostringstream name;
        name << std::hex << std::setw(16) << std::setfill('0') << address;
        trace.pools.push_back({name.str(), {}});
        livePools.emplace(address, LivePool{index, {}});
        AddEvent(Kind::PoolCreated, index, {});
    }

    std::optional<Fault> Allocate(LivePool& pool, const Line& line) {
        if (line.size > maxBlockSize) { return Fault::TooLarge; }
        if (pool.blocks.count(line.data) != 0) { return Fault::BlockTwice; }
        const Block block{TakeIndex(), static_cast<std::uint32_t>(line.size)};
        pool.blocks.emplace(line.data, block);
        AddEvent(Kind::BlockAllocated, pool.index, block);

        liveBytes += block.size;
        ++liveBlocks;
        if (std::tie(liveBytes, liveBlocks) > std::tie(trace.peakBytes, trace.peakBlocks)) {
            trace.peakEvents = trace.events.size();
            trace.peakBytes = liveBytes;
            trace.peakBlocks = liveBlocks;
        }
        return std::nullopt;
    }

    std::optional<Fault> Free(LivePool& pool, const Line& line) {
        const auto block = pool.blocks.find(line.data);
        if (block == pool.blocks.end()) { return Fault::NotAllocated; }
        AddEvent(Kind::BlockFreed, pool.index, block->second);
        Drop(block->second);
        pool.blocks.erase(block);
        return std::nullopt;
    }

    void DestroyPool(const LivePool& pool) {
        AddEvent(Kind::PoolDestroyed, pool.index, {});
        EndPool(pool);
    }

    // What is left goes in the order of the indices, which is about that of the allocations.
    void EndPool(const LivePool& pool) {
        std::vector<std::uint32_t>& neverFreed = trace.pools[pool.index].neverFreed;
        for (const auto& [address, block] : pool.blocks) {
            neverFreed.push_back(block.index);
            Drop(block);
        }
        std::sort(neverFreed.begin(), neverFreed.end());
    }

    void AddEvent(Kind kind, std::uint32_t pool, Block block) {
        trace.events.push_back({kind, pool, block.index, block.size});
    }

    void Drop(Block block) {
        liveBytes -= block.size;
        --liveBlocks;
        freeIndices.push_back(block.index);
    }

    std::uint32_t TakeIndex() {
        if (freeIndices.empty()) { return trace.numBlocks++; }
        const std::uint32_t index = freeIndices.back();
        freeIndices.pop_back();
        return index;
    }

    Trace trace;
    std::unordered_map<std::uint64_t, LivePool> livePools;  // By their addresses.
    std::vector<std::uint32_t> freeIndices;
    std::uint64_t liveBytes = 0;
    std::uint64_t liveBlocks = 0;
};

// A file as a stream buffer, plain or compressed.
class GzBuffer : public std::streambuf {
public:
    explicit GzBuffer(const std::string& path) : file(gzopen(path.c_str(), "rb"), gzclose) {
        if (file == nullptr) { throw std::runtime_error(path + ": " + std::strerror(errno)); }
    }

    // The end of the stream is the end of a whole file, or an error is thrown.
    void CheckEnd() const {
        int code = Z_OK;
        const char* const text = gzerror(file.get(), &code);
        if (code != Z_OK) { throw std::runtime_error(text); }
    }

private:
    int_type underflow() override {
        const int numRead = gzread(file.get(), block.data(), static_cast<unsigned>(block.size()));
        if (numRead <= 0) { return traits_type::eof(); }
        setg(block.data(), block.data(), block.data() + numRead);
        return traits_type::to_int_type(*gptr());
    }

    std::unique_ptr<gzFile_s, int (*)(gzFile)> file;
    std::array<char, 65536> block;
};

Trace ReadTrace(const std::string& path, const Progress& progress) {
    constexpr std::string_view mark = "xmpt:";
    GzBuffer buffer(path);
    std::istream stream(&buffer);
    TraceBuilder builder;
    std::string text;
    for (std::uint64_t number = 1; std::getline(stream, text); ++number) {
        if (number % 100000 == 0) { progress.Show("line " + std::to_string(number)); }
        // What the program left of an open line of its own stands in front.
        const std::size_t start = text.find(mark);
        if (start == std::string::npos) { continue; }
        const auto line = ParseLine(std::string_view(text).substr(start + mark.size()));
        const auto fault = line ? builder.Add(*line) : Fault::Malformed;
        if (fault) { builder.AddBadLine(number, *fault); }
    }
    buffer.CheckEnd();
    return builder.Finish();
}

// Time that the processor spends on this program: others on the machine do not count.
double ProcessorNanoseconds() {
    timespec now;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return 1e9 * static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec);
}

// The two sides of a replay. What a side still holds, its destructor gives back. `untimed` is time
// that no event is charged with.

class PoolSide {
public:
    explicit PoolSide(const Trace& trace)
        : pools(trace.pools), mgrs(trace.pools.size()), blocks(trace.numBlocks) {}

    void CreatePool(const Event& event) {
        mgrs[event.pool].emplace(pools[event.pool].name.c_str());
    }
    void Allocate(const Event& event) { blocks[event.block] = mgrs[event.pool]->Alloc(event.size); }
    void Free(const Event& event) { mgrs[event.pool]->Free(blocks[event.block]); }
    void DestroyPool(const Event& event) { mgrs[event.pool].reset(); }

    static constexpr double untimed = 0;

private:
    const std::vector<TracedPool>& pools;
    std::vector<std::optional<OBR::MemPool::Mgr>> mgrs;
    std::vector<void*> blocks;
};

// Where a pool drops its blocks at its end, the heap frees them too, so that it holds no more than
// the pool does. The traced program never asked for that: it is not charged.
class HeapSide {
public:
    explicit HeapSide(const Trace& trace) : pools(trace.pools), blocks(trace.numBlocks) {}
    HeapSide(const HeapSide&) = delete;
    HeapSide& operator=(const HeapSide&) = delete;
    ~HeapSide() {
        for (void* block : blocks) { ::operator delete[](block); }
    }

    void CreatePool(const Event&) {}
    void Allocate(const Event& event) { blocks[event.block] = ::operator new[](event.size); }
    void Free(const Event& event) { FreeAt(event.block); }
    void DestroyPool(const Event& event) {
        const double start = ProcessorNanoseconds();
        for (const std::uint32_t block : pools[event.pool].neverFreed) { FreeAt(block); }
        untimed += ProcessorNanoseconds() - start;
    }

    double untimed = 0;

private:
    void FreeAt(std::uint32_t block) { ::operator delete[](std::exchange(blocks[block], nullptr)); }

    const std::vector<TracedPool>& pools;
    std::vector<void*> blocks;
};

template <typename Side>
void Replay(Side& side, const Event* event, const Event* end) {
    for (; event != end; ++event) {
        switch (event->kind) {
            case Kind::PoolCreated:
                side.CreatePool(*event);
                break;
            case Kind::BlockAllocated:
                side.Allocate(*event);
                break;
            case Kind::BlockFreed:
                side.Free(*event);
                break;
            case Kind::PoolDestroyed:
                side.DestroyPool(*event);
                break;
        }
    }
}

// Bytes that a side holds from the heap at the peak. `atPeak` is called at that moment.
template <typename Side, typename Function>
std::int64_t BytesHeld(const Trace& trace, Function atPeak) {
    const Event* const first = trace.events.data();
    Side side(trace);
    heldBytes = 0;
    counting = true;
    Replay(side, first, first + trace.peakEvents);
    counting = false;
    atPeak();
    return heldBytes;
}

template <typename Side>
double NanosecondsPerEvent(const Trace& trace) {
    const Event* const first = trace.events.data();
    Side side(trace);
    const double start = ProcessorNanoseconds();
    Replay(side, first, first + trace.events.size());
    const double time = ProcessorNanoseconds() - start - side.untimed;
    return time / static_cast<double>(trace.events.size());
}

double Median(std::vector<double> values) {
    const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
    std::nth_element(values.begin(), middle, values.end());
    return *middle;
}

struct Times {
    double pool;
    double heap;
};

// Medians over rounds of one replay a side. Every other round the heap goes first.
Times MedianTimes(const Trace& trace, unsigned int rounds, const Progress& progress) {
    std::vector<double> pool;
    std::vector<double> heap;
    for (unsigned int round = 1; round <= rounds; ++round) {
        progress.Show("round " + std::to_string(round) + " of " + std::to_string(rounds));
        if (round % 2 == 0) { heap.push_back(NanosecondsPerEvent<HeapSide>(trace)); }
        pool.push_back(NanosecondsPerEvent<PoolSide>(trace));
        if (round % 2 != 0) { heap.push_back(NanosecondsPerEvent<HeapSide>(trace)); }
    }
    progress.Clear();
    return {Median(pool), Median(heap)};
}

// The report.

template <typename Value>
void WriteCells(const char* label, Value pool, Value heap) {
    std::cout << "   " << std::left << std::setw(24) << label << std::right << std::setw(12) << pool
              << std::setw(12) << heap;
}

void WriteSame(const char* label, std::uint64_t value) {
    WriteCells(label, value, value);
    std::cout << '\n';
}

template <typename Value>
void WriteCompared(const char* label, Value pool, Value heap) {
    std::cout << std::fixed << std::setprecision(1);
    WriteCells(label, pool, heap);
    std::cout << std::setw(12) << std::setprecision(2);
    if (heap > 0) {
        std::cout << static_cast<double>(pool) / static_cast<double>(heap) << '\n';
    } else {
        std::cout << "-" << '\n';
    }
}

void WriteBadLines(const std::string& path, const Trace& trace) {
    std::uint64_t total = 0;
    for (const std::uint64_t number : trace.numFaults) { total += number; }
    std::cout << "   Bad lines: " << total << '\n';
    for (std::size_t fault = 0; fault < faultNames.size(); ++fault) {
        if (trace.numFaults[fault] == 0) { continue; }
        std::cout << "      " << trace.numFaults[fault] << " x " << faultNames[fault] << '\n';
    }
    for (const BadLine& line : trace.badLines) {
        std::cout << "   " << path << ':' << line.number << ": "
                  << faultNames[static_cast<std::size_t>(line.fault)] << '\n';
    }
    if (total > trace.badLines.size()) { std::cout << "   and more\n"; }
}

void Compare(const std::string& path, unsigned int rounds, bool dbg) {
    const Progress progress(path);
    const Trace trace = ReadTrace(path, progress);
    progress.Clear();

    std::cout << path << '\n';
    WriteBadLines(path, trace);
    const auto poolHeld = BytesHeld<PoolSide>(trace, [dbg] {
        if (dbg) { OBR::MemPool::Dbg(); }
    });
    const auto heapHeld = BytesHeld<HeapSide>(trace, [] {});

    WriteCells("", "pool", "heap");
    std::cout << std::setw(12) << "pool/heap" << '\n';
    WriteSame("pools", trace.pools.size());
    WriteSame("events", trace.events.size());
    WriteSame("blocks at the peak", trace.peakBlocks);
    WriteSame("bytes at the peak", trace.peakBytes);
    WriteSame("blocks never freed", NumNeverFreed(trace));
    WriteCompared("bytes held at the peak", poolHeld, heapHeld);
    std::cout << std::flush;
    if (trace.events.empty()) { return; }
    const Times times = MedianTimes(trace, rounds, progress);
    WriteCompared("ns an event", times.pool, times.heap);
}

// The command line.

constexpr const char* description =
    R"(Replays traces of a program's pools through the pools and through the heap, and compares.

A TRACE is the output of a program that ran with NUV_OBR_MEMPOOL_TRACE=1, plain or compressed by
gzip. Its lines "xmpt:..." count, all others are passed over.)";

constexpr const char* notes =
    R"(Settings without an option here come from the variables NUV_OBR_MEMPOOL_... as ever.

pool          One enabled pool a traced pool.
heap          operator new[] and delete[]. What a pool drops at its end is freed on the heap too,
              block by block; that time is not counted. No block is written to.
the peak      The moment with the most bytes asked for.
bytes held    What operator new has lent at the peak, in sizes of malloc_usable_size, without the
              allocator's own headers. A replay of its own counts them, untimed; a timed one pays
              one test of a flag for it at each heap request.
ns an event   Processor time, page faults included; the median of all rounds.
bad lines     Left out of the replay. A trace does not show Mgr::Clear: after one, pointers
              allocated twice are to be expected.
)";

struct Setting {
    const char* option;
    void (*store)(unsigned int);
    const char* help;
};
constexpr Setting settings[] = {
    {"--bucket-size", OBR::MemPool::NUV_OBR_MEMPOOL_BUCKET_SIZE, "Size of a bucket"},
    {"--max-record", OBR::MemPool::NUV_OBR_MEMPOOL_MAX_RECORD_SIZE,
     "Largest record, its overhead included"},
    {"--min-record", OBR::MemPool::NUV_OBR_MEMPOOL_MIN_RECORD_SIZE,
     "Smallest record, its overhead included"},
    {"--alignment", OBR::MemPool::NUV_OBR_MEMPOOL_DATA_ALIGNMENT,
     "Data sizes are rounded up to a multiple of it"},
};

int Run(int argc, char** argv) {
    CLI::App app(description);
    app.footer(notes);

    std::vector<std::string> paths;
    unsigned int rounds = 11;
    bool dbg = false;
    app.add_option("TRACE", paths, "Files to replay, one after the other")
        ->required()
        ->type_name("");
    for (const Setting& setting : settings) {
        app.add_option_function<unsigned int>(setting.option, setting.store, setting.help)
            ->check(CLI::Range(1, 65535))
            ->type_name("BYTES");
    }
    app.add_flag_callback(
        "--keep-empty", [] { OBR::MemPool::NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS(true); },
        "Keep buckets that become empty");
    app.add_option("--rounds", rounds, "Timed replays a side")
        ->type_name("N")
        ->check(CLI::Range(1, 1000000))
        ->capture_default_str();
    app.add_flag("--dbg", dbg, "Print the report of each pool at the peak");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
    }
    OBR::MemPool::NUV_OBR_MEMPOOL_ON(true);
    OBR::MemPool::NUV_OBR_MEMPOOL_TRACE(false);

    int status = EXIT_SUCCESS;
    for (const std::string& path : paths) {
        try {
            Compare(path, rounds, dbg);
        } catch (const std::bad_alloc&) {
            std::cerr << "mempool-replay: " << path << ": out of memory\n";
            status = EXIT_FAILURE;
        } catch (const std::exception& error) {
            std::cerr << "mempool-replay: " << error.what() << '\n';
            status = EXIT_FAILURE;
        }
    }
    return status;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception& error) {
        std::cerr << "mempool-replay: " << error.what() << '\n';
        return EXIT_FAILURE;
    }
}
