// A line of progress on standard error that replaces the previous one. Shows nothing if standard
// error is not a terminal.

#ifndef OBR_TOOLS_MEMPOOL_PROGRESS_HPP
#define OBR_TOOLS_MEMPOOL_PROGRESS_HPP

#include <unistd.h>

#include <iostream>
#include <string>
#include <utility>

namespace Tool {

class Progress {
public:
    // Each line begins with the subject of the work, such as the path of a trace.
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
