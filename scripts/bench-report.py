#!/usr/bin/env python3
"""Writes the tables of docs/performance.md from the results that scripts/bench.sh collects.

usage: bench-report.py RESULTS OUTPUT

RESULTS holds NUMBER.SUBJECT.ROUND.json (Google Benchmark's, by the number of the row), the same of
the layer in a folder of its own, "clients" (round, work, mode, seconds of user and of system time),
and "resident" (subject, size, bytes a block and, for the pool, bytes held). The figures for the
pictures go back there, as ratios.dat and growth.dat, and those of the clients also into moving.md
beside OUTPUT.
"""

import json
import math
import pathlib
import platform
import re
import statistics
import subprocess
import sys

POOLS = ["pool", "pool-keep", "pool-64k"]
PEERS = ["glibc", "mimalloc", "jemalloc", "tcmalloc", "boost", "pmr"]
MALLOCS = ["glibc", "mimalloc", "jemalloc", "tcmalloc"]
TRACES = ["trace lua", "trace jq", "trace sqlite"]
LAYERED = ["layer", "raw", "glibc", "mimalloc", "jemalloc", "tcmalloc", "pmr"]
TREE_ROW = "tree of 262k nodes, dropped whole"
NODE_ROWS = ["list of 100k, built and cleared", "map, 10k live, insert or erase"]
IN_GROWTH = ["raw", "glibc", "mimalloc", "jemalloc", "pmr"]
IN_PICTURE = ["mimalloc", "jemalloc", "tcmalloc", "pmr"]


def read_times(results):
    """Nanoseconds an operation by round, as times[subject][row]; the rows in their order."""
    times = {}
    rows = []
    for path in sorted(results.glob("*.json")):
        _, subject, round_number, _ = path.name.split(".")
        for bench in json.loads(path.read_text())["benchmarks"]:
            row = bench["name"].split("/")[0]
            if row not in rows:
                rows.append(row)
            by_round = times.setdefault(subject, {}).setdefault(row, {})
            by_round[round_number] = 1e9 / bench["items_per_second"]
    return times, rows


def table(header, lines):
    yield "| " + " | ".join(header) + " |"
    yield "|---|" + "---:|" * (len(header) - 1)
    for line in lines:
        yield "| " + " | ".join(line) + " |"
    yield ""


def number(value, digits=2):
    return "" if value is None else f"{value:.{digits}f}"


def geometric_mean(values):
    return math.exp(statistics.fmean(math.log(value) for value in values))


class Measured:
    """Medians over the rounds: of the times, and of the ratios of the two times of a round."""

    def __init__(self, times):
        self.times = times

    def time(self, row, subject):
        by_round = self.times.get(subject, {}).get(row)
        return None if by_round is None else statistics.median(by_round.values())

    def of(self, row, peer, subject="pool"):
        if subject == "best":
            ratios = [self.of(row, peer, pool) for pool in POOLS]
            return None if None in ratios else min(ratios)
        own, other = (self.times.get(name, {}).get(row) for name in (subject, peer))
        if own is None or other is None:
            return None
        return statistics.median(own[number] / other[number] for number in own)

    def spread(self, row):
        """The quartiles of the ratio of pools to the heap."""
        own, other = (self.times[name][row] for name in ("pools", "heap"))
        quartiles = statistics.quantiles((own[key] / other[key] for key in own), n=4)
        return f"{quartiles[0]:.2f} to {quartiles[2]:.2f}"

    def mean(self, rows, peer, subject="pool"):
        values = [self.of(row, peer, subject) for row in rows]
        return None if None in values else geometric_mean(values)


def goals(measured, rows, resident):
    """(what, goal, measured) triples: ratios that are to stay at or below their goals."""
    def worst(names, peer, pool="pool"):
        values = [measured.of(row, peer, pool) for row in names]
        return None if None in values else max(values)

    one_size = "200k x 32, free in "
    beside_pmr = [row for row in rows if measured.of(row, "pmr") and row != "pair, no other block"]
    return [
        ("pair, another block live / glibc", 1.0, measured.of("pair, another block live", "glibc")),
        ("the same, stretch", 0.8, measured.of("pair, another block live", "glibc")),
        ("free in order or reverse / glibc", 0.6,
         worst([one_size + "order", one_size + "reverse"], "glibc")),
        ("free in random order / glibc", 0.75, measured.of(one_size + "random order", "glibc")),
        ("churn mixed, 1k live / glibc", 0.75, measured.of("churn mixed, 1k live", "glibc")),
        ("churn mixed, 20k live / glibc", 1.0, measured.of("churn mixed, 20k live", "glibc")),
        ("churn mixed, 200k live / glibc", 0.75, measured.of("churn mixed, 200k live", "glibc")),
        ("build and drop / glibc", 0.3, measured.of("build 200k mixed, drop all", "glibc")),
        ("build and drop / mimalloc", 0.85, measured.of("build 200k mixed, drop all", "mimalloc")),
        ("worst trace / glibc", 1.1, worst(TRACES, "glibc")),
        ("worst trace, best setting / glibc", 1.0, worst(TRACES, "glibc", "best")),
        ("traces, geometric mean / glibc", 0.75, measured.mean(TRACES, "glibc")),
        ("traces, best setting, geometric mean / mimalloc", 1.15,
         measured.mean(TRACES, "mimalloc", "best")),
        ("the same, stretch", 1.0, measured.mean(TRACES, "mimalloc", "best")),
        ("worst row but the empty pool's pair / pmr", 0.9, worst(beside_pmr, "pmr")),
        ("all those rows, geometric mean / pmr", 0.5, measured.mean(beside_pmr, "pmr")),
    ] + [
        (f"resident bytes of {size} / best malloc", 1.0,
         resident["pool"][size] / min(resident[peer][size] for peer in MALLOCS if peer in resident))
        for size in (20, 40, 100, 200, 900)
    ]


def read_clients(results):
    """Seconds by round, as times[mode][work], and the works in their order."""
    times = {}
    for line in (results / "clients").read_text().splitlines():
        round_number, work, mode, figures = line.split("\t")
        seconds = sum(map(float, figures.split()))
        times.setdefault(mode[2:], {}).setdefault(work, {})[round_number] = seconds
    return times


def layer_goals(layer, clients):
    """Like goals(): what hosts build on the pools."""
    def client(name):
        return next((clients.of(work, "heap", "pools") for work in clients.times["pools"]
                     if name in work), None)

    def worst(peer):
        return max(layer.of(row, peer, "layer") for row in NODE_ROWS)

    return [
        ("Lua, objects / malloc", 0.6, client("objects")),
        ("Lua, trees / malloc", 0.6, client("trees")),
        ("Lua, strings / malloc", 0.8, client("strings")),
        ("SQLite / malloc", 1.0, client("Sqlite")),
        ("tree of nodes, dropped whole / glibc", 0.45, layer.of(TREE_ROW, "glibc", "layer")),
        ("worst node container on Resource / pmr", 0.9, worst("pmr")),
        ("the same / bare Mgr", 1.1, worst("raw")),
    ]


def client_table(clients):
    return table(["work", "pools", "malloc", "ratio", "spread"],
                 (["`" + work + "`", number(clients.time(work, "pools"), 3),
                   number(clients.time(work, "heap"), 3),
                   number(clients.of(work, "heap", "pools"))] + [clients.spread(work)]
                  for work in clients.times["pools"]))


def write_moving(path, clients):
    """Puts the clients' table between two comments of a text that is written by hand."""
    begin, end = "<!-- clients: written by scripts/bench.sh -->", "<!-- /clients -->"
    head, rest = path.read_text().split(begin)
    tail = rest.split(end)[1]
    lines = ["", "", "Seconds of processor time, medians, and the ratio within a round:", ""]
    lines += client_table(clients)
    path.write_text(head + begin + "\n".join(lines).rstrip() + "\n\n" + end + tail)


def layer_tables(layer, rows, clients):
    subjects = [name for name in LAYERED if name in layer.times]
    yield from table(["work, ns"] + subjects,
                     ([row] + [number(layer.time(row, name), 2) for name in subjects]
                      for row in rows))
    yield "The clients, seconds of processor time of the whole run, and the ratio within a round:"
    yield ""
    yield from client_table(clients)


def write_growth(results, layer, rows):
    """A block for each subject: blocks, ns an operation, ms to drop them."""
    numbers = [int(row.split()[1]) for row in rows if row.startswith("live ")]
    with (results / "growth.dat").open("w") as data:
        for subject in IN_GROWTH:
            for blocks in numbers:
                live, drop = (layer.time(f"{what} {blocks}", subject) for what in ("live", "drop"))
                if live is not None and drop is not None:
                    data.write(f"{blocks} {live} {drop * blocks / 1e6}\n")
            data.write("\n\n")


def machine():
    cpu = re.search(r"model name\s*: (.*)", pathlib.Path("/proc/cpuinfo").read_text()).group(1)
    cores = pathlib.Path("/proc/cpuinfo").read_text().count("processor\t:")
    cache = pathlib.Path("build/bench/CMakeCache.txt").read_text()
    compiler = subprocess.run([re.search(r"CMAKE_CXX_COMPILER:\w+=(.*)", cache).group(1),
                               "--version"], capture_output=True, text=True,
                              check=True).stdout.split("\n")[0]
    packages = subprocess.run(
        ["dpkg-query", "-W", "-f=${Package} ${Version}, ", "libc6", "libmimalloc2.0",
         "libjemalloc2", "libtcmalloc-minimal4", "libboost-dev"],
        capture_output=True, text=True, check=False).stdout.rstrip(", ")
    return (f"Measured on {cpu}, {cores} cores, {platform.system()}; "
            f"{compiler}; {packages}.")


def read_resident(results):
    """Resident bytes a block, as resident[subject][size], and bytes that the pool holds."""
    resident, held = {}, {}
    for line in (results / "resident").read_text().splitlines():
        subject, size, *figures = line.split()
        resident.setdefault(subject, {})[int(size)] = float(figures[0])
        if len(figures) > 1:
            held[int(size)] = float(figures[1])
    return resident, held


def resident_tables(resident, held):
    subjects = ["pool"] + [peer for peer in PEERS if peer in resident]
    yield from table(["bytes asked"] + subjects,
                     ([str(size)] + [number(resident[subject][size], 1) for subject in subjects]
                      for size in sorted(held)))
    yield "The pool's own books at its default settings: bytes that it holds from the heap, less"
    yield "those asked for, and what is left of that without bucket headers and tails. A size is"
    yield "rounded up to a multiple of 4; all sizes here are one."
    yield ""
    lines = []
    for size, bytes_held in sorted(held.items()):
        header = 48 / ((4010 - 2) // (size + 4))
        lines.append([str(size), number(bytes_held), number(bytes_held - size), number(header),
                      number(bytes_held - size - header)])
    yield from table(["bytes asked", "held a block", "overhead", "of it bucket header and tail",
                      "the rest"], lines)


def main():
    results, output = map(pathlib.Path, sys.argv[1:])
    times, rows = read_times(results)
    resident, held = read_resident(results)
    measured = Measured(times)
    peers = [peer for peer in PEERS if peer in times]
    timed = [row for row in rows if any(row in times[peer] for peer in peers)]
    layer_times, layer_rows = read_times(results / "layer")
    layer, clients = Measured(layer_times), Measured(read_clients(results))
    write_growth(results, layer, layer_rows)
    text = ["# Performance", "",
            "Written by `scripts/bench.sh`, which anybody can repeat. " + machine(), "",
            "![Time of an operation beside glibc](performance.svg)", "",
            "pool has the default settings, pool-keep also keeps empty buckets, and pool-64k has",
            "buckets of 65535 bytes. All subjects are called through the dynamic linker, but for",
            "boost and pmr, whose code is partly in headers. boost serves only one size.", "",
            "Each row has a process of its own, in which the heap is made long first and kept so by",
            "a block at its end, as other data of a host would. Without it the C library hands the",
            "memory of each round back to the system, and the rows measure that. Subjects take turns",
            "row by row; a ratio is the median of the ratios of the rounds.", "",
            "## Nanoseconds an operation, medians", ""]
    text += table(["work"] + POOLS + peers,
                  ([row] + [number(measured.time(row, subject), 1) for subject in POOLS + peers]
                   for row in rows))
    text += ["## Ratios, less than 1 is a win", ""]
    compared = [peer for peer in ("glibc", "mimalloc", "pmr") if peer in peers]
    text += table(["work"] + [f"pool / {peer}" for peer in compared] +
                  [f"best setting / {peer}" for peer in compared],
                  ([row] + [number(measured.of(row, peer)) for peer in compared] +
                   [number(measured.of(row, peer, "best")) for peer in compared] for row in timed))
    for peer in compared:
        both = [row for row in timed if measured.of(row, peer) is not None]
        text.append(f"Geometric mean of all rows beside {peer}: "
                    f"{number(measured.mean(both, peer))} at the default settings, "
                    f"{number(measured.mean(both, peer, 'best'))} with the best.")
    text += ["", "## Goals", ""]
    text += table(["ratio", "goal", "measured", ""],
                  ([what, number(goal), number(ratio),
                    "" if ratio is None else "met" if ratio <= goal else "missed"]
                   for what, goal, ratio in
                   goals(measured, rows, resident) + layer_goals(layer, clients)))
    text += ["## The layer and its clients", "",
             "layer is a `Heap` of `MemPoolHeap`, raw the bare `Mgr` with the same settings. The clients",
             "are those of `examples/`, each beside malloc in the same program.", ""]
    text += layer_tables(layer, layer_rows, clients)
    text += ["![Cost with growing work](growth.svg)", ""]
    text += ["## Resident bytes a live block", ""]
    text += resident_tables(resident, held)
    output.write_text("\n".join(text).rstrip() + "\n")
    write_moving(output.parent / "moving.md", clients)

    with (results / "ratios.dat").open("w") as data:
        for row in timed:
            if row not in times["glibc"]:
                continue
            marks = [measured.of(row, "glibc"), measured.of(row, "glibc", "best")]
            marks += [measured.of(row, "glibc", peer) for peer in IN_PICTURE]
            cells = ["-" if mark is None else f"{mark:.3f}" for mark in marks]
            data.write("\t".join([row] + cells) + "\n")


main()
