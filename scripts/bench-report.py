#!/usr/bin/env python3
"""Writes the tables of docs/performance.md from the results that scripts/bench.sh collects.

usage: bench-report.py RESULTS OUTPUT

RESULTS holds SUBJECT.ROUND.json (Google Benchmark's) and "resident" (subject, size, bytes a block
and, for the pool, bytes held). The figures for the picture go back there, as ratios.dat.
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
IN_PICTURE = ["mimalloc", "jemalloc", "tcmalloc", "pmr"]


def read_times(results):
    """Median nanoseconds an operation, as times[subject][row]; rows in their order."""
    samples = {}
    rows = []
    for path in sorted(results.glob("*.json")):
        subject = path.name.split(".")[0]
        for bench in json.loads(path.read_text())["benchmarks"]:
            row = bench["name"].split("/")[0]
            if row not in rows and subject == "pool":
                rows.append(row)
            samples.setdefault(subject, {}).setdefault(row, []).append(
                1e9 / bench["items_per_second"])
    return {subject: {row: statistics.median(times) for row, times in by_row.items()}
            for subject, by_row in samples.items()}, rows


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


class Ratios:
    """The pool's times divided by a peer's."""

    def __init__(self, times):
        self.times = times

    def best(self, row):
        return min(self.times[pool][row] for pool in POOLS)

    def of(self, row, peer, pool="pool"):
        own = self.best(row) if pool == "best" else self.times[pool][row]
        other = self.times.get(peer, {}).get(row)
        return None if other is None else own / other

    def mean(self, rows, peer, pool="pool"):
        values = [self.of(row, peer, pool) for row in rows]
        return None if None in values else geometric_mean(values)


def goals(ratios, rows, resident):
    """(what, goal, measured) triples: ratios that are to stay at or below their goals."""
    def worst(names, peer, pool="pool"):
        values = [ratios.of(row, peer, pool) for row in names]
        return None if None in values else max(values)

    one_size = "200k x 32, free in "
    beside_pmr = [row for row in rows if ratios.of(row, "pmr") and row != "pair, no other block"]
    return [
        ("pair, another block live / glibc", 1.0, ratios.of("pair, another block live", "glibc")),
        ("the same, stretch", 0.8, ratios.of("pair, another block live", "glibc")),
        ("free in order or reverse / glibc", 0.6,
         worst([one_size + "order", one_size + "reverse"], "glibc")),
        ("free in random order / glibc", 0.75, ratios.of(one_size + "random order", "glibc")),
        ("churn mixed, 1k live / glibc", 0.75, ratios.of("churn mixed, 1k live", "glibc")),
        ("churn mixed, 20k live / glibc", 1.0, ratios.of("churn mixed, 20k live", "glibc")),
        ("churn mixed, 200k live / glibc", 0.75, ratios.of("churn mixed, 200k live", "glibc")),
        ("build and drop / glibc", 0.3, ratios.of("build 200k mixed, drop all", "glibc")),
        ("build and drop / mimalloc", 0.85, ratios.of("build 200k mixed, drop all", "mimalloc")),
        ("worst trace / glibc", 1.1, worst(TRACES, "glibc")),
        ("worst trace, best setting / glibc", 1.0, worst(TRACES, "glibc", "best")),
        ("traces, geometric mean / glibc", 0.75, ratios.mean(TRACES, "glibc")),
        ("traces, best setting, geometric mean / mimalloc", 1.15,
         ratios.mean(TRACES, "mimalloc", "best")),
        ("the same, stretch", 1.0, ratios.mean(TRACES, "mimalloc", "best")),
        ("worst row but the empty pool's pair / pmr", 0.9, worst(beside_pmr, "pmr")),
        ("all those rows, geometric mean / pmr", 0.5, ratios.mean(beside_pmr, "pmr")),
    ] + [
        (f"resident bytes of {size} / best malloc", 1.0,
         resident["pool"][size] / min(resident[peer][size] for peer in MALLOCS if peer in resident))
        for size in (20, 40, 100, 200, 900)
    ]


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
    return (f"Measured on {cpu}, {cores} cores, {platform.system()} {platform.release()}; "
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
    ratios = Ratios(times)
    peers = [peer for peer in PEERS if peer in times]
    timed = [row for row in rows if any(row in times[peer] for peer in peers)]
    text = ["# Performance", "",
            "Written by `scripts/bench.sh`, which anybody can repeat. " + machine(), "",
            "![Time of an operation beside glibc](performance.svg)", "",
            "pool has the default settings, pool-keep also keeps empty buckets, and pool-64k has",
            "buckets of 65535 bytes. All subjects are called through the dynamic linker, but for",
            "boost and pmr, whose code is partly in headers. boost serves only one size.", "",
            "Each row has a process of its own, in which the heap is made long first and kept so by",
            "a block at its end, as other data of a host would. Without it the C library hands the",
            "memory of each round back to the system, and the rows measure that.", "",
            "## Nanoseconds an operation, medians", ""]
    text += table(["work"] + POOLS + peers,
                  ([row] + [number(times[subject].get(row), 1) for subject in POOLS + peers]
                   for row in rows))
    text += ["## Ratios, less than 1 is a win", ""]
    compared = [peer for peer in ("glibc", "mimalloc", "pmr") if peer in peers]
    text += table(["work"] + [f"pool / {peer}" for peer in compared] +
                  [f"best setting / {peer}" for peer in compared],
                  ([row] + [number(ratios.of(row, peer)) for peer in compared] +
                   [number(ratios.of(row, peer, "best")) for peer in compared] for row in timed))
    for peer in compared:
        both = [row for row in timed if ratios.of(row, peer) is not None]
        text.append(f"Geometric mean of all rows beside {peer}: "
                    f"{number(ratios.mean(both, peer))} at the default settings, "
                    f"{number(ratios.mean(both, peer, 'best'))} with the best.")
    text += ["", "## Goals", ""]
    text += table(["ratio", "goal", "measured", ""],
                  ([what, number(goal), number(measured),
                    "" if measured is None else "met" if measured <= goal else "missed"]
                   for what, goal, measured in goals(ratios, rows, resident)))
    text += ["## Resident bytes a live block", ""]
    text += resident_tables(resident, held)
    output.write_text("\n".join(text).rstrip() + "\n")

    with (results / "ratios.dat").open("w") as data:
        for row in timed:
            glibc = times["glibc"].get(row)
            if glibc is None:
                continue
            marks = [times["pool"][row], ratios.best(row)]
            marks += [times.get(peer, {}).get(row) for peer in IN_PICTURE]
            cells = ["-" if mark is None else f"{mark / glibc:.3f}" for mark in marks]
            data.write("\t".join([row] + cells) + "\n")


main()
