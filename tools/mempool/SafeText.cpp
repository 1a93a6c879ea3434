#include "mempool/SafeText.hpp"

#include <cstddef>

#include <nlohmann/json.hpp>

namespace Tool {

std::string SafeText(const std::string& text) {
    using Json = nlohmann::json;
    std::string safe = Json(text).dump(-1, ' ', false, Json::error_handler_t::replace);
    safe = safe.substr(1, safe.size() - 2);
    for (std::size_t i = 0; i < safe.size(); ++i) {
        const auto byte = static_cast<unsigned char>(safe[i]);
        // JSON escapes quotes and backslashes, which are harmless.
        if (byte == '\\' && (safe[i + 1] == '"' || safe[i + 1] == '\\')) { safe.erase(i, 1); }
        if (byte == 0x7F) { safe[i] = '?'; }
        // Further control characters, which JSON does not escape.
        const bool isControl = byte == 0xC2 && static_cast<unsigned char>(safe[i + 1]) < 0xA0;
        if (isControl) { safe.replace(i, 2, "?"); }
    }
    return safe;
}

}  // namespace Tool
