// Runs a target under libFuzzer: the first failure ends the process, so that the input is kept.

#include <cstdlib>

#include <gtest/gtest.h>

namespace {

class AbortOnFailure final : public testing::EmptyTestEventListener {
    void OnTestPartResult(const testing::TestPartResult& result) override {
        if (result.failed()) { std::abort(); }
    }
};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    testing::UnitTest::GetInstance()->listeners().Append(new AbortOnFailure);
    return 0;
}
