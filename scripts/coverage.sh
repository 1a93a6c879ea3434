#!/usr/bin/env bash
# Tells what of the library and of both headers the library's own tests reach: lines and branches a
# file, and in build/coverage/report.html line by line. docs/coverage.md tells why the rest is not
# reached. Branches that only an exception takes are not counted: for all that the compiler knows at
# that point any call can throw.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build coverage
# Counts of another build do not fit the new objects.
if [ -d build/coverage ]; then find build/coverage -name '*.gcda' -delete; fi
options=(-DOBR_MEMPOOL_TESTS=ON)
build coverage "${coreTests[@]}"
step "Test preset coverage"
ctest --preset coverage --tests-regex "$coreNames" --quiet --output-log build/coverage/tests.log || {
    cat build/coverage/tests.log
    exit 1
}
step "Coverage"
counts=build/coverage/counts.json
gcovr --root . --filter 's/' --filter 'include/' --exclude-throw-branches --object-directory build/coverage \
    --json $counts build/coverage >build/coverage/gcovr.log 2>&1 || {
    cat build/coverage/gcovr.log
    exit 1
}
gcovr --root . --add-tracefile $counts --html-details build/coverage/report.html
gcovr --root . --add-tracefile $counts
gcovr --root . --add-tracefile $counts --branches
