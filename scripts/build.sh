# shellcheck shell=bash
# For the other scripts, which source it: steps told one at a time, and a preset built.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

step() { printf '\n== %s\n' "$*"; }

# build PRESET [TARGET...]: configures once and builds what has changed. The output is shown only if
# that fails.
build() {
    local preset=$1 log
    shift
    step "Build preset $preset"
    log=$(mktemp)
    if ! { [ -f "build/$preset/build.ninja" ] || cmake --preset "$preset"; } >"$log" 2>&1 ||
        ! cmake --build --preset "$preset" ${1:+--target "$@"} >>"$log" 2>&1; then
        cat "$log"
        echo "Building preset $preset failed." >&2
        exit 1
    fi
    rm -f "$log"
}
