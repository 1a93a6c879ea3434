// The exact text of each traced event, and how it reaches the buffer of standard output whole.

#include "diagnostics/text/Trace.hpp"

#include <algorithm>
#include <cstddef>
#include <iostream>
#include <streambuf>
#include <string_view>

#include "MemPool/Settings.hpp"
#include "diagnostics/text/Text.hpp"

namespace OBR::MemPool::Trace {

namespace {

// Reaches what a buffer of any class keeps from all but its heirs: how far its memory is filled.
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

    // Takes the beginning of `line` back if that is what the buffer got since it had this extent.
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

// Past the stream's insertions, which heed its width and its locale and may throw. A stream that
// the host has marked as failed takes no line, as it takes no other output.
//
// A buffer that has to grow for a line and cannot (that of a string stream without memory) has
// filled the room there was. That beginning is taken back, or the next line would stand glued to
// it.
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

}  // namespace OBR::MemPool::Trace
