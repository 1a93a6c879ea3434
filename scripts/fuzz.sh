#!/usr/bin/env bash
# Fuzzes the library and the readers of traces: fuzz.sh [MINUTES [TARGET...]]. The minutes, 10 if not
# said, are shared by the targets, Pools and Traces. What libFuzzer learns is kept in build/fuzz and
# built on by the next run. Ends with the number of inputs tried and of findings, each with the
# command that runs it again, and fails if there is one.
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
    # A finding ends libFuzzer. It goes on from there as long as there is time, but for the same
    # fault again and again.
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
        echo "To run it again: $program $(sed -n 's/.*Test unit written to //p' "$log")"
    done
    numFindings=$((numFindings + number))
    summary+=("$target: $tried inputs tried, $(find "$corpus" -type f | wc -l) of them kept, $number findings")
done

step "Summary"
printf '%s\n' "${summary[@]}"
[ $numFindings -eq 0 ]
