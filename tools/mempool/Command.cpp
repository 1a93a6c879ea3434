#include "mempool/Command.hpp"

#include <algorithm>

namespace Tool {

void AddCommand(Program& program, CLI::App& subcommand) {
    // For the help alone: its words never get there.
    subcommand.add_option("PROGRAM", program.command, "The program to run, then its own arguments")
        ->type_name("[ARGS...]")
        ->expected(0, 1);
    program.runners.push_back(&subcommand);
}

bool CutCommand(Program& program, std::vector<std::string>& words) {
    const auto runner = std::find_if(
        program.runners.begin(), program.runners.end(),
        [&](const CLI::App* sub) { return !words.empty() && sub->check_name(words.front()); });
    if (runner == program.runners.end()) { return false; }
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
    return true;
}

}  // namespace Tool
