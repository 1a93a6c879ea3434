// The buffer of an Input. The bytes ahead move to its front before more are read, and it grows when
// they fill it.

#include "trace/Input.hpp"

#include <cstring>
#include <utility>

namespace Trace {

namespace {

constexpr std::size_t blockSize = std::size_t{1} << 18;

}  // namespace

Input::Input(std::unique_ptr<ByteSource> byteSource)
    : source(std::move(byteSource)), buffer(blockSize) {}

bool Input::ReadMore() {
    if (first != 0) { std::memmove(buffer.data(), buffer.data() + first, last - first); }
    last -= first;
    first = 0;
    if (last == buffer.size()) { buffer.resize(2 * buffer.size()); }
    const std::size_t numRead = source->Read(buffer.data() + last, buffer.size() - last);
    last += numRead;
    return numRead != 0;
}

}  // namespace Trace
