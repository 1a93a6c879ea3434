#!/usr/bin/env bash
# Builds the library and shows what its first host, WordPools, gains from it. With pools on and off,
# in turns, WordPools counts the words of the files given, or of a text that is made of those on
# this machine; then both stand side by side. In the end `mempool run` tells of a program that knows
# nothing of pools, Perl, whether it would gain from them.
#
# DEMO_MEGABYTES (100) is the size of the text, DEMO_ROUNDS (5) how often each side runs. The text and
# the report stay in build/demo.
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

# Writes $text, as often over as it takes, unless it is there from the last time.
make_text() {
    local wanted=$((megabytes * 1000000))
    if [ "$(stat --format=%s "$text" 2>/dev/null)" = "$wanted" ]; then return; fi
    step "A text of $megabytes MB, from those under /usr/share, /usr/include and /usr/lib"
    : >"$scratch/once"
    { texts 2>/dev/null || true; } | head --bytes="$wanted" >"$scratch/once" &
    while kill -0 $! 2>/dev/null; do
        progress "$(($(stat --format=%s "$scratch/once") / 1000000)) MB written"
        sleep 0.2
    done
    progress
    wait $!
    if [ ! -s "$scratch/once" ]; then echo "There is no text under /usr." >&2 && exit 1; fi
    while cat "$scratch/once"; do :; done 2>/dev/null | head --bytes="$wanted" >"$scratch/text"
    mv "$scratch/text" "$text"
    echo "It stays in $text for the next time."
}

# What cannot be read is told and left out; what can be read only once is copied.
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

# This also brings the files into the memory of the system, before any clock runs.
step "The report of the pools, from its start; $report has all of it"
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
    step "Medians of $rounds rounds; about the same is what the runs do not agree on"
else
    step "One round, which shows no difference that another would bear out"
fi
awk -f scripts/demo-table.awk "$scratch/figures"

step "mempool run perl: the distinct words again, by a program that knows nothing of pools"
cat -- "${files[@]}" | head --bytes=3000000 >"$scratch/start" || true
# shellcheck disable=SC2016  # The variables are Perl's.
build/release/tools/mempool/mempool run --seconds 10 \
    perl -ne '$n{$_}++ for split; END { print keys(%n) . " words\n" }' "$scratch/start" 2>&1
exit $status
