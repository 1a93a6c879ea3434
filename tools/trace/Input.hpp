// The bytes of a trace. A *byte source* gives them block by block; an Input keeps those that are
// read and not yet used side by side, so that a reader looks at a line or a record as a whole.

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

    // Reads up to `size` bytes and returns their number; 0 at the end.
    virtual std::size_t Read(char* bytes, std::size_t size) = 0;

    // Behind the end: why it is not that of the whole, or empty if it is.
    virtual std::string Problem() const = 0;
};

class Input {
public:
    explicit Input(std::unique_ptr<ByteSource> byteSource);

    // The bytes read and not yet used, as long as nothing more is read.
    std::string_view Ahead() const { return {buffer.data() + first, last - first}; }

    // Reads on; false at the end. What was ahead stays so, at another place.
    bool ReadMore();

    // Uses up the first `number` bytes of those ahead.
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
