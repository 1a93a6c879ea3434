// A file or the standard input as a byte source. Data compressed by gzip is decompressed.

#ifndef OBR_TOOLS_TRACE_GZSOURCE_HPP
#define OBR_TOOLS_TRACE_GZSOURCE_HPP

#include <memory>
#include <string>

#include <zlib.h>

#include "trace/Input.hpp"

namespace Trace {

class GzSource final : public ByteSource {
public:
    // "-" is the standard input. Throws std::system_error if the file cannot be opened.
    explicit GzSource(const std::string& path);

    std::size_t Read(char* bytes, std::size_t size) override;
    std::string Problem() const override;

private:
    std::unique_ptr<gzFile_s, int (*)(gzFile)> file;
};

}  // namespace Trace

#endif
