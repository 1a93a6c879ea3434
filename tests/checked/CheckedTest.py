"""`mempool check` on hosts with faults: what the library and the checker report of each, and that they
name the host's lines. Takes the tool, the host, the same built with AddressSanitizer, a host that
contains the library, and whether Valgrind is there."""

import os
import re
import subprocess
import sys

tool, plain, sanitized, static, has_valgrind = sys.argv[1:]
source = os.path.join(os.path.dirname(os.path.abspath(__file__)), "Faulty.cpp")
failures = []


def line_of(*marks):
    """The host's line with the first of these marks that there is."""
    with open(source, encoding="utf-8") as file:
        lines = file.read().splitlines()
    return next(f"Faulty.cpp:{number}" for mark in marks
                for number, line in enumerate(lines, 1) if line.endswith((mark, mark + ", taken here")))


def check(checker, host, *args, **variables):
    """Returns the exit status and the standard error by section: a host with faults begins one at each.
    Standard output is the section None."""
    environment = {name: value for name, value in os.environ.items()
                   if not name.startswith(("NUV_", "ASAN_", "MEMPOOL_"))}
    command = [tool, "check"] + (["--with", checker] if checker else []) + [host, *args]
    run = subprocess.run(command, env={**environment, **variables}, stdout=subprocess.PIPE,
                         stderr=subprocess.PIPE, text=True, errors="replace", timeout=120, check=False)
    expect(run.returncode != 99 or run.stdout.endswith("all"), f"{args} is flushed", run.stdout)
    first, *rest = re.split(r"^== (.*)\n", run.stderr, flags=re.MULTILINE)
    return run.returncode, {None: run.stdout, "": first, **dict(zip(rest[::2], rest[1::2]))}


def expect(holds, what, text):
    if not holds:
        failures.append(f"{what}\n{text}")


def library_lines(fault, kind):
    """The lines of the library about a fault. To the pool a block of a heap begins 4 bytes earlier,
    unless it is a heap record."""
    moved = 4 if kind == "heap" else 0
    damaged = r"pool nodes: bucket 0x\w{16}, record 0x\w{16}: the header is damaged up to "
    at_40 = damaged + (r"40 bytes before the data \(next1\)" if kind == "bare" else
                       r"36 bytes before the data \(prev1\)")
    address = r"0x\w{16} "
    two_threads = (r"pool nodes: used by two threads at the same time: "
                   r"(?=.*\(main)(?=.*\(worker)\d+ \(\w+\) and \d+ \(\w+\)")
    return {
        "double free": ["pool nodes: " + address + "is already freed"],
        "double free, large": ["pool nodes: " + address + "is already freed"],
        "wrong pool": ["pool others: " + address + "is a block of pool nodes"],
        "wrong pool, large": ["pool others: " + address + "is a block of pool nodes"],
        "disabled pool": ["pool off: " + address + "is a block of pool nodes"],
        "no bytes": ["pool tiny: " + address + "is a heap record of 0 bytes, which only Clear releases"],
        "inner": ["pool nodes: " + address + "is not a block of any pool",
                  f"pool nodes: {address}is not a block: it lies {8 + moved} bytes into the block at 0x"],
        "underrun 1": [damaged + r"1 byte before the data \(guard\)" if kind == "bare" else
                       f"pool nodes: {address}is not a block: it lies 4 bytes into"] +
                      ([f"pool nodes: 1 block, {13 + moved} bytes never freed"] if kind == "heap" else []),
        "underrun 40": [at_40],
        "cleared": [at_40],
        "neighbours": [at_40, at_40],
        "beside": [damaged + r"4[48] bytes before the data \(\w+\)"],
        "underrun 1, large": [r"pool nodes: heap record 0x\w{16}: the header is damaged up to 1 byte"
                              r" before the data \(guard\)"],
        "two threads": [two_threads],
        "two threads, large": [two_threads],
        "leak": [f"pool nodes: 4 blocks, {4 * (13 + moved)} bytes never freed"],
        "leak, large": [f"pool nodes: 4 blocks, {4 * 2001} bytes never freed"],
        "exit": [f"pool kept: 1 block, {992 + moved} bytes never freed",
                 f"pool alive: 1 block, {13 + moved} bytes never freed",
                 f"pool also: 1 block, {13 + moved} bytes never freed"],
    }.get(fault, [])


# What each checker reports itself.
found = {"asan": {"read after free": "heap-use-after-free", "write after free": "heap-use-after-free",
                  "use after clear": "heap-use-after-free", "underrun 40": "use-after-poison",
                  "cleared": "use-after-poison", "neighbours": "use-after-poison",
                  "beside": "use-after-poison", "underrun 1, large": "use-after-poison",
                  "overrun 1": "heap-buffer-overflow", "heap record overrun, large": "heap-buffer-overflow",
                  "overrun 40": "heap-buffer-overflow",
                  "overrun 100": "heap-buffer-overflow", "underrun 100": "heap-buffer-overflow"},
         "valgrind": {"read after free": "Invalid read", "write after free": "Invalid write",
                      "use after clear": "Invalid write", "overrun 1": "Invalid write",
                      "heap record overrun, large": "Invalid write",
                      "overrun 40": "Invalid write", "overrun 100": "Invalid write",
                      "underrun 100": "Invalid write"},
         "nothing": {}}
# Without a checker nobody sees what is written beyond the heap block of a bucket.
all_faults = ["none", "none, large", "double free", "double free, large", "wrong pool",
              "wrong pool, large", "inner", "underrun 1", "underrun 1, large", "underrun 40", "cleared",
              "neighbours", "beside", "leak", "leak, large", "leak at exit", "two threads",
              "two threads, large", "threads in turns"]

for checker, host in {"nothing": plain, "asan": sanitized, "valgrind": plain}.items():
    if checker == "valgrind" and has_valgrind != "yes":
        continue
    for kind in ("bare", "heap"):
        faults = dict.fromkeys([*found[checker], *all_faults])
        if kind == "bare":
            faults.update(dict.fromkeys(["disabled pool", "no bytes"]))
        status, sections = check(checker, host, kind, *faults, ASAN_OPTIONS="halt_on_error=0",
                                 VALGRIND_OPTS="--track-origins=no")
        expect(status == 99, f"{checker} {kind}: {status}", sections)
        expect(faults.keys() <= sections.keys(), f"{checker} {kind} breaks off", sections)
        del sections[None], sections[""]
        for fault, text in sections.items():
            where = f"{checker} {kind}, {fault}:"
            expect("wrong answer" not in text, f"{where} the answer of the pool", text)
            lines = library_lines(fault, kind)
            expect(re.fullmatch("".join(line + ".*\n" for line in lines),
                                "".join(re.findall("^mempool: (.*\n)", text, re.MULTILINE))),
                   f"{where} {lines}", text)
            problem = found[checker].get(fault)
            if problem:
                expect(problem in text, f"{where} {problem}", text)
            elif checker != "nothing":
                # A heap reads the tag of a freed block; a bare pool reads nothing that is freed.
                problems = "ERROR: Addr|Invalid write" + ("|Invalid read" if kind == "bare" else "")
                expect(not re.search(problems, text), f"{where} no problem", text)
            if checker != "nothing" and (lines or problem):
                name = fault.removesuffix(", large")
                if problem:
                    expect(line_of("at: " + name) in text, f"{where} the line", text)
                if name == "leak":
                    expect(text.count(line_of("at: leak")) == 3, f"{where} where three were taken", text)
                    continue
                if lines:
                    expect(line_of("found: " + name, "at: " + name) in text, f"{where} the call", text)
                if name not in ("exit", "no bytes", "two threads"):
                    expect(line_of("// taken here") in text, f"{where} where it was taken", text)

# Status, choice of the checker, and what cannot be checked.
for checker, host in (("nothing", plain), ("asan", sanitized), ("valgrind", plain)):
    if checker == "valgrind" and has_valgrind != "yes":
        continue
    for faults_made, status in ((["none"], 0), (["double free"], 99), (["leak at exit"], 99),
                                (["double free", "ends with 3"], 3), (["double free, then a child"], 99)):
        expect(check(checker, host, "bare", *faults_made)[0] == status, f"{checker} {faults_made}", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS="255")[0] == 255, "255", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS="0")[0] == 0, "0", "")
for wrong in ("300", "7 ", ""):
    status, sections = check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS=wrong)
    expect(status == 99 and f"STATUS={wrong}: not a number from 0 to 255; 99 is used" in sections["exit"],
           f"{wrong}: {status}", sections)
expect(check("asan", "--alignment", "8", sanitized, "bare", "overrun 1")[0] == 0, "alignment", "")
expect(check("asan", sanitized, "bare", "double free", "heap leak",
             ASAN_OPTIONS="exitcode=5")[0] == 5, "the status of LeakSanitizer", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_ABORT="1")[0] == -6, "abort", "")
status, sections = check("nothing", plain, "bare", "double free", MEMPOOL_ABORT="0",
                         NUV_OBR_MEMPOOL_TRACE="1")
expect(status == 99 and sections[None].count("xmpt:f:") == 2, "no abort, and a trace", sections)
library = os.path.join(os.path.dirname(tool), "../../obrmempool-checked/libObrMemPool.so.1")
run = subprocess.run([plain, "bare", "double free"], capture_output=True, check=False,
                     env={"LD_PRELOAD": library, "NUV_OBR_MEMPOOL_ON": "1"})
expect(run.returncode == 0 and b"already freed" in run.stderr, "without mempool check", run.stderr)
status, sections = check(None, sanitized, "bare", "overrun 1")
expect(status == 1 and "checking with asan" in sections[""], f"asan by itself: {status}", sections)
if has_valgrind == "yes":
    status, sections = check(None, plain, "bare", "none")
    expect(status == 0 and "checking with valgrind" in sections[""], f"valgrind: {status}", sections)
for checker, host, status, reason in (("asan", plain, 125, "not built with -fsanitize=address"),
                                      ("valgrind", sanitized, 125, "does not run under Valgrind"),
                                      ("nothing", static, 125, "contains the library"),
                                      ("nothing", "/", 126, "Is a directory"),
                                      ("nothing", source, 126, "Permission denied"),
                                      ("nothing", "no-such-program", 127, "No such file"),
                                      ("other", plain, 125, "other not in"),
                                      ("nothing", "true", 0, "does not use libObrMemPool.so")):
    code, sections = check(checker, host)
    expect(code == status and reason in sections[""], f"{checker} {host}: {code}", sections)

for failure in failures:
    print("FAILED", failure)
sys.exit(1 if failures else 0)
