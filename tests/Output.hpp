// Standard output as tests see it, and what a host may have set on its streams.

#ifndef OBR_TESTS_OUTPUT_HPP
#define OBR_TESTS_OUTPUT_HPP

#include <cstddef>
#include <functional>
#include <iomanip>
#include <iostream>
#include <locale>
#include <sstream>
#include <string>

// Replaces standard output while it lives. A test can act at each flush.
class Output final : public std::stringbuf {
public:
    Output() : former(std::cout.rdbuf(this)) {}
    ~Output() override { std::cout.rdbuf(former); }

    // What was written since the last call.
    std::string Take() {
        const std::string text = str();
        str("");
        return text;
    }

    // The characters that it takes before it must grow.
    std::size_t Room() const { return static_cast<std::size_t>(epptr() - pptr()); }

    std::function<void()> onFlush = [] {};

private:
    int sync() override {
        onFlush();
        return 0;
    }

    std::streambuf* const former;
};

class Grouping final : public std::numpunct<char> {
    char do_thousands_sep() const override { return '\''; }
    std::string do_grouping() const override { return "\3"; }
};
inline const std::locale groupingLocale(std::locale::classic(), new Grouping);

// Gives standard output an unusual setting of each kind.
inline void SetStreamState() {
    std::cout.imbue(groupingLocale);
    std::cout << std::left << std::boolalpha << std::hex << std::showbase << std::uppercase
              << std::scientific << std::setprecision(9) << std::setfill('#') << std::setw(20);
}

#endif
