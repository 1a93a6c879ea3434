#!/usr/bin/env bash
# Builds and runs all tests twice: optimised by g++, and under the sanitizers of clang++. --whole: the
# other way round as well, as the CI does.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

presets=(release clang-asan-ubsan)
case "${1:-}" in
    "") ;;
    --whole) presets+=(asan-ubsan clang-release) ;;
    *)
        echo "usage: scripts/test.sh [--whole]" >&2
        exit 2
        ;;
esac

step "Packages"
scripts/install-packages.sh build test
# No part may be missing here, and no test with it. lld links sanitized programs in a quarter of the time.
options=(-DOBR_MEMPOOL_EXAMPLES=ON -DOBR_MEMPOOL_TOOLS=ON -DOBR_MEMPOOL_TESTS=ON
    -DCMAKE_EXE_LINKER_FLAGS=-fuse-ld=lld)
for preset in "${presets[@]}"; do
    build "$preset"
done
for preset in "${presets[@]}"; do
    step "Test preset $preset"
    ctest --preset "$preset"
done
