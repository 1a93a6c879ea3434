#!/usr/bin/env bash
# Prints the lines and branches of the library and its headers that the library's tests reach, per file,
# and writes build/coverage/report.html with each line. docs/coverage.md explains what is not reached.
# Branches that only an exception takes are not counted, since the compiler assumes one at any call.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build coverage
# Remove the counts of an earlier build.
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
