// Runs a fuzz target on the inputs that are kept, and on some that a seeded generator makes, so
// that inputs that once found a fault are tried with every compiler.

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace {

void Try(const std::vector<char>& input) {
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(input.data()), input.size());
}

TEST(Corpus, HasNoFindings) {
    std::size_t number = 0;
    for (const auto& entry : std::filesystem::directory_iterator(CORPUS)) {
        SCOPED_TRACE(entry.path());
        std::ifstream file(entry.path(), std::ios::binary);
        Try({std::istreambuf_iterator<char>(file), {}});
        ++number;
    }
    EXPECT_NE(number, 0);
}

TEST(Corpus, RandomInputsHaveNoFindings) {
    std::mt19937 random(7);
    for (int round = 0; round < 200 && !HasFailure(); ++round) {
        std::vector<char> input(random() % (round % 10 == 0 ? 20000 : 600));
        for (char& byte : input) { byte = static_cast<char>(random()); }
        Try(input);
    }
}

}  // namespace
