// mempool check: runs a program with pools enabled, with the checked library, and under a checker.

#include <fcntl.h>
#include <libelf.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <map>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <MemPoolSettings>

#include "mempool/CommandLine.hpp"
#include "system/Child.hpp"
#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"
#include "system/ProgramFile.hpp"

namespace Tool {

namespace {

constexpr const char* description = "Run a program with pools that report its memory errors";

constexpr const char* notes =
    R"(The program runs unchanged, with pools enabled and the checked library instead of the ordinary one.
In that library each block is a heap block of its own, so that a checker sees a use after Free or
Clear, an overrun and an underrun. The library itself reports on standard error each release that it
refuses, each header that an underrun has damaged, and the blocks that are still in use when their
pool or the process ends.

asan          AddressSanitizer, for a program that is built with -fsanitize=address.
valgrind      Valgrind's memcheck, for any other program.
nothing       Only the library, for instance to run the program under gdb.

The default is asan for a program that is built with it, else valgrind if it is installed.

Sizes are not rounded, so that one-byte overruns are caught. If the program relies on the rounding,
use --alignment.

ASAN_OPTIONS            This and VALGRIND_OPTS are kept. By default there are red zones of 128 bytes
                        and, under Valgrind, stacks of 30 frames.
MEMPOOL_ABORT           1: the library aborts at a release that it refuses, so that a debugger
                        stops there.
MEMPOOL_CHECK_STATUS    The exit status, from 1 to 255, for faults that only the library reports, 99
                        by default; 0 keeps the program's.

Exit status: the checker's if it found a fault, 1 from AddressSanitizer and 99 from Valgrind; else
the program's. If that is 0, by exit or at the end of main, but the library reported a fault, it is
99. This applies to each process that the program starts. 125 if nothing was run, 126 if the program
cannot be run or checked, 127 if it is not found.
)";

enum class With { asan, valgrind, nothing };
const std::map<std::string, With> checkers = {
    {"asan", With::asan}, {"valgrind", With::valgrind}, {"nothing", With::nothing}};

struct Options {
    std::optional<With> with;
    unsigned int alignment = 1;
};

// Facts about the program, from its file.
struct HostFile {
    bool isScript;      // Then the other three are unknown.
    bool isSanitized;   // Built with AddressSanitizer.
    bool namesLibrary;  // Names the shared library, to be loaded at the start or later.
    bool holdsLibrary;  // Contains the archive.
};

// Searches the whole file for a few texts. This also works for a stripped program, and for
// libraries that it loads by name while it runs.
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

    const bool namesLibrary = has("libObrMemPool.so") || has("libObrMemPoolC.so");
    // Every program that reads the settings itself contains the name of one.
    return {elf_kind(elf.get()) != ELF_K_ELF, System::IsAddressSanitized(path), namesLibrary,
            !namesLibrary && has("NUV_OBR_MEMPOOL_KEEP_EMPTY_BUCKETS")};
}

void Say(const std::string& what) {
    std::cerr << "mempool: " << what << '\n';
}

With Choose(const Options& options, const HostFile& host, const std::string& program) {
    const bool hasValgrind = System::FindProgram("valgrind") != "valgrind";
    const With fitting = host.isSanitized ? With::asan
                         : hasValgrind    ? With::valgrind
                                          : With::nothing;
    const With with = options.with.value_or(fitting);
    if (with == With::asan && !host.isSanitized && !host.isScript) {
        throw std::runtime_error(program + " is not built with -fsanitize=address");
    }
    if (with == With::valgrind && host.isSanitized) {
        throw std::runtime_error(
            program + " is built with -fsanitize=address, which does not run under Valgrind");
    }
    if (with == With::valgrind && !hasValgrind) {
        throw std::runtime_error("Valgrind is not installed (Debian package valgrind)");
    }
    return with;
}

// Puts a value before the present value of a variable.
void Prepend(const char* variable, const std::string& value, char separator = ':') {
    const char* const present = std::getenv(variable);
    const bool isEmpty = present == nullptr || *present == '\0';
    setenv(variable, (isEmpty ? value : value + separator + present).c_str(), 1);
}

void SetEnvironment(const Options& options) {
    const std::filesystem::path library =
        System::FindBesideTool(CHECKED_PLACES, "libObrMemPool.so.1");
    setenv("NUV_OBR_MEMPOOL_ON", "1", 1);
    setenv("MEMPOOL_CHECK_ALIGNMENT", std::to_string(options.alignment).c_str(), 1);
    setenv("MEMPOOL_CHECK_STATUS", "99", 0);
    // A program's own RPATH can come before LD_LIBRARY_PATH; only a preload overrides it. By
    // default AddressSanitizer refuses to run if it is not the first library.
    Prepend("LD_LIBRARY_PATH", library.parent_path());
    Prepend("LD_PRELOAD", library);
    Prepend("ASAN_OPTIONS", "redzone=128:verify_asan_link_order=0");
    Prepend("VALGRIND_OPTS", "--num-callers=30", ' ');
}

[[noreturn]] void Check(const Options& options, std::vector<std::string> command) {
    const std::string program = command[0];
    System::CheckPreload(program, "checked");
    const HostFile host = ReadHostFile(System::FindProgram(program));
    if (host.holdsLibrary) {
        throw std::runtime_error(program +
                                 " contains the library (libObrMemPool.a); to check it, " +
                                 "link the shared library");
    }
    if (!host.isScript && !host.namesLibrary) {
        Say(program + " does not use libObrMemPool.so itself; what it loads or starts may");
    }
    const With with = Choose(options, host, program);
    SetEnvironment(options);
    for (const auto& [name, checker] : checkers) {
        if (checker == with) { Say("checking with " + name); }
    }
    if (with == With::valgrind) {
        std::vector<std::string> valgrind = {"valgrind", "--quiet", "--error-exitcode=99",
                                             "--redzone-size=128"};
        if (host.isScript) { valgrind.emplace_back("--trace-children=yes"); }
        valgrind.emplace_back("--");
        command.insert(command.begin(), valgrind.begin(), valgrind.end());
    }
    System::Become(command);
}

}  // namespace

void AddCheck(Program& program) {
    Subcommand check(program, "check", description, notes);
    constexpr OBR::MemPool::Setting alignment = OBR::MemPool::SettingTable::dataAlignment;
    check.AddCommand();
    const auto options = std::make_shared<Options>();
    check.AddChoice("--with", checkers, options->with, "CHECKER",
                    "The checker that the program runs under");
    check.AddNumber(alignment.option, options->alignment, 1, 64, alignment.help, "BYTES");
    check.SetJob([&program, options] {
        return [options, command = program.command]() -> int { Check(*options, command); };
    });
}

}  // namespace Tool
