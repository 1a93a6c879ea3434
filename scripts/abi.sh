#!/usr/bin/env bash
# Compares the binary interfaces of the shared libraries, the names and types that they export, with the
# recorded ones, tests/abi/*.abi. A release that changes an interface needs a new SONAME.
# OBR_MEMPOOL_APPROVE=1 records the present interfaces.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build abi
step "Interfaces"
mkdir -p build
if ! { cmake -S . -B build/abi -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_COMPILER=g++ \
    -DOBR_MEMPOOL_EXAMPLES=OFF -DOBR_MEMPOOL_TOOLS=OFF -DOBR_MEMPOOL_TESTS=OFF &&
    cmake --build build/abi --target MemPool MemPoolC; } >build/abi.log 2>&1; then
    cat build/abi.log
    exit 1
fi

# compare LIBRARY NAME...: the names must be in its record, since an empty one would agree with anything.
compare() {
    local recorded=tests/abi/$1.abi name
    # The paths in the record do not depend on the build folder.
    abidw --headers-dir include --drop-private-types --exported-interfaces-only --drop-undefined-syms \
        --suppressions tests/abi/own.abignore --no-corpus-path --no-comp-dir-path --no-show-locs \
        --no-elf-needed --no-architecture --no-parameter-names "build/abi/$1.so.1" |
        sed "s|path='[./]*|path='|; s|path='${PWD#/}/|path='|" >"build/abi/$1.abi"
    if [ -n "${OBR_MEMPOOL_APPROVE:-}" ]; then
        cp "build/abi/$1.abi" "$recorded"
    fi
    for name in "${@:2}"; do
        grep -q "mangled-name='$name" "$recorded"
    done
    abidiff "$recorded" "build/abi/$1.abi"
    echo "The interface agrees with $recorded"
}
compare libObrMemPool _ZN3OBR7MemPool3Mgr5AllocEj _ZN3OBR7MemPool7GetMgrsERNS_6vector
compare libObrMemPoolC obr_heap_new
