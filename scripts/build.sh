# shellcheck shell=bash
# For the other scripts, which source it: steps told one at a time, and a preset built.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

step() { printf '\n== %s\n' "$*"; }

# build PRESET [TARGET...]: configures, which finds what has been installed since, and builds what has
# changed. The output is shown only if that fails. What the preset leaves open is added to `options`.
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

# The targets whose tests are the library's own, without those of examples and tools, and the names of
# these tests.
# shellcheck disable=SC2034  # Used by those who source this.
coreTests=({Record,Pool,Mgr,Trace,Report,Heap,HeapContainer,Vector,Process,Settings,Load,PoolsCorpus}Test StaticHost)
# shellcheck disable=SC2034
coreNames="^($(IFS='|' && echo "${coreTests[*]}"))(\\.|\$)"
