#include "report/Stack.hpp"

#include <fnmatch.h>

#include <algorithm>
#include <cstddef>
#include <map>
#include <set>
#include <sstream>

#include "trace/PassingOn.hpp"

namespace Report {

namespace {

std::string ModuleOf(const std::string& frame) {
    const std::size_t bracket = frame.rfind(" (");
    if (bracket == std::string::npos) { return frame.substr(0, frame.rfind("+0x")); }
    return frame.substr(bracket + 2, frame.find_first_of(",)", bracket) - bracket - 2);
}

bool IsPassedOver(const std::string& frame, const Skipped& skipped) {
    const std::string function = FunctionOf(frame);
    return Trace::IsRuntime(ModuleOf(frame).c_str()) || Trace::PassesOn(function.c_str()) ||
           std::any_of(skipped.begin(), skipped.end(), [&](const std::string& pattern) {
               return pattern == function || fnmatch(pattern.c_str(), function.c_str(), 0) == 0;
           });
}

// A function that calls an allocator.
struct Function {
    // Whether it allocates in one place, for callers that each ask for a size of their own, as a
    // wrapper of malloc does. A function that makes one kind of object asks for similar sizes.
    bool IsVaried() const {
        std::set<std::uint64_t> sizes;  // The mean of each caller.
        for (const auto& [name, sum] : callers) { sizes.insert(sum.bytes / sum.blocks); }
        return sites.size() == 1 && sizes.size() >= 4 && 2 * sizes.size() >= callers.size() &&
               *sizes.rbegin() >= 10 * std::max(*sizes.begin(), std::uint64_t{1});
    }

    std::uint64_t blocks = 0;
    std::map<std::string, BlockSum> callers;
    std::set<std::string> sites;
};

}  // namespace

std::vector<std::string> FramesOf(const std::string& name) {
    std::istringstream text(name);
    std::vector<std::string> frames;
    for (std::string frame; std::getline(text, frame, ';');) { frames.push_back(frame); }
    return frames;
}

std::string FunctionOf(const std::string& frame) {
    const std::size_t bracket = frame.rfind(" (");
    if (bracket == std::string::npos) { return frame; }
    std::string function = frame.substr(0, frame.rfind("+0x", bracket));
    function.resize(std::min(function.size(), function.find('(', 1)));
    if (function.compare(0, 2, "0x") == 0) { function.insert(0, ModuleOf(frame) + "+"); }
    return function;
}

std::size_t CallerIn(const std::vector<std::string>& frames, const Skipped& skipped) {
    std::size_t index = frames.size() - 1;
    while (index != 0 && IsPassedOver(frames[index], skipped)) { --index; }
    return index;
}

Skipped FindPassingOn(const std::vector<StackRow>& stacks, const Skipped& skipped) {
    struct Module {
        std::uint64_t blocks = 0;
        std::map<std::string, Function> functions;
    };
    std::map<std::string, Module> modules;
    std::uint64_t blocks = 0;
    for (const StackRow& stack : stacks) {
        const std::size_t index = CallerIn(stack.frames, skipped);
        if (index == 0) { continue; }
        const std::string name = FunctionOf(stack.frames[index]);
        const std::string caller = FunctionOf(stack.frames[index - 1]);
        Module& module = modules[ModuleOf(stack.frames[index])];
        Function& function = module.functions[name];
        for (std::uint64_t* sum : {&blocks, &module.blocks, &function.blocks}) {
            *sum += stack.all.blocks;
        }
        function.sites.insert(stack.frames[index]);
        if (caller != name) { function.callers[caller].Add(stack.all); }
    }
    Skipped found;
    for (const auto& [path, module] : modules) {
        if (module.blocks < blocks / 100) { continue; }
        std::uint64_t ofVaried = 0;
        for (const auto& [name, function] : module.functions) {
            ofVaried += function.IsVaried() ? function.blocks : 0;
        }
        const bool isVariedEnough = 3 * ofVaried >= module.blocks;
        for (const auto& [name, function] : module.functions) {
            const bool isMost =
                10 * function.blocks >= 9 * module.blocks && function.callers.size() >= 3;
            if (isMost || (isVariedEnough && function.IsVaried())) { found.push_back(name); }
        }
    }
    return found;
}

}  // namespace Report
