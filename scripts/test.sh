#!/usr/bin/env bash
# Builds and runs all tests: optimised and under the sanitizers, with g++ and clang++.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build test
presets=(release asan-ubsan clang-release clang-asan-ubsan)
for preset in "${presets[@]}"; do
    build "$preset"
done
for preset in "${presets[@]}"; do
    step "Test preset $preset"
    ctest --preset "$preset"
done
