#!/usr/bin/env bash
# Builds and runs all tests: optimised and under the sanitizers, with g++ and clang++.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build test
presets=(release asan-ubsan clang-release clang-asan-ubsan)
# No part may be missing here, and no test with it.
options=(-DOBR_MEMPOOL_EXAMPLES=ON -DOBR_MEMPOOL_TOOLS=ON -DOBR_MEMPOOL_TESTS=ON)
for preset in "${presets[@]}"; do
    build "$preset"
done
for preset in "${presets[@]}"; do
    step "Test preset $preset"
    ctest --preset "$preset"
done
