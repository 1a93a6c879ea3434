// The command line of an example. CLI11 reads it, in CommandLine.cpp alone, since its headers take
// long to compile.

#ifndef OBR_EXAMPLES_COMMANDLINE_HPP
#define OBR_EXAMPLES_COMMANDLINE_HPP

#include <initializer_list>
#include <memory>
#include <string>
#include <vector>

namespace CLI {
class App;
}

class CommandLine {
public:
    CommandLine(const char* program, const char* description);
    CommandLine(const CommandLine&) = delete;
    CommandLine& operator=(const CommandLine&) = delete;
    ~CommandLine();

    // What may be on the command line, and where Read stores it. What is there is the default.
    void Flag(const char* name, bool& place, const char* help);
    void Number(const char* name, int& place, int smallest, int largest, const char* help);
    void Text(const char* name, std::string& place, const char* help);

    // The words that are no options. There must be one, or at least one.
    void File(const char* name, std::string& place, const char* help);
    void Files(const char* name, std::vector<std::string>& places, const char* help);

    // The option cannot be combined with the others.
    void Exclude(const char* name, std::initializer_list<const char*> others);

    // Returns false if there is nothing to do, since help was printed or an error reported.
    // `status` is then the exit status.
    bool Read(int argc, const char* const* argv, int& status);

private:
    const std::unique_ptr<CLI::App> app;
};

#endif
