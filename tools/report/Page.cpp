// The page contains the figures as JSON, which its script reads.

#include "report/Page.hpp"

#include <stdexcept>

#include "report/Json.hpp"

namespace Report {

void CheckCanMakePage() {
    if (PageHead().empty()) {
        throw std::runtime_error("cannot make pages: built without D3 (Debian package libjs-d3)");
    }
}

std::string MakePage(const Analysis& analysis) {
    constexpr JsonLimits limits = {1000, 500, 60, 500};
    std::string page(PageHead());
    // A name in the trace may look like the end of the data, so "<" is escaped.
    for (const char letter : ToJson(analysis, limits)) {
        if (letter == '<') {
            page += "\\u003c";
        } else {
            page += letter;
        }
    }
    page += PageTail();
    return page;
}

}  // namespace Report
