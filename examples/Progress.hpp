// Shows on one line of a terminal how much an example has read. Shows nothing if standard error is
// not a terminal.

#ifndef OBR_EXAMPLES_PROGRESS_HPP
#define OBR_EXAMPLES_PROGRESS_HPP

#include <unistd.h>

#include <cstddef>
#include <iostream>

class Progress {
public:
    Progress() = default;
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress() { Clear(); }

    void Add(std::size_t bytes) {
        const std::size_t shown = numBytes / megabyte;
        numBytes += bytes;
        if (!isTerminal || numBytes / megabyte == shown) { return; }
        Clear();
        std::cerr << numBytes / megabyte << " MB read" << std::flush;
        isShown = true;
    }

    // Clears the line for other output.
    void Clear() {
        if (isShown) { std::cerr << "\r\033[K" << std::flush; }
        isShown = false;
    }

private:
    static constexpr std::size_t megabyte = 1000000;

    const bool isTerminal = isatty(STDERR_FILENO) != 0;
    std::size_t numBytes = 0;
    bool isShown = false;
};

#endif
