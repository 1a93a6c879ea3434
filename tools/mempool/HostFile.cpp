// Looks for a few texts in the whole file. So it also sees what a stripped program has, and what is
// only loaded at run time by its name.

#include "mempool/HostFile.hpp"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>
#include <system_error>

namespace Tool {

namespace {

// A file's bytes.
class Mapping {
public:
    explicit Mapping(const std::string& path) {
        const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
        struct stat status {};
        bool isRead = file >= 0 && fstat(file, &status) == 0;
        if (isRead && status.st_size > 0) {
            size = static_cast<std::size_t>(status.st_size);
            start = mmap(nullptr, size, PROT_READ, MAP_PRIVATE, file, 0);
            isRead = start != MAP_FAILED;
        }
        const int reason = errno;
        if (file >= 0) { close(file); }
        if (!isRead) { throw std::system_error(reason, std::generic_category(), path); }
    }
    Mapping(const Mapping&) = delete;
    Mapping& operator=(const Mapping&) = delete;
    ~Mapping() {
        if (size > 0) { munmap(start, size); }
    }

    std::string_view Bytes() const { return {static_cast<const char*>(start), size}; }

private:
    void* start = nullptr;
    std::size_t size = 0;
};

}  // namespace

HostFile ReadHostFile(const std::string& path) {
    const Mapping file(path);
    const std::string_view bytes = file.Bytes();
    const auto has = [&](std::string_view text) { return bytes.find(text) != bytes.npos; };
    HostFile host;
    host.isScript = bytes.substr(0, 4) != "\177ELF";
    host.isSanitized = has("__asan_init");
    host.namesLibrary = has("libObrMemPool.so");
    // The name of a setting is in each program that reads the settings by itself.
    host.holdsLibrary = !host.namesLibrary && has("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS");
    return host;
}

}  // namespace Tool
