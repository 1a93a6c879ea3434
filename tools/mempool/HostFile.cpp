// Searches the whole file for a few texts. This also works for a stripped program, and for
// libraries that it loads by name while it runs.

#include "mempool/HostFile.hpp"

#include <fcntl.h>
#include <libelf.h>

#include <cerrno>
#include <memory>
#include <string_view>

#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"
#include "system/ProgramFile.hpp"

namespace Tool {

HostFile ReadHostFile(const std::string& path) {
    const System::Descriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!file.IsOpen()) { throw System::Failure(System::cannotRun, path, errno); }
    elf_version(EV_CURRENT);
    const std::unique_ptr<Elf, int (*)(Elf*)> elf(
        elf_begin(file.Number(), ELF_C_READ_MMAP, nullptr), elf_end);
    std::size_t size = 0;
    const char* const start = elf_rawfile(elf.get(), &size);
    const std::string_view bytes(start, start == nullptr ? 0 : size);
    const auto has = [&](std::string_view text) { return bytes.find(text) != bytes.npos; };

    HostFile host;
    host.isScript = elf_kind(elf.get()) != ELF_K_ELF;
    host.isSanitized = System::IsAddressSanitized(path);
    host.namesLibrary = has("libObrMemPool.so") || has("libObrMemPoolC.so");
    // Every program that reads the settings itself contains the name of one.
    host.holdsLibrary = !host.namesLibrary && has("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS");
    return host;
}

}  // namespace Tool
