# shellcheck shell=bash
# For the other scripts, which source this file: prints steps and builds presets.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

step() { printf '\n== %s\n' "$*"; }

# build PRESET [TARGET...]: configures and builds, with more options for cmake in the array `options`.
# Shows the output only if that fails.
options=()
build() {
    local preset=$1 log
    shift
    step "Build preset $preset"
    log=$(mktemp)
    if ! cmake --preset "$preset" "${options[@]}" >"$log" 2>&1 ||
        ! cmake --build --preset "$preset" ${1:+--target "$@"} >>"$log" 2>&1; then
        cat "$log"
        echo "Building preset $preset failed." >&2
        exit 1
    fi
    rm -f "$log"
}

# The targets with tests of the library itself, not of examples and tools, and a pattern for the names of
# these tests.
# shellcheck disable=SC2034  # Used by the scripts that source this one.
coreTests=({Record,Pool,Mgr,Trace,Report,Heap,HeapContainer,Vector,Process,Settings,Load,PoolsCorpus}Test StaticHost)
# shellcheck disable=SC2034
coreNames="^($(IFS='|' && echo "${coreTests[*]}"))(\\.|\$)"
