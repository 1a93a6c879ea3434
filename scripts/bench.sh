#!/usr/bin/env bash
# Measures the pool beside its peers and writes docs/performance.md and docs/performance.svg.
# Every subject does a row right behind the others, so that what the machine does meanwhile meets all
# of them; the report takes medians over the rounds. --quick: fewer and shorter rounds, for a first
# look, and no work on more than a million blocks.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

rounds=3 seconds=0.1
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
build bench PoolBench LayerBench Resident Ast
hosts=(Ast)
for host in LuaHost SqliteHost; do
    if cmake --build --preset bench --target help | grep -q "^$host:"; then
        build bench "$host"
        hosts+=("$host")
    else
        echo "$host is left out: its library is not installed."
    fi
done

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

# The layer and what stands on it: rows of containers, and of growing work.
layered=(layer raw "${peers[@]/boost}")
read -r -a layered <<<"${layered[*]}"
mkdir "$results/layer"
mapfile -t rows < <(build/bench/bench/LayerBench --subject=raw --benchmark_list_tests)
for ((round = 1; round <= rounds; ++round)); do
    step "Layer, round $round of $rounds"
    layered=("${layered[@]:1}" "${layered[0]}")
    for number in "${!rows[@]}"; do
        row=${rows[number]}
        case $row in
            live* | drop*)
                # How cost grows is one long look.
                [ "$round" -eq 1 ] || continue
                [ "$seconds" = 0.1 ] || [[ $row != *0000000/* ]] || continue
                ;;
        esac
        for subject in "${layered[@]}"; do
            name=$subject
            [ -z "${preload[$subject]+set}" ] || name=heap
            printf -v output '%s/layer/%02d.%s.%d.json' "$results" "$number" "$subject" "$round"
            LD_PRELOAD=${preload[$subject]:-} build/bench/bench/LayerBench --subject="$name" \
                --benchmark_filter="^$row\$" --benchmark_min_time="$seconds" \
                --benchmark_out_format=json --benchmark_out="$output" >/dev/null 2>"$results/log" ||
                { cat "$results/log" >&2 && exit 1; }
        done
    done
done

# The clients, each with pools and with the C library's malloc: the processor time of the whole run,
# which other load on the machine touches least.
works=("Ast --definitions 50000")
if [[ " ${hosts[*]} " == *" LuaHost "* ]]; then
    for script in objects trees strings; do works+=("LuaHost examples/lua/$script.lua"); done
fi
if [[ " ${hosts[*]} " == *" SqliteHost "* ]]; then works+=("SqliteHost examples/sql/orders.sql"); fi
TIMEFORMAT="%U %S"
for ((round = 1; round <= 2 * rounds; ++round)); do
    step "Clients, round $round of $((2 * rounds))"
    for work in "${works[@]}"; do
        read -r host arguments <<<"$work"
        # shellcheck disable=SC2086  # The arguments are words.
        for mode in "" --heap; do
            figures=$({ time build/bench/examples/"$host" $mode $arguments >/dev/null \
                2>"$results/log"; } 2>&1) || { cat "$results/log" >&2 && exit 1; }
            echo "$round	$work	${mode:---pools}	$figures" >>"$results/clients"
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
gnuplot -e "data='$results/growth.dat'; output='docs/growth.svg'" scripts/bench-growth.gp
echo "docs/performance.md, docs/performance.svg and docs/growth.svg are written."
