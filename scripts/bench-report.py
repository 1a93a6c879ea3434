#!/usr/bin/env python3
"""Writes docs/performance.md from the results of bench-run.py, for scripts/bench.sh.

usage: bench-report.py RESULTS OUTPUT

Writes the figures for the pictures beside RESULTS, as ratios.dat, growth.dat and hosts.dat.
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
MALLOCS = ["glibc", "mimalloc", "jemalloc", "tcmalloc"]
PEERS = MALLOCS + ["boost", "pmr"]
TRACES = ["trace lua", "trace jq", "trace sqlite"]
TREE_ROW = "tree of 262k nodes, dropped whole"
NODE_ROWS = ["list of 100k, built and cleared", "map, 10k live, insert or erase"]
GROWTH_ROWS = [f"grow to 1 MB in steps of {step}" for step in (16, 64, 1000)]
IN_GROWTH = ["pool-64k", "glibc", "mimalloc", "jemalloc", "pmr"]
IN_PICTURE = ["mimalloc", "jemalloc", "tcmalloc", "pmr"]
MEMORIES = {"malloc": "malloc", "mimalloc": "mimalloc", "Heap": "`Heap`",
            "FreeAll": "`Heap`, `FreeAll`", "mi_heap": "`mi_heap_destroy`",
            "pmr": "pmr, `release`"}
PACKAGES = ["libc6", "libmimalloc2.0", "libjemalloc2", "libtcmalloc-minimal4", "libboost-dev",
            "libxml2", "libduktape207", "libmruby-dev"]


def table(header, lines):
    yield "| " + " | ".join(header) + " |"
    yield "|---|" + "---:|" * (len(header) - 1)
    for line in lines:
        yield "| " + " | ".join(line) + " |"
    yield ""


def number(value, digits=2):
    return "" if value is None else f"{value:.{digits}f}"


def geometric_mean(values):
    return None if None in values else math.exp(statistics.fmean(map(math.log, values)))


def median_ratio(own, other):
    """The median over the rounds of the ratio within a round; None if one was not measured."""
    if own is None or other is None:
        return None
    return statistics.median(a / b for a, b in zip(own, other))


class Measured:
    """The time of each subject for each row: figures by round, as times[subject][row]."""

    def __init__(self, times):
        self.times = times

    def rounds(self, row, subject):
        return self.times.get(subject, {}).get(row)

    def median(self, row, subject):
        figures = self.rounds(row, subject)
        return None if figures is None else statistics.median(figures)

    def spread(self, subject):
        return statistics.median(max(figures) / min(figures)
                                 for figures in self.times[subject].values() if len(figures) > 1)

    def ratio(self, row, peer, subject="pool"):
        if subject == "best":
            ratios = [self.ratio(row, peer, pool) for pool in POOLS]
            return None if None in ratios else min(ratios)
        return median_ratio(self.rounds(row, subject), self.rounds(row, peer))

    def mean(self, rows, peer, subject="pool"):
        return geometric_mean([self.ratio(row, peer, subject) for row in rows])

    def worst(self, rows, peer, subject="pool"):
        ratios = [self.ratio(row, peer, subject) for row in rows]
        return None if None in ratios else max(ratios)


class Hosts:
    """Whole programs: seconds and kilobytes by round, as figures[work][memory]."""

    def __init__(self, figures):
        by_memory = [{}, {}]
        for work, memories in figures.items():
            for memory, rounds in memories.items():
                for kind in (0, 1):
                    by_memory[kind].setdefault(memory, {})[work] = [both[kind] for both in rounds]
        self.seconds, self.kilobytes = map(Measured, by_memory)
        self.plain = [work for work in figures if "Heap" in figures[work]]
        self.tuned = [work for work in figures if "Heap" not in figures[work]]

    def tuned_ratio(self, name):
        return next((self.seconds.ratio(work, "malloc", "FreeAll") for work in self.tuned
                     if name in work), None)

    def tuned_table(self):
        def spread(work):
            rounds = (self.seconds.rounds(work, memory) for memory in ("FreeAll", "malloc"))
            quartiles = statistics.quantiles((own / other for own, other in zip(*rounds)), n=4)
            return f"{quartiles[0]:.2f} to {quartiles[2]:.2f}"

        return table(["work", "pools", "malloc", "ratio", "quartiles"],
                     (["`" + work + "`", number(self.seconds.median(work, "FreeAll"), 3),
                       number(self.seconds.median(work, "malloc"), 3),
                       number(self.seconds.ratio(work, "malloc", "FreeAll")), spread(work)]
                      for work in self.tuned))

    def ratios_table(self, measured, unit, scale):
        """malloc's own figure, and the ratio of every other memory to it."""
        others = [memory for memory in MEMORIES if memory in measured.times][1:]
        lines = [["`" + work + "`", number(measured.median(work, "malloc") / scale)] +
                 [number(measured.ratio(work, "malloc", memory)) for memory in others]
                 for work in self.plain]
        lines.append(["geometric mean", ""] +
                     [number(measured.mean(self.plain, "malloc", memory)) for memory in others])
        return table(["work", "malloc, " + unit] + [MEMORIES[memory] for memory in others], lines)

    def write_picture(self, path):
        with path.open("w") as data:
            for measured in (self.seconds, self.kilobytes):
                for work in self.plain:
                    ratios = [measured.ratio(work, "malloc", memory) for memory in MEMORIES][1:]
                    data.write("\t".join([work.split()[0]] + ["-" if ratio is None else str(ratio)
                                                              for ratio in ratios]) + "\n")
                data.write("\n\n")


def goals(measured, rows, resident, hosts):
    """(what, goal, measured): ratios that should be at or below their goals."""
    one_size = "200k x 32, free in "
    beside_pmr = [row for row in rows if measured.ratio(row, "pmr") and row != "pair, no other block"]
    index = [work for work in hosts.plain if work.startswith("IndexHost")]
    return [
        ("pair, another block live / glibc", 1.0,
         measured.ratio("pair, another block live", "glibc")),
        ("the same, stretch", 0.8, measured.ratio("pair, another block live", "glibc")),
        ("free in order or reverse / glibc", 0.6,
         measured.worst([one_size + "order", one_size + "reverse"], "glibc")),
        ("free in random order / glibc", 0.75, measured.ratio(one_size + "random order", "glibc")),
        ("churn mixed, 1k live / glibc", 0.75, measured.ratio("churn mixed, 1k live", "glibc")),
        ("churn mixed, 20k live / glibc", 1.0, measured.ratio("churn mixed, 20k live", "glibc")),
        ("churn mixed, 200k live / glibc", 0.75, measured.ratio("churn mixed, 200k live", "glibc")),
        ("build and drop / glibc", 0.3, measured.ratio("build 200k mixed, drop all", "glibc")),
        ("build and drop / mimalloc", 0.85,
         measured.ratio("build 200k mixed, drop all", "mimalloc")),
        ("worst trace / glibc", 1.1, measured.worst(TRACES, "glibc")),
        ("worst trace, best setting / glibc", 1.0, measured.worst(TRACES, "glibc", "best")),
        ("traces, geometric mean / glibc", 0.75, measured.mean(TRACES, "glibc")),
        ("traces, best setting, geometric mean / mimalloc", 1.15,
         measured.mean(TRACES, "mimalloc", "best")),
        ("the same, stretch", 1.0, measured.mean(TRACES, "mimalloc", "best")),
        ("worst row except the empty pool's pair / pmr", 0.9, measured.worst(beside_pmr, "pmr")),
        ("all those rows, geometric mean / pmr", 0.5, measured.mean(beside_pmr, "pmr")),
    ] + [
        (f"resident bytes of {size} / best malloc", 1.0,
         resident["pool"][size] / min(resident[peer][size] for peer in MALLOCS if peer in resident))
        for size in (20, 40, 100, 200, 900)
    ] + [
        ("Lua, objects / malloc", 0.6, hosts.tuned_ratio("objects")),
        ("Lua, trees / malloc", 0.6, hosts.tuned_ratio("trees")),
        ("Lua, strings / malloc", 0.8, hosts.tuned_ratio("strings")),
        ("SQLite / malloc", 1.0, hosts.tuned_ratio("Sqlite")),
        ("tree of nodes, dropped whole / glibc", 0.45, measured.ratio(TREE_ROW, "glibc", "layer")),
        ("worst node container on Resource / pmr", 0.9, measured.worst(NODE_ROWS, "pmr", "layer")),
        ("the same / bare Mgr", 1.1, measured.worst(NODE_ROWS, "pool-64k", "layer")),
        ("worst growth in small steps / glibc", 3.0, measured.worst(GROWTH_ROWS, "glibc", "layer")),
        ("hosts on a Heap, time / mimalloc", 1.0,
         hosts.seconds.mean(hosts.plain, "mimalloc", "Heap")),
        ("hosts on a Heap, peak memory / malloc", 0.95,
         hosts.kilobytes.mean(hosts.plain, "malloc", "Heap")),
        ("hosts that end in FreeAll, time / mimalloc", 0.92,
         hosts.seconds.mean(hosts.plain, "mimalloc", "FreeAll")),
        ("hosts that end in FreeAll, time / mi_heap_destroy", 1.0,
         hosts.seconds.mean(hosts.plain, "mi_heap", "FreeAll")),
        ("std::pmr index that ends in FreeAll, time / pmr's release", 1.0,
         hosts.seconds.mean(index, "pmr", "FreeAll") if index else None),
    ]


def write_growth(path, measured, rows):
    """A block for each subject: blocks, ns per operation, ms to drop them."""
    numbers = [int(row.split()[1]) for row in rows if row.startswith("live ")]
    with path.open("w") as data:
        for subject in IN_GROWTH:
            for blocks in numbers:
                live, drop = (measured.median(f"{what} {blocks}", subject) for what in ("live", "drop"))
                if live is not None and drop is not None:
                    data.write(f"{blocks} {live} {drop * blocks / 1e6}\n")
            data.write("\n\n")


def write_ratios(path, measured, rows):
    with path.open("w") as data:
        for row in rows:
            if measured.rounds(row, "glibc") is None:
                continue
            ratios = [measured.ratio(row, "glibc"), measured.ratio(row, "glibc", "best")]
            ratios += [measured.ratio(row, "glibc", peer) for peer in IN_PICTURE]
            cells = ["-" if ratio is None else f"{ratio:.3f}" for ratio in ratios]
            data.write("\t".join([row] + cells) + "\n")


def machine():
    info = pathlib.Path("/proc/cpuinfo").read_text()
    cpu = re.search(r"model name\s*: (.*)", info).group(1)
    cores = info.count("processor\t:")
    cache = pathlib.Path("build/bench/CMakeCache.txt").read_text()
    compiler = subprocess.run([re.search(r"CMAKE_CXX_COMPILER:\w+=(.*)", cache).group(1),
                               "--version"], capture_output=True, text=True,
                              check=True).stdout.split("\n")[0]
    packages = subprocess.run(
        ["dpkg-query", "-W", "-f=${Package} ${Version}, ", *PACKAGES],
        capture_output=True, text=True, check=False).stdout.rstrip(", ")
    return f"{cpu}, {cores} cores, {platform.system()}; {compiler}; {packages}"


def resident_tables(resident, held):
    subjects = [subject for subject in ["pool"] + PEERS if subject in resident]
    yield from table(["bytes requested"] + subjects,
                     ([str(size)] + [number(resident[subject][size], 1) for subject in subjects]
                      for size in sorted(held)))
    yield "The pool's own count, at its default settings: the bytes per block that it holds, those of them"
    yield "that the program did not request, and the latter without bucket headers and tails. A pool"
    yield "rounds sizes up to a multiple of 4; all sizes here are one."
    yield ""
    lines = []
    for size, bytes_held in sorted(held.items()):
        header = 48 / ((4010 - 2) // (size + 4))
        lines.append([str(size), number(bytes_held), number(bytes_held - size), number(header),
                      number(bytes_held - size - header)])
    yield from table(["bytes requested", "held per block", "overhead", "bucket header and tail",
                      "the rest of the overhead"], lines)


def hosts_section(hosts):
    yield from ["## Whole programs", "",
                "Each program reads an input of 20 MB, which `bench/make-inputs.py` makes, and prints the same",
                "on every allocator. A `Heap` has its default settings and `On(true)`. It is freed block by",
                "block, or dropped as a whole with `FreeAll`. `mi_heap_destroy` drops a heap of mimalloc as a",
                "whole, in the same program. The ratios to malloc are medians of the ratios within a round.",
                "",
                "- `XmlHost`: libxml2 reads a document, walks it and frees it.",
                "- `JsHost`: duktape parses JSON line by line, keeps the objects and groups them.",
                "- `RubyHost`: mruby splits lines into words and indexes them; only the first 40,000 lines, 2.7 MB.",
                "- `IndexHost`: the same with all lines, in containers of `std::pmr`.", "",
                "![Whole programs compared with malloc](hosts.svg)", "",
                "Processor time, user and system:", ""]
    yield from hosts.ratios_table(hosts.seconds, "s", 1)
    yield from ["Peak resident memory:", ""]
    yield from hosts.ratios_table(hosts.kilobytes, "MB", 1024)
    yield from ["Programs of `examples` with settings chosen for their work, seconds of processor time:", ""]
    yield from hosts.tuned_table()


def main():
    path, output = map(pathlib.Path, sys.argv[1:])
    results = json.loads(path.read_text())
    measured, hosts = Measured(results["rows"]), Hosts(results["hosts"])
    figures = {subject: {int(size): both for size, both in sizes.items()}
               for subject, sizes in results["resident"].items()}
    resident = {subject: {size: both[0] for size, both in sizes.items()}
                for subject, sizes in figures.items()}
    held = {size: both[1] for size, both in figures["pool"].items()}
    rows = list({**results["rows"]["pool-64k"], **results["rows"]["layer"]})
    peers = [peer for peer in PEERS if peer in measured.times]
    timed = [row for row in rows if measured.ratio(row, "glibc") or measured.ratio(row, "pmr")]
    compared = [peer for peer in ("glibc", "mimalloc", "pmr") if peer in peers]

    text = ["# Performance", "",
            f"`scripts/bench.sh` writes this page. Measured on {machine()}.", ""]
    text += hosts_section(hosts)
    text += ["## Single operations", "",
             "![Time per operation compared with glibc](performance.svg)", "",
             "pool is a bare `Mgr` with the default settings. pool-keep also keeps empty buckets, and",
             "pool-64k has buckets of 65535 bytes. layer is a `Heap` with its default settings. All are called",
             "through the dynamic linker, except boost and pmr, which are partly headers. boost serves only",
             "one size.", "",
             "Each row runs in a process of its own. Its heap is first made long, and a block at its end keeps",
             "it long, as the other data of a program would. Otherwise the C library would return the memory",
             "of each round to the system, and the rows would measure that. The allocators take turns row by",
             "row. Between its rounds the time of a row differed by a factor of "
             f"{number(measured.spread('glibc'), 1)} for glibc, in the median.",
             "", "Nanoseconds per operation, medians:", ""]
    subjects = POOLS + ["layer"] + peers
    text += table(["work"] + subjects,
                  ([row] + [number(measured.median(row, subject), 2) for subject in subjects]
                   for row in rows))
    text += ["Ratios, medians of the ratios within a round; below 1 the pool is faster:", ""]
    text += table(["work"] + [f"pool / {peer}" for peer in compared] +
                  [f"best setting / {peer}" for peer in compared],
                  ([row] + [number(measured.ratio(row, peer, subject))
                            for subject in ("pool", "best") for peer in compared]
                   for row in timed))
    for peer in compared:
        both = [row for row in timed if measured.ratio(row, peer) is not None]
        text.append(f"Geometric mean of all rows compared with {peer}: "
                    f"{number(measured.mean(both, peer))} at the default settings, "
                    f"{number(measured.mean(both, peer, 'best'))} with the best.")
    text += ["", "![Cost with growing work](growth.svg)", "", "## Resident bytes per live block", ""]
    text += resident_tables(resident, held)
    text += ["## Goals", ""]
    text += table(["ratio", "goal", "measured", ""],
                  ([what, number(goal), number(ratio),
                    "" if ratio is None else "met" if ratio <= goal else "missed"]
                   for what, goal, ratio in goals(measured, rows, resident, hosts)))
    output.write_text("\n".join(text).rstrip() + "\n")
    write_growth(path.parent / "growth.dat", measured, rows)
    write_ratios(path.parent / "ratios.dat", measured, timed)
    hosts.write_picture(path.parent / "hosts.dat")


main()
