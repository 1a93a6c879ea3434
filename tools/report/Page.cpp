// The figures take their place in the page as JSON, which the script of the page reads.

#include "report/Page.hpp"

#include "report/Json.hpp"

namespace Report {

bool HasPage() {
    return !PageHead().empty();
}

std::string MakePage(const Analysis& analysis) {
    constexpr JsonLimits limits = {1000, 500, 60};
    std::string page(PageHead());
    // A name in the trace may look like the end of the data. JSON may escape any letter.
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
