#!/usr/bin/env bash
# Writes the HTML reference of the public headers to build/docs. A declaration without a comment, or a
# comment that doxygen does not understand, is an error.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh docs
step "Reference"
rm -rf build/docs
mkdir -p build
VERSION=$(sed -n 's/^project(.* VERSION \([0-9.]*\).*/\1/p' CMakeLists.txt)
BRIEF=$(sed -n 's/^ *DESCRIPTION "\(.*\)")$/\1/p' CMakeLists.txt)
[ -n "$VERSION" ] && [ -n "$BRIEF" ]
export VERSION BRIEF
doxygen docs/Doxyfile
for type in 1_1{Mgr,Heap,HeapSettings,HeapStats,Resource,Allocator} structobr__heap__settings; do
    [ -n "$(find build/docs/html -name "*$type.html")" ] ||
        { echo "The reference has no page for $type." >&2; exit 1; }
done
echo "build/docs/html/index.html"
