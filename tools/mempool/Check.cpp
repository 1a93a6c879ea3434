// mempool check: runs a program with pools on, over the checked library, and under a checker.

#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <map>
#include <memory>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <MemPoolSettings>

#include "mempool/Command.hpp"
#include "mempool/HostFile.hpp"
#include "mempool/Program.hpp"
#include "record/Command.hpp"

namespace Tool {

namespace {

namespace fs = std::filesystem;

constexpr const char* description = "Run a program on pools that tell its faults";

constexpr const char* notes =
    R"(The program runs as it is, with the checked library in place of the ordinary one: each block is a
block of the heap by itself, so that a checker sees a use after free or after Clear, an overrun and
an underrun. The library itself tells on standard error a release that it refuses, a header that an
underrun has damaged, and the blocks that live when their pool or the process ends.

asan          The program is built with -fsanitize=address.
valgrind      It is not, and runs under Valgrind's memcheck.
nothing       Only the library looks. Say it to run under another tool, or under gdb.

Without --with it is asan for a program that is built so, else valgrind where it is installed.

Variables: NUV_OBR_MEMPOOL_DATA_ALIGNMENT and NUV_OBR_MEMPOOL_MIN_RECORD_SIZE are 1 and 4 unless
they are set, so that a block ends where the host's data end. ASAN_OPTIONS and VALGRIND_OPTS are
heeded, before the default red zones of 128 bytes in the first. MEMPOOL_ABORT=1 has the library
abort at a release that it refuses, for a debugger to stand there.

Exit status: the program's, or of the checker where it found something: 1 of AddressSanitizer, 99 of
Valgrind. Where only the library told something, 99 in place of 0; MEMPOOL_CHECK_STATUS is another
number for it, and 0 leaves the program's. It is for ends by exit or of main, and each process that
the program starts has its own. 125 if nothing was run, 126 if the program cannot be, 127 if there
is none of that name.
)";

enum class With { asan, valgrind, nothing };
const std::map<std::string, With> checkers = {
    {"asan", With::asan}, {"valgrind", With::valgrind}, {"nothing", With::nothing}};

struct Options {
    std::string with;  // A name of `checkers`, or empty.
    std::optional<unsigned int> alignment;
};

void Say(const std::string& what) {
    std::cerr << "mempool: " << what << '\n';
}

// The first of the places beside this tool that has the checked library: in an install, and where
// the tool was built.
fs::path CheckedLibrary() {
    const fs::path here = fs::read_symlink("/proc/self/exe").parent_path();
    std::istringstream places(CHECKED_PLACES);
    for (std::string place; std::getline(places, place, ':');) {
        fs::path library = (here / place / "libObrMemPool.so.1").lexically_normal();
        if (fs::exists(library)) { return library; }
    }
    throw std::runtime_error("the checked library is not installed beside " + here.string());
}

With Choose(const Options& options, const HostFile& host, const std::string& program) {
    const bool hasValgrind = Record::FindProgram("valgrind") != "valgrind";
    const With fitting = host.isSanitized ? With::asan
                         : hasValgrind    ? With::valgrind
                                          : With::nothing;
    const With with = options.with.empty() ? fitting : checkers.at(options.with);
    if (with == With::asan && !host.isSanitized && !host.isScript) {
        throw std::runtime_error(program + " is not built with -fsanitize=address");
    }
    if (with == With::valgrind && host.isSanitized) {
        throw std::runtime_error(
            program + " is built with -fsanitize=address, which does not run " + "under Valgrind");
    }
    if (with == With::valgrind && !hasValgrind) {
        throw std::runtime_error("Valgrind is not installed (Debian package valgrind)");
    }
    return with;
}

void Default(const char* variable, const std::string& value) {
    setenv(variable, value.c_str(), 0);
}

// Puts a value in front of those that a variable has.
void Prepend(const char* variable, const std::string& value) {
    const char* const present = std::getenv(variable);
    const bool isEmpty = present == nullptr || *present == '\0';
    setenv(variable, (isEmpty ? value : value + ":" + present).c_str(), 1);
}

void SetEnvironment(const Options& options) {
    using namespace OBR::MemPool::SettingTable;
    const fs::path library = CheckedLibrary();
    setenv("NUV_OBR_MEMPOOL_ON", "1", 1);
    if (options.alignment) {
        setenv(dataAlignment.variable, std::to_string(*options.alignment).c_str(), 1);
    }
    Default(dataAlignment.variable, std::to_string(dataAlignment.smallest));
    Default(minRecordSize.variable, std::to_string(minRecordSize.smallest));
    Default("MEMPOOL_CHECK_STATUS", "99");
    // A program may say itself where its libraries are, against which only a preload helps;
    // AddressSanitizer else wants to be the first library.
    Prepend("LD_LIBRARY_PATH", library.parent_path());
    Prepend("LD_PRELOAD", library);
    Prepend("ASAN_OPTIONS", "redzone=128:verify_asan_link_order=0");
}

// Becomes the program.
[[noreturn]] void Become(const std::vector<std::string>& command) {
    std::vector<char*> words;
    words.reserve(command.size() + 1);
    for (const std::string& word : command) { words.push_back(const_cast<char*>(word.c_str())); }
    words.push_back(nullptr);
    execvp(words[0], words.data());
    const int reason = errno;
    throw Record::Refusal(reason == ENOENT ? 127 : 126, command[0] + ": " + std::strerror(reason));
}

[[noreturn]] void Check(const Options& options, std::vector<std::string> command) {
    const std::string program = command[0];
    Record::CheckProgram(program, "checked");
    const HostFile host = ReadHostFile(Record::FindProgram(program));
    if (host.holdsLibrary) {
        throw std::runtime_error(program + " has the library in it (libObrMemPool.a): link the " +
                                 "shared one to check it");
    }
    if (!host.isScript && !host.namesLibrary) {
        Say(program + " itself does not use libObrMemPool.so: what it loads or starts may");
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
    Become(command);
}

}  // namespace

void AddCheck(Program& program) {
    CLI::App& check = *program.commandLine.add_subcommand("check", description);
    check.footer(notes);
    constexpr OBR::MemPool::Setting alignment = OBR::MemPool::SettingTable::dataAlignment;
    AddCommand(program, check);
    const auto options = std::make_shared<Options>();
    check.add_option("--with", options->with, "What looks beside the library")
        ->type_name("CHECKER")
        ->check(CLI::IsMember(&checkers));
    check.add_option(alignment.option, options->alignment, alignment.help)
        ->type_name("BYTES")
        ->check(CLI::Range(alignment.smallest, alignment.largest).description(""));
    check.callback([&program, options] {
        const std::vector<std::string> command = program.command;
        if (command.empty()) { throw CLI::RequiredError("PROGRAM"); }
        program.job = [options, command] {
            int status = ownFailure;
            try {
                Check(*options, command);
            } catch (const Record::Refusal& refusal) {
                status = refusal.Status();
                Say(refusal.what());
            } catch (const std::exception& error) { Say(error.what()); }
            return status;
        };
    });
}

}  // namespace Tool
