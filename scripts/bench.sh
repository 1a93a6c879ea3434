#!/usr/bin/env bash
# Measures the pool beside its peers and writes docs/performance.md and docs/performance.svg.
# Every subject does a row right behind the others, so that what the machine does meanwhile meets all
# of them; the report takes medians over the rounds. --quick: fewer and shorter rounds, for a first
# look.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

rounds=5 seconds=0.1
case "${1:-}" in
    "") ;;
    --quick) rounds=2 seconds=0.02 ;;
    *)
        echo "usage: scripts/bench.sh [--quick]" >&2
        exit 2
        ;;
esac

step "Packages"
scripts/install-packages.sh build
scripts/install-packages.sh bench || echo "What is missing of these is left out."
build bench PoolBench Resident

results=$(mktemp -d)
trap 'rm -rf "$results"' EXIT

# The mallocs that can take the place of the C library's, as ordinary shared libraries.
declare -A preload=([glibc]="")
for peer in mimalloc:libmimalloc.so jemalloc:libjemalloc.so tcmalloc:libtcmalloc_minimal.so; do
    path=$(ldconfig -p | awk -v name="${peer#*:}" 'index($1, name) == 1 { print $NF; exit }')
    if [ -n "$path" ]; then
        preload[${peer%%:*}]=$path
    else
        echo "${peer%%:*} is left out: ${peer#*:} is not installed."
    fi
done

# The rows that each way of asking for memory can do; none if it could not be built.
for name in pool pool-keep pool-64k heap boost pmr; do
    build/bench/bench/PoolBench --subject=$name --benchmark_list_tests \
        >"$results/$name.rows" 2>/dev/null || true
done

peers=("${!preload[@]}")
if grep -q . "$results/boost.rows"; then
    peers+=(boost)
else
    echo "Boost.Pool is left out: its headers are not installed."
fi
peers+=(pmr)

# One row of one subject in a process of its own: it does not run on the heap that another left.
measure() {
    local subject=$1 row=$2 output=$3 name=$1
    [ -z "${preload[$subject]+set}" ] || name=heap
    grep -qxF "$row" "$results/$name.rows" || return 0
    LD_PRELOAD=${preload[$subject]:-} build/bench/bench/PoolBench --subject="$name" \
        --benchmark_filter="^$row\$" --benchmark_min_time="$seconds" \
        --benchmark_out_format=json --benchmark_out="$output" >/dev/null 2>"$results/log" ||
        { cat "$results/log" >&2 && exit 1; }
}

subjects=(pool pool-keep pool-64k "${peers[@]}")
mapfile -t rows <"$results/pool.rows"
for ((round = 1; round <= rounds; ++round)); do
    step "Round $round of $rounds"
    subjects=("${subjects[@]:1}" "${subjects[0]}")  # Each round begins with another.
    for number in "${!rows[@]}"; do
        for subject in "${subjects[@]}"; do
            printf -v output '%s/%02d.%s.%d.json' "$results" "$number" "$subject" "$round"
            measure "$subject" "${rows[number]}" "$output"
        done
    done
done

step "Resident bytes a block"
for subject in pool "${peers[@]}"; do
    name=$subject
    [ -z "${preload[$subject]+set}" ] || name=heap
    for size in 8 16 20 32 40 64 100 128 200 256 400 512 700 900; do
        line=$(LD_PRELOAD=${preload[$subject]:-} build/bench/bench/Resident "$name" "$size")
        echo "$subject $size $line" >>"$results/resident"
    done
done

step "Report"
mkdir -p docs
python3 scripts/bench-report.py "$results" docs/performance.md
gnuplot -e "data='$results/ratios.dat'; output='docs/performance.svg'" scripts/bench-plot.gp
echo "docs/performance.md and docs/performance.svg are written."
