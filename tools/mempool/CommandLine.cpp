#include "mempool/CommandLine.hpp"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <numeric>
#include <utility>

#include <CLI/CLI.hpp>

#include "system/ExitStatus.hpp"

namespace Tool {

namespace {

constexpr const char* purpose =
    R"(Shows where a program's memory is, what memory pools would gain, which settings suit the program,
and its faults in the use of pools. Start with 'mempool run PROGRAM'.)";

// Formats the help for users. CLI11's own format shows details of the parser.
class Help final : public CLI::Formatter {
    std::string make_option_usage(const CLI::Option* option) const override {
        return option->get_name(true, false) + make_option_opts(option);
    }
    std::string make_option_name(const CLI::Option* option, bool isPositional) const override {
        std::string name = option->get_name(isPositional, !isPositional);
        const std::size_t comma = name.find(',');
        return comma == std::string::npos ? name : name.insert(comma + 1, " ");
    }
    std::string make_option_opts(const CLI::Option* option) const override {
        const bool isList = option->get_positional() &&
                            option->get_expected_max() == CLI::detail::expected_max_vector_size;
        const std::string type = option->get_type_name();
        const std::string value = type.substr(0, type.find(':'));  // A check's description follows.
        const bool hasValue = option->get_type_size() != 0 && !value.empty();
        return (isList ? "..." : "") + (hasValue ? " " + value : "");
    }
    std::string make_option_desc(const CLI::Option* option) const override {
        const std::string value = option->get_default_str();
        return option->get_description() + (value.empty() ? "" : " [default: " + value + "]");
    }
};

// The number of letters to delete, insert, replace or swap with the next one to turn one word into
// the other.
std::size_t Distance(const std::string& one, const std::string& other) {
    std::vector<std::size_t> beforeLast;
    std::vector<std::size_t> last;
    std::vector<std::size_t> row(other.size() + 1);
    std::iota(row.begin(), row.end(), std::size_t{0});
    for (std::size_t i = 1; i <= one.size(); ++i) {
        beforeLast = std::exchange(last, row);
        row[0] = i;
        for (std::size_t j = 1; j <= other.size(); ++j) {
            const std::size_t replaced = one[i - 1] == other[j - 1] ? 0 : 1;
            row[j] = std::min({last[j] + 1, row[j - 1] + 1, last[j - 1] + replaced});
            if (i > 1 && j > 1 && one[i - 1] == other[j - 2] && one[i - 2] == other[j - 1]) {
                row[j] = std::min(row[j], beforeLast[j - 2] + 1);
            }
        }
    }
    return row.back();
}

// "; did you mean 'NAME'?" for the name nearest to the word, or "" if none is near.
std::string Suggestion(const std::string& word, const std::vector<std::string>& names) {
    const auto nearest = std::min_element(names.begin(), names.end(),
                                          [&](const std::string& one, const std::string& other) {
                                              return Distance(word, one) < Distance(word, other);
                                          });
    if (nearest == names.end() || 3 * Distance(word, *nearest) > word.size()) { return ""; }
    return "; did you mean '" + *nearest + "'?";
}

std::vector<std::string> OptionNames(const CLI::App& app) {
    std::vector<std::string> names;
    for (const CLI::Option* option : app.get_options()) {
        for (const std::string& name : option->get_lnames()) { names.push_back("--" + name); }
    }
    return names;
}

// The error for an unknown option; "" if the word is not an option.
std::string UnknownOption(const CLI::App& app, const std::string& word) {
    if (word.size() < 2 || word[0] != '-') { return ""; }
    const std::string name = word.substr(0, word.find('='));
    return name + ": unknown option" + Suggestion(name, OptionNames(app));
}

// If the words begin with a subcommand that runs a program, moves the program and its arguments
// from the end of the words to Program::command.
void CutCommand(Program& program, std::vector<std::string>& words) {
    const auto runner = std::find_if(
        program.runners.begin(), program.runners.end(),
        [&](const CLI::App* sub) { return !words.empty() && sub->check_name(words.front()); });
    if (runner == program.runners.end()) { return; }
    program.failure = System::ownFailure;
    auto first = words.begin() + 1;
    const auto isOption = [](const std::string& word) {
        return word.size() > 1 && word[0] == '-' && word != "--";
    };
    while (first != words.end() && isOption(*first)) {
        const CLI::Option* const option = (*runner)->get_option_no_throw(*first++);
        const bool hasValue = option != nullptr && option->get_items_expected_min() > 0;
        if (hasValue && first != words.end()) { ++first; }
    }
    program.command.assign(first, words.end());
    words.erase(first, words.end());
    if (!program.command.empty() && program.command.front() == "--") {
        program.command.erase(program.command.begin());
    }
}

// What is wrong with the command line.
std::string Problem(const CLI::App& app, const CLI::ParseError& error) {
    // The parser reports missing arguments before unexpected ones.
    for (const std::string& word : app.remaining()) {
        std::string problem = UnknownOption(app, word);
        if (!problem.empty()) { return problem; }
        if (dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr) {
            return word + ": unexpected argument";
        }
    }
    return error.what();
}

}  // namespace

Program::Program() : commandLine(std::make_unique<CLI::App>(purpose, "mempool")) {
    commandLine->set_help_flag("-h,--help", "Print this help");
    commandLine->set_version_flag("-V,--version", "mempool " MEMPOOL_VERSION, "Print the version");
    commandLine->require_subcommand(1);
}

Program::~Program() = default;

bool ReadCommandLine(Program& program, std::vector<std::string> words, int& status) {
    CLI::App& app = *program.commandLine;
    app.add_subcommand("help", "Print the help of mempool, or of a subcommand")
        ->add_option("SUBCOMMAND")
        ->type_name("");
    app.formatter(std::make_shared<Help>());
    const std::vector<CLI::App*> subcommands = app.get_subcommands({});
    std::vector<std::string> names;
    for (CLI::App* sub : subcommands) {
        sub->formatter(app.get_formatter());
        names.push_back(sub->get_name());
    }

    if (!words.empty() && words[0] == "help" &&
        (words.size() == 1 || words[1].substr(0, 1) != "-")) {
        words.erase(words.begin());
        words.emplace_back("--help");
    }
    const std::string first = words.empty() ? "-" : words.front();
    const auto sub = std::find(names.begin(), names.end(), first);
    const CLI::App& asked = sub == names.end() ? app : *app.get_subcommand(first);
    CutCommand(program, words);
    std::string problem;
    if (sub == names.end() && first.substr(0, 1) != "-") {
        problem = first + ": unknown subcommand" + Suggestion(first, names);
    } else {
        try {
            std::reverse(words.begin(), words.end());  // The parser takes them in reverse order.
            app.parse(std::move(words));
            return true;
        } catch (const CLI::Success& success) {
            status = app.exit(success);
            return false;
        } catch (const CLI::ParseError& error) {
            problem = Problem(asked, error);
        } catch (const UsageError& error) { problem = error.what(); }
    }
    std::cerr << "mempool: " << problem << "\nSee 'mempool "
              << (sub == names.end() ? "" : first + " ") << "--help'.\n";
    status = program.failure;
    return false;
}

unsigned int ParseNumber(const std::string& name, const std::string& text, unsigned int smallest,
                         unsigned int largest) {
    long long number = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    if (result.ptr != end || result.ec == std::errc::invalid_argument) {
        throw UsageError(name + ": '" + text + "' is not a number");
    }
    if (result.ec != std::errc() || number < smallest || number > largest) {
        throw UsageError(name + ": " + text + " is not between " + std::to_string(smallest) +
                         " and " + std::to_string(largest));
    }
    return static_cast<unsigned int>(number);
}

Subcommand::Subcommand(Program& allOfIt, const char* name, const char* description,
                       const char* notes)
    : program(allOfIt), app(*allOfIt.commandLine->add_subcommand(name, description)) {
    app.footer(notes);
}

void Subcommand::AddCommand() {
    // Only for the help: CutCommand has removed these words.
    app.add_option("PROGRAM", program.command, "The program to run and its arguments")
        ->type_name("[ARGS...]")
        ->expected(0, 1);
    program.runners.push_back(&app);
}

void Subcommand::AddTrace(std::string& path, const char* help) {
    app.add_option("TRACE", path, help)->required()->type_name("");
}

void Subcommand::AddTraces(std::vector<std::string>& paths, const char* help) {
    app.add_option("TRACE", paths, help)->required()->type_name("");
}

void Subcommand::AddFlag(const char* name, bool& place, const char* help) {
    app.add_flag(name, place, help);
}

void Subcommand::AddNumber(const char* name, unsigned int& place, unsigned int smallest,
                           unsigned int largest, const std::string& help, const char* type) {
    const std::string option = name;
    app.add_option_function<std::string>(
           name,
           [&place, option, smallest, largest](const std::string& text) {
               place = ParseNumber(option, text, smallest, largest);
           },
           help)
        ->type_name(type)
        ->default_str(std::to_string(place));
}

void Subcommand::AddText(const char* name, std::string& place, const char* type, const char* help) {
    app.add_option(name, place, help)->type_name(type)->capture_default_str();
}

void Subcommand::AddPatterns(const char* name, std::vector<std::string>& places, const char* help) {
    app.add_option(name, places, help)
        ->type_name("PATTERN")
        ->allow_extra_args(false)
        ->check([](const std::string& pattern) {
            return std::string(pattern.empty() ? "the pattern is empty" : "");
        });
}

void Subcommand::AddName(const char* name, const std::vector<std::string>& choices,
                         const std::string& standard, const char* type, const char* help,
                         const std::function<void(const std::string&)>& take) {
    app.add_option_function<std::string>(name, take, help)
        ->type_name(type)
        ->check(CLI::IsMember(choices).description(""))
        ->default_str(standard);
}

void Subcommand::AddOptionalValue(const char* name, const char* type, const char* help,
                                  const std::function<void(const std::string&)>& take) {
    app.add_option_function<std::string>(name, take, help)->type_name(type)->expected(0, 1);
}

void Subcommand::Exclude(const char* name, std::initializer_list<const char*> others) {
    for (const char* other : others) { app.get_option(name)->excludes(app.get_option(other)); }
}

bool Subcommand::IsGiven(const std::string& option) const {
    return app.count(option) != 0;
}

void Subcommand::SetJob(const std::function<std::function<int()>()>& prepare) {
    const bool isRunner = !program.runners.empty() && program.runners.back() == &app;
    app.callback([&all = program, prepare, isRunner] {
        if (isRunner && all.command.empty()) { throw UsageError("PROGRAM is required"); }
        all.job = prepare();
    });
}

}  // namespace Tool
