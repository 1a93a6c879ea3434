#!/usr/bin/env bash
# Measures the pool beside its peers and writes docs/performance.md and docs/performance.svg.
# Every subject runs once a round, so that what the machine does meanwhile meets all of them; the
# report takes medians over the rounds. --quick: fewer and shorter rounds, for a first look.
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

peers=("${!preload[@]}")
if build/bench/bench/PoolBench --subject=boost --benchmark_list_tests >/dev/null 2>&1; then
    peers+=(boost)
else
    echo "Boost.Pool is left out: its headers are not installed."
fi
peers+=(pmr)

# The rows of a subject, each in a process of its own: none runs on the heap that another left.
measure() {
    local subject=$1 round=$2 name=$1 row number=100
    [ -z "${preload[$subject]+set}" ] || name=heap
    build/bench/bench/PoolBench --subject="$name" --benchmark_list_tests | while read -r row; do
        number=$((number + 1))
        LD_PRELOAD=${preload[$subject]:-} build/bench/bench/PoolBench --subject="$name" \
            --benchmark_filter="^$row\$" --benchmark_min_time="$seconds" \
            --benchmark_out_format=json \
            --benchmark_out="$results/$subject.$round.$number.json" >/dev/null 2>"$results/log" ||
            { cat "$results/log" >&2 && exit 1; }
    done
}

for ((round = 1; round <= rounds; ++round)); do
    step "Round $round of $rounds"
    for subject in pool pool-keep pool-64k "${peers[@]}"; do
        measure "$subject" "$round"
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
