#!/usr/bin/env bash
# Builds the library for other processors and runs its own tests there, under qemu: cross.sh
# [PRESET...], aarch64 and riscv64 if not said. Two tests that start a program are left out, since a
# program under qemu starts no other without the system's help.
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
