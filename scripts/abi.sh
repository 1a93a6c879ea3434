#!/usr/bin/env bash
# Compares the binary interface of the shared library, the names and types that it exports, with the
# recorded one, tests/abi/libObrMemPool.abi. A release that changes the interface needs a new SONAME.
# OBR_MEMPOOL_APPROVE=1 records the present interface.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build abi
step "Interface"
recorded=tests/abi/libObrMemPool.abi
mkdir -p build
if ! { cmake -S . -B build/abi -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_COMPILER=g++ \
    -DOBR_MEMPOOL_EXAMPLES=OFF -DOBR_MEMPOOL_TOOLS=OFF -DOBR_MEMPOOL_TESTS=OFF &&
    cmake --build build/abi --target MemPool; } >build/abi.log 2>&1; then
    cat build/abi.log
    exit 1
fi
# The paths in the record do not depend on the build folder.
abidw --headers-dir include --drop-private-types --exported-interfaces-only --drop-undefined-syms \
    --suppressions tests/abi/own.abignore --no-corpus-path --no-comp-dir-path --no-show-locs \
    --no-elf-needed --no-architecture --no-parameter-names build/abi/libObrMemPool.so.1 |
    sed "s|path='[./]*|path='|; s|path='${PWD#/}/|path='|" >build/abi/present.abi
if [ -n "${OBR_MEMPOOL_APPROVE:-}" ]; then
    cp build/abi/present.abi "$recorded"
fi
# An empty record would agree with anything.
for name in _ZN3OBR7MemPool3Mgr5AllocEj _ZN3OBR7MemPool7GetMgrsERNS_6vector; do
    grep -q "mangled-name='$name" "$recorded"
done
abidiff "$recorded" build/abi/present.abi
echo "The interface agrees with $recorded"
