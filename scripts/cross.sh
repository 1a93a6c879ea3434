#!/usr/bin/env bash
# Builds the library for other processors and runs its tests there, under qemu. Usage: cross.sh
# [PRESET...], by default aarch64 and riscv64. Leaves out two tests that start a program, which does not
# work under qemu unless the system is set up for it.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build cross
presets=("$@")
[ ${#presets[@]} -gt 0 ] || presets=(aarch64 riscv64)
options=(-DOBR_MEMPOOL_TESTS=ON)
for preset in "${presets[@]}"; do
    build "$preset" "${coreTests[@]}"
    step "Test preset $preset"
    ctest --preset "$preset" --tests-regex "$coreNames" \
        --exclude-regex "TheLoadShowsTheBanner|RecordSizesThatCannotWork" \
        --quiet --output-log "build/$preset/tests.log" || {
        cat "build/$preset/tests.log"
        exit 1
    }
    tail -n 5 "build/$preset/tests.log"
done
