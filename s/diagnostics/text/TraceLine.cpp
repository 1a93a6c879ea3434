// The exact line of each traced event, written as a whole to the buffer of standard output.

#include "diagnostics/text/TraceLine.hpp"

#include <algorithm>
#include <cstddef>
#include <iostream>
#include <streambuf>
#include <string_view>

#include "MemPool/Settings.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool::TraceLine {

namespace {

// Gives access to the protected members that say how far the memory of a stream buffer is filled.
class Buffer : std::streambuf {
public:
    struct Extent {
        std::ptrdiff_t written;
        std::ptrdiff_t readable;
    };
    static Extent ExtentOf(const std::streambuf& buf) {
        return {(buf.*&Buffer::pptr)() - (buf.*&Buffer::pbase)(),
                (buf.*&Buffer::egptr)() - (buf.*&Buffer::eback)()};
    }

    // Removes the beginning of `line` if that is what the buffer has received since `before`.
    static void TakeBack(std::streambuf& buf, const Extent& before, std::string_view line) {
        const Extent now = ExtentOf(buf);
        if (now.written <= before.written) { return; }
        const std::string_view added((buf.*&Buffer::pbase)() + before.written,
                                     static_cast<std::size_t>(now.written - before.written));
        if (added != line.substr(0, added.size())) { return; }
        (buf.*&Buffer::pbump)(-static_cast<int>(added.size()));
        char* const begin = (buf.*&Buffer::eback)();
        (buf.*&Buffer::setg)(begin, (buf.*&Buffer::gptr)(),
                             begin + std::min(before.readable, now.readable));
    }
};

// Writes to the buffer directly, since the stream's operators use its width and its locale and may
// throw. A stream in a failed state gets no line, like any other output.
//
// A buffer that cannot grow for a line (a string stream's, if memory is exhausted) keeps the
// beginning of the line. That is removed, or the next line would be appended to it.
void Write(FixedText& text) noexcept {
    if (!std::cout.good()) { return; }
    std::streambuf& buf = *std::cout.rdbuf();
    const Buffer::Extent before = Buffer::ExtentOf(buf);
    const std::string_view line = text.Add("\n").View();
    const auto size = static_cast<std::streamsize>(line.size());
    bool isWhole = false;
    try {
        isWhole = buf.sputn(line.data(), size) == size;
        if (isWhole) { buf.pubsync(); }
    } catch (...) {}
    if (!isWhole) { Buffer::TakeBack(buf, before, line); }
}

}  // namespace

void PoolCreated(const BucketMgr* pool) noexcept {
    if (Settings::trace) { Write(FixedText().Add("xmpt:c:").AddBareHex(pool)); }
}

void BlockAllocated(const BucketMgr* pool, const void* data, std::uint32_t size) noexcept {
    if (!Settings::trace) { return; }
    Write(FixedText().Add("xmpt:a:").AddBareHex(pool).Add(":").AddBareHex(data).Add(":").AddNumber(
        size));
}

void BlockFreed(const BucketMgr* pool, const void* data) noexcept {
    if (!Settings::trace) { return; }
    Write(FixedText().Add("xmpt:f:").AddBareHex(pool).Add(":").AddBareHex(data).Add(":"));
}

void PoolDestroyed(const BucketMgr* pool) noexcept {
    if (Settings::trace) { Write(FixedText().Add("xmpt:d:").AddBareHex(pool)); }
}

}  // namespace OBR::MemPool::TraceLine
