// An analysis as one page of HTML that needs nothing else: style, scripts and figures are in it.
// The parts that are the same for all pages are put together when the tools are built, if the
// library for the charts is there then.

#ifndef OBR_TOOLS_REPORT_PAGE_HPP
#define OBR_TOOLS_REPORT_PAGE_HPP

#include <string>
#include <string_view>

#include "report/Analysis.hpp"

namespace Report {

// Whether pages can be made.
bool HasPage();

// The largest groups alone, if there are very many: the page stays below 5 MB.
std::string MakePage(const Analysis& analysis);

// The page ahead of the data and behind, from a file that the build makes.
std::string_view PageHead();
std::string_view PageTail();

}  // namespace Report

#endif
