#!/usr/bin/env bash
# Prints the lines and branches of the library and its headers that the library's tests reach, per file,
# and writes build/coverage/report.html with each line. docs/coverage.md explains what is not reached.
# Branches that only an exception takes are not counted, since the compiler assumes one at any call.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

step "Packages"
scripts/install-packages.sh build tools coverage
# Remove the counts of an earlier build.
if [ -d build/coverage ]; then find build/coverage -name '*.gcda' -delete; fi
options=(-DOBR_MEMPOOL_TESTS=ON -DOBR_MEMPOOL_TOOLS=ON)
build coverage "${coreTests[@]}" MemPoolChecked mempool Faulty FaultySanitized
step "Test preset coverage"
ctest --preset coverage --tests-regex "$coreNames|^Checked\$" --quiet --output-log build/coverage/tests.log || {
    cat build/coverage/tests.log
    exit 1
}
step "Coverage"
# count NAME OPTION...: gathers the counts of the files that the options select.
count() {
    gcovr --root . --exclude-throw-branches --object-directory build/coverage --json "build/coverage/$1.json" \
        "${@:2}" build/coverage >build/coverage/gcovr.log 2>&1 || { cat build/coverage/gcovr.log; exit 1; }
}
# The checked library is a second build of the same sources, with a folder that is in it alone.
count ordinary --filter s/ --filter include/ --exclude s/diagnostics/checked/ \
    --exclude-directories '.*MemPoolCheckedObjects.*'
count checked --filter s/diagnostics/checked/
counts=(--root . --add-tracefile build/coverage/ordinary.json --add-tracefile build/coverage/checked.json)
gcovr "${counts[@]}" --html-details build/coverage/report.html
gcovr "${counts[@]}"
gcovr "${counts[@]}" --branches
