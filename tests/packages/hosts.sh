#!/bin/sh
# Foreign hosts on the installed packages: by CMake's package, by pkg-config, and statically; in
# several versions of C++; with both compilers. Then the tool and gdb on one of them; gdb is left out
# for packages that are "unpacked" only, which it would not find. Takes the folder of the project's
# tests and examples, and that word; builds in the present one.
set -eu
sources=$1
export NUV_OBR_MEMPOOL_ON=1

# build COMPILER WAY [OPTION...]: the consumer, found and linked as CMake does it.
build() {
    compiler=$1 folder=$1-$2
    shift 2
    if ! { cmake -S "$sources/tests/consumer" -B "$folder" "-DCMAKE_CXX_COMPILER=$compiler" \
        "-DSTANDARDS=11;17;20" "$@" && cmake --build "$folder" -j 2 &&
        ctest --test-dir "$folder" --output-on-failure --no-tests=error; } >"$folder.log" 2>&1; then
        cat "$folder.log"
        exit 1
    fi
    echo "$folder: $(grep -c ' Passed ' "$folder.log") hosts pass"
}

# by_hand COMPILER STANDARD EXAMPLE [--static]: one program as its author would compile it. pkg-config
# gives several words.
by_hand() {
    # shellcheck disable=SC2046
    "$1" "-std=c++$2" -Wall -Wextra -Wpedantic -Werror ${4:+-static} -o "$3" \
        "$sources/examples/$3.cpp" $(pkg-config ${4:+"$4"} --cflags --libs ObrMemPool)
    "./$3" >"$3.out"
}

for compiler in g++ clang++; do
    build "$compiler" package
    build "$compiler" pkg-config -DBY_PKG_CONFIG=ON
    for standard in 11 17 20; do
        by_hand "$compiler" "$standard" FirstHeap --static
        by_hand "$compiler" "$standard" FirstHeap
        [ "$standard" -lt 17 ] || by_hand "$compiler" "$standard" FirstContainers
    done
    by_hand "$compiler" 11 FirstPool --static
    grep -qx "12 and 5000 bytes" FirstPool.out
    by_hand "$compiler" 11 FirstPool
    grep -qx "12 and 5000 bytes" FirstPool.out
    ldd FirstPool | grep -q "libObrMemPool.so.1 => "
    echo "$compiler: FirstPool, FirstHeap and FirstContainers run by pkg-config, also statically"
done

# shellcheck disable=SC2046
cc -std=c99 -Wall -Wextra -Wpedantic -Werror -static -o Plain "$sources/tests/consumer/Plain.c" \
    $(pkg-config --static --cflags --libs ObrMemPoolC)
./Plain
echo "a C host runs by pkg-config, statically"

NUV_OBR_MEMPOOL_TRACE=1 ./FirstPool | mempool replay --rounds 1 - >replay.txt
grep -q "^   events  *5 " replay.txt
mempool try --rounds 1 ./FirstPool 2>&1 >/dev/null | grep -q "^On pools "
mempool record -o FirstPool.trace ./FirstPool >/dev/null
mempool text FirstPool.trace | grep -q "^xmpt:a:.*:5024$"
mempool report FirstPool.trace >report.txt
echo "mempool records FirstPool, reports on it, and replays its own trace"

cat >Leak.cpp <<'END'
#include <MemPool>
int main() {
    OBR::MemPool::Mgr pool("leaky");
    pool.Alloc(10);
}
END
# shellcheck disable=SC2046
g++ -o Leak Leak.cpp $(pkg-config --cflags --libs ObrMemPool)
status=0
mempool check --with nothing ./Leak 2>check.txt || status=$?
[ "$status" -eq 99 ]
grep -qx "mempool: pool leaky: 1 block, 10 bytes never freed" check.txt
echo "mempool check finds a leak by the checked library"

[ "${2:-}" != unpacked ] || exit 0
# The command comes with the library, and finds the pool by the library's symbol table.
gdb -batch -nx -ex "break OBR::MemPool::Mgr::Clear" -ex run -ex "info mempools" ./FirstPool \
    >gdb.txt 2>&1 || true
if grep -q "ptrace\|Operation not permitted" gdb.txt; then
    echo "gdb cannot run programs here: not tested"
elif grep -Eq "^ +1 +5000 .* yes .* symbols$" gdb.txt; then
    echo "gdb shows the pool of FirstPool"
else
    cat gdb.txt
    exit 1
fi
