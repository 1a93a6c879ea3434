// Reads through zlib, which recognises a compressed file by its first bytes and copies any other.

#include "trace/GzSource.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <system_error>

namespace Trace {

namespace {

gzFile Open(const std::string& path) {
    const int descriptor = path == "-" ? fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0)
                                       : open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (descriptor < 0) { throw std::system_error(errno, std::generic_category()); }
    gzFile file = gzdopen(descriptor, "rb");
    if (file == nullptr) { close(descriptor); }
    return file;
}

}  // namespace

GzSource::GzSource(const std::string& path) : file(Open(path), gzclose) {
    if (file == nullptr) { throw std::bad_alloc(); }
    gzbuffer(file.get(), 1U << 17);
}

std::size_t GzSource::Read(char* bytes, std::size_t size) {
    constexpr std::size_t largest = std::numeric_limits<int>::max();
    const auto most = static_cast<unsigned>(std::min(size, largest));
    const int numRead = gzread(file.get(), bytes, most);
    return numRead > 0 ? static_cast<std::size_t>(numRead) : 0;
}

std::string GzSource::Problem() const {
    int code = Z_OK;
    const std::string text = gzerror(file.get(), &code);
    if (code == Z_OK) { return ""; }
    const std::size_t colon = text.find(": ");  // zlib puts the descriptor before it.
    return colon == std::string::npos ? text : text.substr(colon + 2);
}

}  // namespace Trace
