// An analysis as one self-contained HTML page, with its style, scripts and figures. The build of
// the tools assembles the fixed parts, if the library for the charts is installed.

#ifndef OBR_TOOLS_REPORT_PAGE_HPP
#define OBR_TOOLS_REPORT_PAGE_HPP

#include <string>
#include <string_view>

#include "report/Analysis.hpp"

namespace Report {

// Throws a std::runtime_error if the tools were built without the library for the charts.
void CheckCanMakePage();

// If there are very many groups, the page has only the largest, so that it stays below 5 MB.
// `advice` is the JSON of `mempool advise`, or "null".
std::string MakePage(const Analysis& analysis, const std::string& advice);

// The page before and after the data, from a file that the build makes.
std::string_view PageHead();
std::string_view PageTail();

}  // namespace Report

#endif
