#include "diagnostics/checked/Variables.hpp"

#include <charconv>
#include <cstdio>
#include <cstring>
#include <system_error>

#include "HostLayer/HostEnv.hpp"

namespace OBR::MemPool::Checked {

int NumberOf(const char* variable, int least, int most, int otherwise) {
    const char* const text = Host_Env::GetEnv(variable);
    if (text == nullptr) { return otherwise; }
    const char* const end = text + std::strlen(text);
    int number = 0;
    const auto [rest, error] = std::from_chars(text, end, number);
    if (error == std::errc() && rest == end && number >= least && number <= most) { return number; }
    std::fprintf(stderr, "mempool: %s=%s: not a number from %d to %d; %d is used\n", variable, text,
                 least, most, otherwise);
    return otherwise;
}

}  // namespace OBR::MemPool::Checked
