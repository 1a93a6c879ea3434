// An analysis as one self-contained page of HTML, with its style, scripts and figures. The build of
// the tools puts the fixed parts together, if the library for the charts is installed then.

#ifndef OBR_TOOLS_REPORT_PAGE_HPP
#define OBR_TOOLS_REPORT_PAGE_HPP

#include <string>
#include <string_view>

#include "report/Analysis.hpp"

namespace Report {

// Throws a std::runtime_error if the tools were built without the library for the charts, and can
// make no page.
void CheckCanMakePage();

// Only the largest groups, if there are very many: the page stays below 5 MB.
std::string MakePage(const Analysis& analysis);

// The page before and after the data, from a file that the build makes.
std::string_view PageHead();
std::string_view PageTail();

}  // namespace Report

#endif
