"""`mempool check` on hosts with faults: what is told of each, by the library and by the checker, and
that it names the host's lines. Takes the tool, the host, the same built with AddressSanitizer, a host
that has the library in it, and whether Valgrind is there."""

import os
import re
import subprocess
import sys

tool, plain, sanitized, static, has_valgrind = sys.argv[1:]
source = os.path.join(os.path.dirname(os.path.abspath(__file__)), "Faulty.cpp")
failures = []


def line_of(mark):
    with open(source, encoding="utf-8") as file:
        return next(number for number, line in enumerate(file, 1) if line.rstrip().endswith(mark))


def check(checker, host, *args, **variables):
    """Returns the exit status and what was told: by section, of which a host with faults begins one
    at each."""
    environment = {name: value for name, value in os.environ.items()
                   if not name.startswith(("NUV_", "ASAN_", "MEMPOOL_"))}
    command = [tool, "check"] + (["--with", checker] if checker else []) + [host, *args]
    run = subprocess.run(command, env={**environment, **variables}, stdout=subprocess.PIPE,
                         stderr=subprocess.PIPE, text=True, errors="replace", timeout=120, check=False)
    expect(run.returncode != 99 or run.stdout.endswith("all"), f"{args} is flushed", run.stdout)
    first, *rest = re.split(r"^== (.*)\n", run.stderr, flags=re.MULTILINE)
    return run.returncode, {"": first, **dict(zip(rest[::2], rest[1::2]))}


def expect(holds, what, told):
    if not holds:
        failures.append(f"{what}\n{told}")


def tells(fault, kind):
    """What the library tells of a fault. A block of the layer's is 4 bytes larger, and lies 4 bytes
    behind its record's header, unless it is a heap record."""
    moved = 4 if kind == "heap" else 0
    damaged = r"pool nodes: bucket 0x\w{16}, record 0x\w{16}: the header is damaged up to "
    return {
        "double free": r"pool nodes: 0x\w{16} is already freed",
        "double free, large": r"pool nodes: 0x\w{16} is already freed",
        "wrong pool": r"pool others: 0x\w{16} is a block of pool nodes",
        "wrong pool, large": r"pool others: 0x\w{16} is a block of pool nodes",
        "inner": rf"pool nodes: 0x\w{{16}} is not a block: it lies {8 + moved} bytes into the block at 0x",
        "underrun 1": damaged + r"1 byte before the data \(guard\)" if kind == "bare" else
                      r"pool nodes: 0x\w{16} is not a block: it lies 4 bytes into",
        "underrun 40": damaged + (r"40 bytes before the data \(next1\)" if kind == "bare" else
                                  r"36 bytes before the data \(prev1\)"),
        "underrun 1, large": r"pool nodes: heap record 0x\w{16}: the header is damaged up to 1 byte"
                             r" before the data \(guard\)",
        "two threads": r"pool nodes: used by two threads at the same time: "
                       r"(?=.*\(main)(?=.*\(worker)\d+ \(\w+\) and \d+ \(\w+\)\n(?![^=]*used by)",
        "leak": rf"pool nodes: 1 block, {13 + moved} bytes never freed",
        "leak, large": "pool nodes: 1 block, 2001 bytes never freed",
        "exit": rf"pool kept: 1 block, {13 + moved} bytes never freed",
    }.get(fault)


# What each checker tells by itself.
found = {"asan": {"read after free": "heap-use-after-free", "write after free": "heap-use-after-free",
                  "use after clear": "heap-use-after-free", "underrun 40": "use-after-poison",
                  "underrun 1, large": "use-after-poison",
                  "overrun 1": "heap-buffer-overflow", "heap record overrun, large": "heap-buffer-overflow",
                  "overrun 40": "heap-buffer-overflow",
                  "overrun 100": "heap-buffer-overflow", "underrun 100": "heap-buffer-overflow"},
         "valgrind": {"read after free": "Invalid read", "write after free": "Invalid write",
                      "use after clear": "Invalid write", "overrun 1": "Invalid write",
                      "heap record overrun, large": "Invalid write",
                      "overrun 40": "Invalid write", "overrun 100": "Invalid write",
                      "underrun 100": "Invalid write"},
         "nothing": {}}
# Ordinary memory that is written beyond a block's bucket is the heap's own.
all_faults = ["none", "none, large", "double free", "double free, large", "wrong pool",
              "wrong pool, large", "inner", "underrun 1", "underrun 1, large", "underrun 40", "leak",
              "leak, large", "leak at exit", "two threads", "threads in turns"]
faults = {checker: list(dict.fromkeys([*found[checker], *all_faults])) for checker in found}

for checker, host in {"nothing": plain, "asan": sanitized, "valgrind": plain}.items():
    if checker == "valgrind" and has_valgrind != "yes":
        continue
    for kind in ("bare", "heap"):
        status, sections = check(checker, host, kind, *faults[checker], ASAN_OPTIONS="halt_on_error=0")
        expect(status == 99, f"{checker} {kind}: {status}", sections)
        expect(set(faults[checker]) <= set(sections), f"{checker} {kind} breaks off", sections)
        for fault, told in sections.items():
            where = f"{checker} {kind}, {fault}:"
            expect("wrong answer" not in told, f"{where} the answer of the pool", told)
            line = tells(fault, kind)
            if line:
                expect(re.search("^mempool: " + line, told, re.MULTILINE), f"{where} {line}", told)
            elif fault:
                expect("mempool: " not in told, f"{where} nothing of the library's", told)
            problem = found[checker].get(fault)
            if problem:
                expect(problem in told, f"{where} {problem}", told)
                at = line_of("at: " + fault.removesuffix(", large"))
                expect(f"Faulty.cpp:{at}" in told, f"{where} the line", told)
            elif checker != "nothing":
                # The layer looks for the tag of a block; a pool looks at nothing that is gone.
                problems = "ERROR: Addr|Invalid write" + ("|Invalid read" if kind == "bare" else "")
                expect(not re.search(problems, told), f"{where} no problem", told)
            if checker != "nothing" and line and fault != "exit":
                mark = fault.removesuffix(", large")
                mark = "release after " + mark if mark.startswith("underrun") else mark
                if not fault.startswith("leak"):
                    expect(f"Faulty.cpp:{line_of('at: ' + mark)}" in told, f"{where} the call", told)
            if checker != "nothing" and (line or problem) and fault != "two threads":
                mark = "at: leak at exit" if fault == "exit" else "// taken here"
                expect(f"Faulty.cpp:{line_of(mark)}" in told, f"{where} where it was taken", told)

# Status, choice of the checker, and what cannot be checked.
for checker, host in (("nothing", plain), ("asan", sanitized), ("valgrind", plain)):
    if checker == "valgrind" and has_valgrind != "yes":
        continue
    for faults_made, status in ((["none"], 0), (["double free"], 99), (["leak at exit"], 99),
                                (["double free", "ends with 3"], 3), (["double free, then a child"], 99)):
        expect(check(checker, host, "bare", *faults_made)[0] == status, f"{checker} {faults_made}", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS="7")[0] == 7, "7", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS="0")[0] == 0, "0", "")
for wrong in ("300", "7 ", ""):
    status, sections = check("nothing", plain, "bare", "double free", MEMPOOL_CHECK_STATUS=wrong)
    expect(status == 99 and f"STATUS={wrong}: not a number from 0 to 255; 99 is used" in sections["exit"],
           f"{wrong}: {status}", sections)
expect(check("asan", "--alignment", "8", sanitized, "bare", "overrun 1")[0] == 0, "alignment", "")
expect(check("asan", sanitized, "bare", "double free", "heap leak",
             ASAN_OPTIONS="exitcode=5")[0] == 5, "the status of LeakSanitizer", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_ABORT="1")[0] == -6, "abort", "")
expect(check("nothing", plain, "bare", "double free", MEMPOOL_ABORT="0")[0] == 99, "no abort", "")
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
