#!/usr/bin/env python3
"""Runs the benchmarks of a build and writes their results, for scripts/bench.sh.

The subjects do each piece of work one right after the other, each in a process of its own, so that
other load on the machine affects all of them. The parts, all of them by default:

  rows      nanoseconds per operation
  resident  bytes of memory per live block
  hosts     whole programs: processor time and peak memory; all must print the same

The output is JSON with an entry for each part.
"""

import argparse
import json
import os
import pathlib
import re
import subprocess
import sys
import tempfile

SOURCES = pathlib.Path(__file__).parent.parent
POOLS = ["pool", "pool-keep", "pool-64k", "layer"]
PRELOADED = {"mimalloc": "libmimalloc.so", "jemalloc": "libjemalloc.so",
             "tcmalloc": "libtcmalloc_minimal.so"}
SIZES = [8, 16, 20, 32, 40, 64, 100, 128, 200, 256, 400, 512, 700, 900]

# The hosts as they are shown. What follows "<" is their standard input.
MADE_INPUTS = ["orders.xml", "orders.jsonl", "words.txt"]
HOSTS = ["XmlHost orders.xml", "JsHost examples/js/orders.js < orders.jsonl",
         "RubyHost bench/words.rb < words.txt", "IndexHost < words.txt"]
TUNED_HOSTS = ["Ast --definitions 50000", "LuaHost examples/lua/objects.lua",
               "LuaHost examples/lua/trees.lua", "LuaHost examples/lua/strings.lua",
               "SqliteHost examples/sql/orders.sql"]
# The kinds of memory of a host, each with its option.
MEMORIES = {"malloc": "--heap", "mimalloc": "--heap", "Heap": "--close", "FreeAll": None,
            "mi_heap": None, "pmr": "--pmr", "off": "--off"}


def step(text):
    print(f"\n== {text}", flush=True)


def preloads():
    """The mallocs that can replace the C library's, by name."""
    known = subprocess.run(["/sbin/ldconfig", "-p"], capture_output=True, text=True,
                           check=True).stdout
    found = {"glibc": ""}
    for name, library in PRELOADED.items():
        match = re.search(rf"^\s*{re.escape(library)}.* => (.*)$", known, re.MULTILINE)
        if match:
            found[name] = match.group(1)
        else:
            print(f"{name} is left out: {library} is not installed.")
    return found


class Runner:
    def __init__(self, build, quick, smoke):
        self.build = build
        self.quick = quick
        self.smoke = smoke
        self.rounds = 1 if smoke else 2 if quick else 3
        self.seconds = 0.02 if quick else 0.1
        self.preloads = preloads()

    def run(self, command, preload="", **options):
        return subprocess.run(command, env={**os.environ, "LD_PRELOAD": preload}, check=True,
                              stdout=subprocess.PIPE, text=True, **options).stdout

    def rows_of(self, subject):
        """The rows that a subject has; none if it could not be built."""
        listed = subprocess.run(
            [self.build / "bench" / "PoolBench", f"--subject={subject}", "--benchmark_list_tests"],
            capture_output=True, text=True, check=False)
        return listed.stdout.splitlines() if listed.returncode == 0 else []

    def rows(self):
        """Nanoseconds per operation by round, as times[subject][row], in the order of the rows."""
        names = {subject: "heap" if subject in self.preloads else subject
                 for subject in POOLS + list(self.preloads) + ["boost", "pmr"]}
        rows = {subject: self.rows_of(name) for subject, name in names.items()}
        times = {subject: {} for subject in names if rows[subject]}
        for subject in set(names) - set(times):
            print(f"{subject} is left out: PoolBench was built without it.")
        for turn in range(self.rounds):
            step(f"Rows, round {turn + 1} of {self.rounds}")
            order = list(times)[turn:] + list(times)[:turn]  # Each round begins with another.
            for row in dict.fromkeys(rows["pool-64k"] + rows["layer"]):
                # The rows about growth are long and run once.
                if re.match("live|drop", row) and (turn > 0 or self.quick and "0000000/" in row):
                    continue
                for subject in order:
                    if row in rows[subject]:
                        times[subject].setdefault(row.split("/")[0], []).append(
                            self.measure_row(row, names[subject], self.preloads.get(subject, "")))
        return times

    def measure_row(self, row, name, preload):
        output = self.run(
            [self.build / "bench" / "PoolBench", f"--subject={name}", "--benchmark_format=json",
             f"--benchmark_filter=^{row}$", f"--benchmark_min_time={self.seconds}"],
            preload, stderr=subprocess.DEVNULL)
        return 1e9 / json.loads(output)["benchmarks"][0]["items_per_second"]

    def resident(self):
        """Resident bytes per block and, for the pool, bytes that it holds."""
        step("Resident bytes per block")
        program = self.build / "bench" / "Resident"
        figures = {}
        for subject in ["pool"] + list(self.preloads) + ["boost", "pmr"]:
            name = "heap" if subject in self.preloads else subject
            figures[subject] = {
                size: [float(figure) for figure in self.run(
                    [program, name, str(size)], self.preloads.get(subject, "")).split()]
                for size in SIZES}
        return figures

    def hosts(self):
        """Seconds of processor time and peak kilobytes by round, as figures[host][memory]."""
        figures = {}
        with tempfile.TemporaryDirectory() as folder:
            inputs = pathlib.Path(folder)
            self.run([SOURCES / "bench" / "make-inputs.py", inputs, "0.1" if self.smoke else "20"])
            works = [work for work in HOSTS + ([] if self.smoke else TUNED_HOSTS)
                     if self.program(work.split()[0])]
            outputs = {}
            for turn in range(2 * self.rounds - 1):
                step(f"Hosts, round {turn + 1}")
                for work in works:
                    for memory in MEMORIES:
                        measured = self.measure_host(work, memory, inputs, outputs)
                        if measured:
                            figures.setdefault(work, {}).setdefault(memory, []).append(measured)
        return figures

    def program(self, name):
        paths = (self.build / folder / name for folder in ("examples", "bench"))
        return next((path for path in paths if path.exists()), None)

    def has_memory(self, work, memory):
        if work in TUNED_HOSTS:
            return memory in ("malloc", "FreeAll")
        return {"mimalloc": "mimalloc" in self.preloads and not self.smoke,
                "pmr": work.startswith("IndexHost"), "off": self.smoke}.get(memory, True)

    def measure_host(self, work, memory, inputs, outputs):
        """Seconds and kilobytes, or None for a memory that the host does not have."""
        command, _, source = work.partition(" < ")
        name, *arguments = command.split()
        program = self.program(name + ("OnMimalloc" if memory == "mi_heap" else ""))
        if program is None or not self.has_memory(work, memory):
            return None
        option = MEMORIES[memory]
        paths = [inputs / word if word in MADE_INPUTS else word for word in arguments]
        with open(inputs / source if source else os.devnull, "rb") as stdin, \
                tempfile.TemporaryFile() as stdout, tempfile.TemporaryFile() as stderr:
            preload = self.preloads["mimalloc"] if memory == "mimalloc" else ""
            process = subprocess.Popen([program] + ([option] if option else []) + paths,
                                       cwd=SOURCES, env={**os.environ, "LD_PRELOAD": preload},
                                       stdin=stdin, stdout=stdout, stderr=stderr)
            _, status, usage = os.wait4(process.pid, 0)
            process.returncode = os.waitstatus_to_exitcode(status)
            stdout.seek(0)
            stderr.seek(0)
            output = stdout.read()
            if process.returncode != 0:
                sys.exit(f"{work} on {memory} failed:\n{stderr.read().decode()}")
            if outputs.setdefault(work, output) != output:
                sys.exit(f"{work} prints something else on {memory}")
        return [usage.ru_utime + usage.ru_stime, usage.ru_maxrss]


def main():
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("build", type=pathlib.Path, help="the folder of the build")
    parser.add_argument("output", type=pathlib.Path)
    parser.add_argument("parts", nargs="*", default=["rows", "resident", "hosts"])
    parser.add_argument("--quick", action="store_true", help="fewer and shorter rounds")
    parser.add_argument("--smoke", action="store_true", help="small inputs, to check that all run")
    options = parser.parse_args()
    runner = Runner(options.build.resolve(), options.quick, options.smoke)
    results = {part: getattr(runner, part)() for part in options.parts}
    options.output.write_text(json.dumps(results))


main()
