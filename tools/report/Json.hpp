// An analysis as JSON, with every figure under a key that stays. docs/report.md tells the keys.

#ifndef OBR_TOOLS_REPORT_JSON_HPP
#define OBR_TOOLS_REPORT_JSON_HPP

#include <cstddef>
#include <limits>
#include <string>

#include "report/Analysis.hpp"

namespace Report {

// What is left out where the whole would be too long. The keys are the same.
struct JsonLimits {
    std::size_t groups = std::numeric_limits<std::size_t>::max();
    std::size_t nameBytes = std::numeric_limits<std::size_t>::max();
    std::size_t fillRows = std::numeric_limits<std::size_t>::max();
};

// One line, in UTF-8; what is no UTF-8 in a name stands as the sign for that.
std::string ToJson(const Analysis& analysis, const JsonLimits& limits = {});

}  // namespace Report

#endif
