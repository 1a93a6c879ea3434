// A preloaded library has no effect in a program that runs with other rights, is built for another
// kind of machine, or is statically linked. The program's file shows that before the program runs.

#include "system/ProgramFile.hpp"

#include <fcntl.h>
#include <gelf.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <stdexcept>

#include "system/Descriptor.hpp"
#include "system/ExitStatus.hpp"

namespace System {

namespace {

[[noreturn]] void Refuse(const std::string& name, const std::string& reason) {
    throw Failure(cannotRun, name + ": " + reason);
}

bool IsFile(const std::string& path) {
    struct stat status = {};
    return stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

void CheckRights(const std::string& name, const std::string& path, const std::string& done) {
    struct stat status = {};
    if (stat(path.c_str(), &status) != 0) {
        throw Failure(errno == ENOENT || errno == ENOTDIR ? notFound : cannotRun, name, errno);
    }
    if (S_ISDIR(status.st_mode)) { throw Failure(cannotRun, name, EISDIR); }
    if (access(path.c_str(), X_OK) != 0) { throw Failure(cannotRun, name, errno); }
    const bool isOthers = (status.st_mode & S_ISUID) != 0 && status.st_uid != geteuid();
    const bool isOtherGroups = (status.st_mode & S_ISGID) != 0 && status.st_gid != getegid();
    if (isOthers || isOtherGroups) {
        Refuse(name, "runs with the rights of another user or group: cannot be " + done);
    }
    if (geteuid() != 0 && getxattr(path.c_str(), "security.capability", nullptr, 0) > 0) {
        Refuse(name, "runs with capabilities of its own: cannot be " + done);
    }
}

// The interpreter that a script names, or "".
std::string Interpreter(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    std::string line;
    std::getline(file, line);
    if (line.substr(0, 2) != "#!") { return ""; }
    std::istringstream words(line.substr(2));
    std::string interpreter;
    words >> interpreter;
    return interpreter;
}

// A file that libelf reads. Get is null if it cannot be read or is not an ELF file.
class ElfFile {
public:
    explicit ElfFile(const std::string& path)
        : file(open(path.c_str(), O_RDONLY | O_CLOEXEC)), elf(nullptr, elf_end) {
        elf_version(EV_CURRENT);
        if (file.IsOpen()) { elf.reset(elf_begin(file.Number(), ELF_C_READ, nullptr)); }
        if (elf_kind(elf.get()) != ELF_K_ELF) { elf.reset(); }
    }

    Elf* Get() const { return elf.get(); }

    off_t Size() const {
        struct stat status = {};
        fstat(file.Number(), &status);
        return status.st_size;
    }

private:
    const Descriptor file;
    std::unique_ptr<Elf, int (*)(Elf*)> elf;
};

void CheckElf(const std::string& name, const std::string& path, const std::string& done) {
    const ElfFile file(path);
    if (file.Get() == nullptr) { return; }  // It may be executable but not readable.
    const std::string damaged = "is damaged or cut short: cannot be " + done;
    GElf_Ehdr header = {};
    GElf_Ehdr own = {};
    if (gelf_getehdr(file.Get(), &header) == nullptr) { Refuse(name, damaged); }
    gelf_getehdr(ElfFile("/proc/self/exe").Get(), &own);
    if (header.e_ident[EI_CLASS] != own.e_ident[EI_CLASS] || header.e_machine != own.e_machine) {
        Refuse(name, "is a program for another kind of machine: cannot be " + done);
    }
    std::size_t number = 0;
    if (elf_getphdrnum(file.Get(), &number) != 0) { Refuse(name, damaged); }
    bool hasLoader = false;
    for (std::size_t index = 0; index != number; ++index) {
        GElf_Phdr segment = {};
        if (gelf_getphdr(file.Get(), static_cast<int>(index), &segment) == nullptr ||
            segment.p_offset + segment.p_filesz > static_cast<GElf_Off>(file.Size())) {
            Refuse(name, damaged);
        }
        hasLoader = hasLoader || segment.p_type == PT_INTERP;
    }
    if (!hasLoader) { Refuse(name, "is statically linked: cannot be " + done); }
}

}  // namespace

std::string FindProgram(const std::string& name) {
    if (name.find('/') != std::string::npos) { return name; }
    const char* const folders = std::getenv("PATH");
    std::istringstream list(folders != nullptr ? folders : "/bin:/usr/bin");
    std::string notExecutable;
    for (std::string folder; std::getline(list, folder, ':');) {
        std::string path = (folder.empty() ? "." : folder) + "/" + name;
        if (!IsFile(path)) { continue; }
        if (access(path.c_str(), X_OK) == 0) { return path; }
        notExecutable = path;
    }
    return notExecutable.empty() ? name : notExecutable;
}

std::string CheckPreload(const std::string& name, const std::string& done) {
    std::string path = FindProgram(name);
    CheckRights(name, path, done);
    constexpr int mostInterpreters = 4;  // As many as the kernel follows.
    for (int depth = 0; depth != mostInterpreters; ++depth) {
        const std::string interpreter = Interpreter(path);
        if (interpreter.empty()) { break; }
        path = interpreter;
        CheckRights(std::string(name).append(": ").append(interpreter), path, done);
    }
    CheckElf(name, path, done);
    return path;
}

bool IsAddressSanitized(const std::string& path) {
    const ElfFile file(path);
    for (Elf_Scn* section = nullptr; (section = elf_nextscn(file.Get(), section)) != nullptr;) {
        GElf_Shdr header = {};
        if (gelf_getshdr(section, &header) == nullptr || header.sh_type != SHT_DYNSYM) { continue; }
        Elf_Data* const data = elf_getdata(section, nullptr);
        GElf_Sym symbol = {};
        for (int index = 0; gelf_getsym(data, index, &symbol) != nullptr; ++index) {
            const char* const text = elf_strptr(file.Get(), header.sh_link, symbol.st_name);
            if (text != nullptr && std::strcmp(text, "__asan_init") == 0) { return true; }
        }
    }
    return false;
}

std::string FindBesideTool(const std::string& folders, const std::string& name) {
    const std::filesystem::path here =
        std::filesystem::read_symlink("/proc/self/exe").parent_path();
    std::istringstream places(folders);
    for (std::string place; std::getline(places, place, ':');) {
        const std::filesystem::path path = (here / place / name).lexically_normal();
        if (exists(path)) { return path; }
    }
    throw std::runtime_error(name + " is not installed with " + here.string());
}

}  // namespace System
