// The page contains the figures as JSON, which its script reads.

#include "report/Page.hpp"

#include <stdexcept>

#include "report/Json.hpp"

namespace Report {

namespace {

// A name in the trace may look like the end of the data, so "<" is escaped.
void AddData(std::string& page, const std::string& json) {
    for (const char letter : json) {
        if (letter == '<') {
            page += "\\u003c";
        } else {
            page += letter;
        }
    }
}

}  // namespace

void CheckCanMakePage() {
    if (PageHead().empty()) {
        throw std::runtime_error("cannot make pages: built without D3 (Debian package libjs-d3)");
    }
}

std::string MakePage(const Analysis& analysis, const std::string& advice) {
    constexpr JsonLimits limits = {1000, 500, 60, 500};
    std::string page(PageHead());
    AddData(page, ToJson(analysis, limits));
    page += "</script>\n<script type=\"application/json\" id=\"advice\">";
    AddData(page, advice);
    page += PageTail();
    return page;
}

}  // namespace Report
