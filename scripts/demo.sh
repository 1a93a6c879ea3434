#!/usr/bin/env bash
# Builds the library and shows what a program, WordPools, gains from it. WordPools counts the words of the
# given files, or of a text made of files on this machine, in turns with pools on and off. The script shows
# its report and compares time and memory. Then `mempool run` shows whether Perl, which does not use pools,
# would gain from them.
#
# DEMO_MEGABYTES (100) is the size of the text, DEMO_ROUNDS (5) the runs per side. The text and the report stay in
# build/demo.
if [[ ${1:-} == -h || ${1:-} == --help ]]; then
    echo "usage: scripts/demo.sh [FILE...]   (- is the standard input)"
    exit
fi
# shellcheck source=scripts/build.sh
source "$(dirname "$0")/build.sh"

megabytes=${DEMO_MEGABYTES:-100} rounds=${DEMO_ROUNDS:-5} folder=build/demo
mkdir -p "$folder"
scratch=$(mktemp -d "$folder/scratch.XXXXXX")
trap 'rm -rf "$scratch"' EXIT
text=$folder/text report=$folder/report.txt

progress() { [ ! -t 2 ] || printf '\r\033[K%s' "$*" >&2; }

# The small texts under /usr, in an order that is random but the same each time.
texts() {
    find /usr/share /usr/include /usr/lib -type f -size -1025k ! -name '*.gz' -print0 |
        LC_ALL=C sort --zero-terminated |
        shuf --zero-terminated --random-source=<(seq inf) |
        xargs --null grep --files-with-matches --binary-files=without-match --null '' |
        xargs --null cat
}

# Writes $text, repeating its sources if they are too short. Keeps one of the right size.
make_text() {
    local wanted=$((megabytes * 1000000))
    if [ "$(stat --format=%s "$text" 2>/dev/null)" = "$wanted" ]; then return; fi
    step "Gather $megabytes MB of text from /usr/share, /usr/include and /usr/lib"
    : >"$scratch/once"
    { texts 2>/dev/null || true; } | head --bytes="$wanted" >"$scratch/once" &
    while kill -0 $! 2>/dev/null; do
        progress "$(($(stat --format=%s "$scratch/once") / 1000000)) MB written"
        sleep 0.2
    done
    progress
    wait $!
    if [ ! -s "$scratch/once" ]; then echo "demo.sh: no text found below /usr" >&2 && exit 1; fi
    while cat "$scratch/once"; do :; done 2>/dev/null | head --bytes="$wanted" >"$scratch/text"
    mv "$scratch/text" "$text"
    echo "The next run uses it again: $text"
}

# Files that cannot be read are reported and left out. Pipes are copied, since each run reads its input again.
status=0 files=()
for file in "$@"; do
    case $file in
        - | /*) ;;
        *) file=$OLDPWD/$file ;;
    esac
    if [ "$file" = - ] || [ -p "$file" ]; then
        copy="$scratch/input ${#files[@]}"
        cat -- "$file" >"$copy"
        file=$copy
    fi
    if head --bytes=1 "$file" >/dev/null; then files+=("$file"); else status=1; fi
done
if [ $# -gt 0 ] && [ ${#files[@]} -eq 0 ]; then exit 1; fi

step "Packages"
scripts/install-packages.sh build tools
build release WordPools mempool mempool-record
program=build/release/examples/WordPools
if [ $# -eq 0 ]; then
    make_text
    files=("$text")
fi

# This also loads the files into the page cache before anything is timed.
step "Start of the report of the pools; the whole report is $report"
"$program" --report "${files[@]}" >"$report"
head -n 40 "$report"

step "Processor time and memory, pools on and off in turns"
turn=(on off)
for ((round = 1; round <= rounds; ++round)); do
    for pools in "${turn[@]}"; do
        option=()
        [ "$pools" = on ] || option=(--heap)
        figures=$("$program" --figures "${option[@]}" "${files[@]}")
        echo "$pools $figures" >>"$scratch/figures"
        read -r reading dropping _ <<<"$figures"
        echo "Round $round of $rounds, pools $pools: $reading s to read, $dropping s to drop" >&2
    done
    turn=("${turn[1]}" "${turn[0]}")
done

if [ "$rounds" -gt 1 ]; then
    step "Medians of $rounds rounds; \"about the same\" means that the runs overlap"
else
    step "One round, too few to show a difference"
fi
awk -f scripts/demo-table.awk "$scratch/figures"

step "mempool run perl: the distinct words again, by a program that does not use pools"
cat -- "${files[@]}" | head --bytes=3000000 >"$scratch/start" || true
# shellcheck disable=SC2016  # The variables are Perl's.
build/release/tools/mempool/mempool run --seconds 10 \
    perl -ne '$n{$_}++ for split; END { print keys(%n) . " words\n" }' "$scratch/start" 2>&1
exit $status
