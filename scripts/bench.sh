#!/usr/bin/env bash
# Measures the pools and other allocators, and writes docs/performance.md and its pictures. --quick:
# fewer and shorter rounds and no work on more than a million blocks, for a first look.
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

case "$#:${1:-}" in
    0: | 1:--quick) ;;
    *)
        echo "usage: scripts/bench.sh [--quick]" >&2
        exit 2
        ;;
esac

step "Packages"
scripts/install-packages.sh build
scripts/install-packages.sh bench || echo "What needs these packages is left out."
build bench Benchmarks

results=$(mktemp -d)
trap 'rm -rf "$results"' EXIT
python3 scripts/bench-run.py "$@" build/bench "$results/results.json"

step "Report"
python3 scripts/bench-report.py "$results/results.json" docs/performance.md
gnuplot -e "data='$results/ratios.dat'; output='docs/performance.svg'" scripts/bench-plot.gp
gnuplot -e "data='$results/growth.dat'; output='docs/growth.svg'" scripts/bench-growth.gp
gnuplot -e "data='$results/hosts.dat'; output='docs/hosts.svg'" scripts/bench-hosts.gp
echo "docs/performance.md and its pictures are written."
