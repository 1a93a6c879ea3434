// What the loader makes of a preloaded library is decided by the program's file: it ignores one in
// a program that runs with other rights than ours, in one for another machine, and where there is
// no loader at all. Better told ahead than found out behind.

#include "record/Command.hpp"

#include <elf.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <system_error>

namespace Record {

namespace {

[[noreturn]] void Refuse(const std::string& name, const std::string& reason) {
    throw Refusal(126, name + ": " + reason);
}

bool IsFile(const std::string& path) {
    struct stat status = {};
    return stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

void CheckRights(const std::string& name, const std::string& path, const std::string& done) {
    struct stat status = {};
    if (stat(path.c_str(), &status) != 0) {
        throw Refusal(errno == ENOENT || errno == ENOTDIR ? 127 : 126,
                      name + ": " + std::generic_category().message(errno));
    }
    if (S_ISDIR(status.st_mode)) { Refuse(name, "Is a directory"); }
    if (access(path.c_str(), X_OK) != 0) { Refuse(name, std::generic_category().message(errno)); }
    const bool isOthers = (status.st_mode & S_ISUID) != 0 && status.st_uid != geteuid();
    const bool isOtherGroups = (status.st_mode & S_ISGID) != 0 && status.st_gid != getegid();
    if (isOthers || isOtherGroups) {
        Refuse(name, "runs with the rights of another user or group: cannot be " + done);
    }
    if (geteuid() != 0 && getxattr(path.c_str(), "security.capability", nullptr, 0) > 0) {
        Refuse(name, "runs with capabilities of its own: cannot be " + done);
    }
}

// The interpreter of a script that names one, else "".
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

void CheckElf(const std::string& name, const std::string& path, const std::string& done) {
    std::ifstream file(path, std::ios::binary);
    if (!file) { return; }  // It may be executed and not read.
    Elf64_Ehdr header = {};
    file.read(reinterpret_cast<char*>(&header), sizeof(header));
    if (std::memcmp(header.e_ident, ELFMAG, SELFMAG) != 0) { return; }
    Elf64_Ehdr own = {};
    std::ifstream("/proc/self/exe", std::ios::binary)
        .read(reinterpret_cast<char*>(&own), sizeof(own));
    if (!file || header.e_ident[EI_CLASS] != own.e_ident[EI_CLASS] ||
        header.e_machine != own.e_machine) {
        Refuse(name, "is a program for another kind of machine: cannot be " + done);
    }
    for (unsigned int index = 0; index != header.e_phnum; ++index) {
        Elf64_Phdr segment = {};
        file.seekg(static_cast<std::streamoff>(header.e_phoff + index * sizeof(segment)));
        file.read(reinterpret_cast<char*>(&segment), sizeof(segment));
        if (file && segment.p_type == PT_INTERP) { return; }
    }
    Refuse(name, "is statically linked: cannot be " + done);
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

void CheckProgram(const std::string& name, const std::string& done) {
    std::string path = FindProgram(name);
    CheckRights(name, path, done);
    constexpr int mostInterpreters =
        4;  // Of scripts that interpret scripts, as many as the kernel takes.
    for (int depth = 0; depth != mostInterpreters; ++depth) {
        const std::string interpreter = Interpreter(path);
        if (interpreter.empty()) { break; }
        path = interpreter;
        CheckRights(std::string(name).append(": ").append(interpreter), path, done);
    }
    CheckElf(name, path, done);
}

}  // namespace Record
