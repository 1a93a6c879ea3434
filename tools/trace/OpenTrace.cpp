// The only place that knows the forms of a trace.

#include "trace/OpenTrace.hpp"

#include <memory>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "trace/CompactForm.hpp"
#include "trace/CompactReader.hpp"
#include "trace/GzSource.hpp"
#include "trace/TextReader.hpp"

namespace Trace {

std::unique_ptr<EventSource> MakeReader(Input input) {
    while (input.Ahead().size() < compactMagic.size() && input.ReadMore()) {}
    if (input.Ahead().substr(0, compactMagic.size()) == compactMagic) {
        return std::make_unique<CompactReader>(std::move(input));
    }
    return std::make_unique<TextReader>(std::move(input));
}

std::unique_ptr<EventSource> OpenTrace(const std::string& path) {
    try {
        Input input(std::make_unique<GzSource>(path));
        const bool isEmpty = !input.ReadMore();
        const std::string problem = input.Problem();
        if (isEmpty && !problem.empty()) { throw std::runtime_error(path + ": " + problem); }
        return MakeReader(std::move(input));
    } catch (const std::system_error& error) {
        throw std::runtime_error(path + ": " + error.code().message());
    }
}

}  // namespace Trace
