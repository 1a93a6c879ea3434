// The bytes of a trace. A *byte source* reads them piece by piece. An Input keeps the unused ones
// contiguous, so that a reader sees a line or a chunk as a whole.

#ifndef OBR_TOOLS_TRACE_INPUT_HPP
#define OBR_TOOLS_TRACE_INPUT_HPP

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace Trace {

class ByteSource {
public:
    ByteSource() = default;
    ByteSource(const ByteSource&) = delete;
    ByteSource& operator=(const ByteSource&) = delete;
    virtual ~ByteSource() = default;

    // Reads up to `size` bytes and returns their number, 0 at the end.
    virtual std::size_t Read(char* bytes, std::size_t size) = 0;

    // After the end: why the bytes are not complete, or empty if they are.
    virtual std::string Problem() const = 0;
};

class Input {
public:
    explicit Input(std::unique_ptr<ByteSource> byteSource);

    // The bytes that are read but not yet used. Valid until the next ReadMore.
    std::string_view Ahead() const { return {buffer.data() + first, last - first}; }

    // Appends to the bytes ahead; false at the end.
    bool ReadMore();

    // Drops the first `number` of the bytes ahead.
    void Skip(std::size_t number) { first += number; }

    std::string Problem() const { return source->Problem(); }

private:
    std::unique_ptr<ByteSource> source;
    std::vector<char> buffer;
    std::size_t first = 0;
    std::size_t last = 0;
};

}  // namespace Trace

#endif
