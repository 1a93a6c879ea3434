// The only place that knows the forms of a trace.

#include "trace/OpenTrace.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <limits>
#include <memory>
#include <new>
#include <stdexcept>
#include <system_error>
#include <utility>

#include <zlib.h>

#include "trace/CompactForm.hpp"
#include "trace/CompactReader.hpp"
#include "trace/TextReader.hpp"

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

// Reads through zlib, which recognises a compressed file by its first bytes and copies any other.
class GzSource final : public ByteSource {
public:
    explicit GzSource(const std::string& path) : file(Open(path), gzclose) {
        if (file == nullptr) { throw std::bad_alloc(); }
        gzbuffer(file.get(), 1U << 17);
    }

    std::size_t Read(char* bytes, std::size_t size) override {
        constexpr std::size_t largest = std::numeric_limits<int>::max();
        const auto most = static_cast<unsigned>(std::min(size, largest));
        const int numRead = gzread(file.get(), bytes, most);
        return numRead > 0 ? static_cast<std::size_t>(numRead) : 0;
    }

    std::string Problem() const override {
        int code = Z_OK;
        const std::string text = gzerror(file.get(), &code);
        if (code == Z_OK) { return ""; }
        const std::size_t colon = text.find(": ");  // zlib puts the descriptor before it.
        return colon == std::string::npos ? text : text.substr(colon + 2);
    }

private:
    std::unique_ptr<gzFile_s, int (*)(gzFile)> file;
};

}  // namespace

std::unique_ptr<EventSource> MakeReader(Input input) {
    while (input.Ahead().size() < compactMagic.size() && input.ReadMore()) {}
    if (input.Ahead().substr(0, compactMagic.size()) == compactMagic) {
        return std::make_unique<CompactReader>(std::move(input));
    }
    return std::make_unique<TextReader>(std::move(input));
}

std::unique_ptr<EventSource> OpenTrace(const std::string& path) {
    try {
        Input input(std::make_unique<GzSource>(path));
        const bool isEmpty = !input.ReadMore();
        const std::string problem = input.Problem();
        if (isEmpty && !problem.empty()) { throw std::runtime_error(path + ": " + problem); }
        return MakeReader(std::move(input));
    } catch (const std::system_error& error) {
        throw std::runtime_error(path + ": " + error.code().message());
    }
}

}  // namespace Trace
