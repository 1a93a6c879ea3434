// An analysis as JSON. docs/report.md lists the keys, which keep their meaning.

#ifndef OBR_TOOLS_REPORT_JSON_HPP
#define OBR_TOOLS_REPORT_JSON_HPP

#include <cstddef>
#include <limits>
#include <string>

#include "report/Analysis.hpp"

namespace Report {

// Limits for a JSON that would otherwise be too long.
struct JsonLimits {
    std::size_t groups = std::numeric_limits<std::size_t>::max();
    std::size_t nameBytes = std::numeric_limits<std::size_t>::max();
    std::size_t fillRows = std::numeric_limits<std::size_t>::max();
    std::size_t stacks = std::numeric_limits<std::size_t>::max();
};

// One line in UTF-8, with the replacement character for bytes of a name that are not UTF-8.
std::string ToJson(const Analysis& analysis, const JsonLimits& limits = {});

}  // namespace Report

#endif
