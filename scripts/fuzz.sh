#!/usr/bin/env bash
# Fuzzes the library and the readers of traces. Usage: fuzz.sh [MINUTES [TARGET...]]. The targets, Pools
# and Traces, share the minutes, by default 10. The next run continues from the inputs that libFuzzer
# keeps in build/fuzz. Prints each finding with the command that repeats it, and fails if there is one.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

minutes=${1:-10}
[[ $minutes =~ ^[0-9]+$ ]] || { echo "usage: fuzz.sh [MINUTES [TARGET...]]" >&2; exit 2; }
targets=("${@:2}")
[ ${#targets[@]} -gt 0 ] || targets=(Pools Traces)

step "Packages"
scripts/install-packages.sh build fuzz
build fuzz "${targets[@]/#/Fuzz}"

folder=build/fuzz
mkdir -p $folder/findings
numFindings=0
summary=()
for target in "${targets[@]}"; do
    program=$folder/tests/fuzz/Fuzz$target
    corpus=$folder/corpus/${target,,}
    log=$folder/$target.log
    mkdir -p "$corpus"
    step "Fuzz $target"
    # libFuzzer stops at a finding. Start it again while there is time, but not more than five times,
    # in case it finds the same fault.
    deadline=$((SECONDS + minutes * 60 / ${#targets[@]}))
    number=0
    tried=0
    while [ $SECONDS -lt $deadline ] && [ $number -lt 5 ]; do
        "$program" -max_total_time=$((deadline - SECONDS)) -max_len=4000 -timeout=20 \
            -rss_limit_mb=2000 -print_final_stats=1 -artifact_prefix="$folder/findings/$target-" \
            "$corpus" "tests/fuzz/corpus/${target,,}" >"$log" 2>&1 && found=false || found=true
        tried=$((tried + $(awk '/number_of_executed_units/ { n = $2 } END { print n + 0 }' "$log")))
        $found || break
        number=$((number + 1))
        grep -aE -m 3 'Failure|ERROR: |runtime error:' "$log" || tail -n 20 "$log"
        echo "Repeat it with: $program $(sed -n 's/.*Test unit written to //p' "$log")"
    done
    numFindings=$((numFindings + number))
    summary+=("$target: $tried inputs tried, $(find "$corpus" -type f | wc -l) kept, $number findings")
done

step "Summary"
printf '%s\n' "${summary[@]}"
[ $numFindings -eq 0 ]
