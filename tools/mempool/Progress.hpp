// One line of a terminal that is written over and over, on standard error. Nothing is shown in a
// file or a pipe.

#ifndef OBR_TOOLS_MEMPOOL_PROGRESS_HPP
#define OBR_TOOLS_MEMPOOL_PROGRESS_HPP

#include <unistd.h>

#include <iostream>
#include <string>
#include <utility>

namespace Tool {

class Progress {
public:
    // Each text begins with what the work is about, such as the path of a trace.
    explicit Progress(std::string about) : subject(std::move(about)) {}
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress() { Clear(); }

    void Show(const std::string& text) const {
        Clear();
        if (isTerminal) { std::cerr << subject << ": " << text << std::flush; }
    }
    void Clear() const {
        if (isTerminal) { std::cerr << "\r\033[K" << std::flush; }
    }

private:
    const std::string subject;
    const bool isTerminal = isatty(STDERR_FILENO) != 0;
};

}  // namespace Tool

#endif
