// The command line of `mempool`: mempool [OPTIONS] SUBCOMMAND [OPTIONS] ARGUMENTS. A subcommand
// that runs a program ends in PROGRAM [ARGS...]. That part is cut off before the rest is parsed, so
// that an option of the program is never taken for one of mempool. CLI11 does the parsing. Only
// CommandLine.cpp includes it, since its headers take long to compile.

#ifndef OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP
#define OBR_TOOLS_MEMPOOL_COMMANDLINE_HPP

#include <functional>
#include <initializer_list>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "mempool/Program.hpp"

namespace Tool {

// Reads `words`, the command line without the name of the tool, and sets Program::job. Returns
// false if there is nothing to do, because help was printed or an error reported; `status` is then
// the exit status.
bool ReadCommandLine(Program& program, std::vector<std::string> words, int& status);

// An error of the command line, for example in a value.
struct UsageError : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// The whole number in the text. Any other text, or a number outside the bounds, is a UsageError
// about `name`.
unsigned int ParseNumber(const std::string& name, const std::string& text, unsigned int smallest,
                         unsigned int largest);

// A subcommand and its options. The name of an option may have a short form: "-o,--output". What
// an option stores its value in must live as long as the program, and holds the default, which the
// help shows. `type` is the name of the value in the help.
class Subcommand {
public:
    Subcommand(Program& program, const char* name, const char* description, const char* notes);

    // Declares that the subcommand runs a program, which its job finds in Program::command.
    void AddCommand();

    void AddTrace(std::string& path, const char* help);
    void AddTraces(std::vector<std::string>& paths, const char* help);
    void AddFlag(const char* name, bool& place, const char* help);
    void AddNumber(const char* name, unsigned int& place, unsigned int smallest,
                   unsigned int largest, const std::string& help, const char* type = "N");
    void AddText(const char* name, std::string& place, const char* type, const char* help);

    // May be repeated. An empty text is an error.
    void AddPatterns(const char* name, std::vector<std::string>& places, const char* help);

    // The value is one of these names. `choices` must live as long as the program.
    template <typename Value, typename Place>
    void AddChoice(const char* name, const std::map<std::string, Value>& choices, Place& place,
                   const char* type, const char* help) {
        std::vector<std::string> names;
        std::string standard;
        for (const auto& [each, value] : choices) {
            names.push_back(each);
            if (place == value) { standard = each; }
        }
        AddName(name, names, standard, type, help,
                [&](const std::string& chosen) { place = choices.at(chosen); });
    }

    // Calls `take` with the value, or with "" if the option has none.
    void AddOptionalValue(const char* name, const char* type, const char* help,
                          const std::function<void(const std::string&)>& take);

    // The option cannot be combined with the others.
    void Exclude(const char* name, std::initializer_list<const char*> others);

    bool IsGiven(const std::string& option) const;

    // When the whole command line has been read, `prepare` checks the options and returns the job.
    void SetJob(const std::function<std::function<int()>()>& prepare);

private:
    void AddName(const char* name, const std::vector<std::string>& choices,
                 const std::string& standard, const char* type, const char* help,
                 const std::function<void(const std::string&)>& take);

    Program& program;
    CLI::App& app;
};

}  // namespace Tool

#endif
