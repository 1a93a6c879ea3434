#!/usr/bin/env bash
# Checks that includes go down: a file includes its own layer and those above its own in this list,
# which is ordered bottom up. A layer is a folder, or a file that is lower than its folder. Checks too
# that a tree's README names all of its folders.
set -euo pipefail
cd "$(dirname "$0")/.."

layers='
include/MemPool
include/MemPoolSettings
s/HostLayer
s/MemPool/Settings.hpp
s/diagnostics/text
s/MemPool
s/diagnostics/checked
s/diagnostics/reports
include/MemPoolHeap
include/MemPoolHeap.h
s/MemPoolC
tools/system
tools/trace
tools/replay
tools/record
tools/report
tools/advise
tools/preload
tools/mempool
'

# A quoted name counts from the top of the includer's tree, and <MemPool...> lies in include/.
git grep -nE '^ *#include ("|<MemPool)' -- include s tools | awk -F '[:"<>]' -v layers="$layers" '
    BEGIN { n = split(layers, layer, "\n"); for (i = 1; i <= n; ++i) { rank[layer[i]] = i } }
    function rank_of(path) { while (!(path in rank) && sub("/[^/]*$", "", path)) {}
                             return path in rank ? rank[path] : 0 }
    { tree = $1; sub("/.*", "", tree)
      from = rank_of($1); to = rank_of((/</ ? "include" : tree) "/" $4) }
    from == 0 || to == 0 { print "In no layer: " $0; bad = 1 }
    from < to { print "Upward: " $0; bad = 1 }
    END { exit bad }'

for readme in s/README.md tools/README.md; do
    tree=${readme%/*}
    git ls-files "$tree" | sed -n "s:^$tree/\(.*\)/[^/]*$:\1:p" | sort -u | while read -r folder; do
        grep -qE "\`${folder}[/\`]" "$readme" || { echo "$readme does not name $folder" && exit 1; }
    done
done
