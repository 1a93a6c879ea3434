"""Run by gdb on GdbHost: what the commands tell, beside what the library and the host know.

The library's own report is called for; the commands themselves call nothing. Damage is written into
the live host and taken back. Environment: HOST; TEST_DIR to write into; STRIP and LIBRARY for a copy
of the library without symbols. Where gdb cannot run programs the test is skipped.
"""

import os
import pathlib
import re
import struct
import subprocess
import time
import traceback
import unittest

import gdb

TEST_DIR = pathlib.Path(os.environ["TEST_DIR"])
LETTERS = "fifteen letters"


def run(command):
    return gdb.execute(command, to_string=True)


def evaluate(expression):
    return int(gdb.parse_and_eval(expression))


def own_report(name, detailed):
    path = TEST_DIR / "report.txt"
    gdb.parse_and_eval(f'Report("{name}", {int(detailed)}, "{path}")')
    return path.read_text()


class Poke:
    """Bytes of the host that are other ones for a while."""

    def __init__(self, address, data):
        self.address, self.data = address, data
        self.before = bytes(gdb.selected_inferior().read_memory(address, len(data)))

    def __enter__(self):
        gdb.selected_inferior().write_memory(self.address, self.data)

    def __exit__(self, *_):
        gdb.selected_inferior().write_memory(self.address, self.before)


class LiveHost(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        run("break Ready")
        run("run")
        run("up")
        run("set print address on")

        # Loaded by itself with the library.
        from obrmempool import layout, pools
        cls.layout = layout
        cls.pools = {pool.title: pool for pool in pools.all_pools()[0]}

    def fresh(self, name):
        return type(self.pools[name])(self.pools[name].address)

    def field(self, thing, name):
        """Where a field stands, and its code."""
        return next((thing.address + offset, code)
                    for field, offset, code in thing.form.fields if field == name)

    def poke(self, thing, name, value):
        address, code = self.field(thing, name)
        return Poke(address, struct.pack("<" + code, value))

    def told(self, command):
        """What a command writes, or says in place of it."""
        try:
            return run(command)
        except gdb.error as error:
            self.assertNotIn("Error occurred in Python", str(error))
            return str(error)

    def test_the_layout_is_that_of_the_library(self):
        for form in (self.layout.POOL, self.layout.GROUP, self.layout.BUCKET, self.layout.EXT_REC,
                     self.layout.REC_HDR):
            cxx_type = gdb.lookup_type(form.cxx_name)
            fields = {(field.name, field.bitpos // 8, field.type.sizeof)
                      for field in cxx_type.fields() if hasattr(field, "bitpos")}
            self.assertEqual(fields, {(name, offset, struct.calcsize("<" + code))
                                      for name, offset, code in form.fields})
            self.assertEqual(cxx_type.sizeof, form.size)

    def test_lists_the_pools(self):
        text = run("info mempools")
        rows = {line[66:].split("  ", 1)[1]: line.split() for line in text.splitlines()[1:]}
        self.assertEqual(list(rows), sorted(self.pools, key=os.fsencode))
        self.assertEqual(rows[LETTERS][:5], ["12", str(8 * 12 + 20 + 2038), "4",
                                             str(4 * 96 + 2038 + 3 * 24), "yes"])
        self.assertEqual(rows["off"][:5], ["0", "0", "0", "0", "no"])
        self.assertIn(f"{self.pools['off'].address:#018x}", rows["off"])

    def test_reports_to_the_character(self):
        for name in self.pools.keys() - {"left"}:  # It has no handle that could report it.
            for words in ("", " detailed"):
                self.assertEqual(run(f'mempool report "{name}"{words}'),
                                 own_report(name, words != ""))
        self.assertEqual(run("mempool report fifteen letters detailed"), own_report(LETTERS, True))
        self.assertRegex(self.told("mempool report"), "^Usage: mempool report NAME")
        self.assertRegex(self.told("mempool report four short"), "^There is no pool four short")

    def whois(self, expression):
        return run("mempool whois " + expression)

    def test_tells_what_an_address_is(self):
        pool = self.pools[LETTERS]
        bucket = next(pool.buckets())
        head = (f"   Pool    : {LETTERS}, {pool.address:#018x}\n"
                f"   Bucket  : 1, {bucket.address:#018x}, group 2, 2 of 3 records used, 16 bytes each\n")
        records = [f"record {number + 1}, {bucket.recs_base + offset:#018x}, offset {offset}, {state}"
                   for number, (offset, state) in enumerate(
                       ((2, "USED"), (18, "FREE, 1 on the free list"), (34, "USED")))]
        block = evaluate("(long) blocks[7]")
        middle = (head + f"   Record  : {records[1]}\n   Block   : {block:#018x}, 12 bytes\n"
                  f"   Ahead   : {records[0]}\n   Behind  : {records[2]}\n")
        for offset, place in ((0, "is the block of"), (11, "lies 11 bytes into the block of"),
                              (-1, "lies 3 bytes into the header of")):
            self.assertEqual(self.whois(f"(char*) blocks[7] + {offset}"),
                             f"{block + offset:#018x} {place} a free record.\n" + middle)
        text = self.whois("blocks[6]")
        self.assertIn("is the block of a used record.\n" + head + f"   Record  : {records[0]}\n", text)
        self.assertIn(f"   Ahead   : the bucket's header, {bucket.address:#018x}\n", text)
        self.assertRegex(self.whois("blocks[8]"), r"Behind  : \d+ bytes? ahead of .* at 0x")
        self.assertIn(f"lies 46 bytes into a bucket's header.\n{head}",
                      self.whois(str(bucket.recs_base)))

        ext_block = evaluate("(long) extBlocks[1]")
        text = self.whois("((char*) extBlocks[1] + 36)")
        self.assertIn(f"{ext_block + 36:#018x} lies 36 bytes into the block of a heap record.\n   Pool    "
                      f": {LETTERS}, {pool.address:#018x}\n   Record  : heap record 2 of 3, "
                      f"{ext_block - 24:#018x}, EXT\n   Block   : {ext_block:#018x}, 37 bytes\n", text)
        text = self.whois("extBlocks[0]")
        self.assertRegex(text, "(?s)lies 0 bytes into the pool's handle.\n   Pool    : in a block, .*"
                         "is the block of a heap record.\n   Pool    : " + LETTERS)
        self.assertIn("lies 8 bytes into the block of a heap", self.whois("(char*) extBlocks[0] + 8"))
        self.assertIn(f"lies 8 bytes into the pool itself.\n   Pool    : {LETTERS}",
                      self.whois(str(pool.address + 8)))
        self.assertIn("lies 0 bytes into the pool's handle.\n   Pool    : off", self.whois("off"))
        text = self.whois("16")
        count, start = re.fullmatch(r"""0x0000000000000010 lies in no pool's memory.
   Behind  : (\d+) bytes ahead of .* at (0x\w+), pool .*
   Unknown .*\n""", text).groups()
        self.assertEqual(16 + int(count), int(start, 16))
        count, start = re.search(r"Ahead   : (\d+) bytes behind the end of the pool's handle at (0x\w+)",
                                 self.whois("-1")).groups()
        self.assertEqual(int(start, 16) + 8 + int(count), 2**64 - 1)
        self.assertIn("the blocks of disabled pools (off) are the heap's own", text)
        with self.assertRaisesRegex(gdb.error, "may-call-functions is off"):
            self.whois("letters.Alloc(12)")

        with self.poke(bucket, "freeHead", 0):
            self.assertIn("FREE, but not found on the free list", self.whois("blocks[7]"))
        with Poke(block - 12 - 8, b"\3\0"):
            self.assertIn("offset 2, USED, but its own offset reads 3", self.whois("blocks[6]"))
        with self.poke(bucket, "parent", 8):
            text = self.whois("blocks[6]")
            self.assertIn("lies in no pool's memory", text)
            self.assertIn(f"   Damaged : pool {LETTERS}: bucket at {bucket.address:#018x}", text)


class NextHost(unittest.TestCase):
    """In the order of their names, from where the host stood before."""

    def test_1_is_quick_with_100000_blocks(self):
        run("continue")
        run("up")
        texts = {detailed: own_report("many", detailed) for detailed in (False, True)}
        begin = time.process_time()
        self.assertRegex(run("info mempools"), r"\n    100000        1200000      800 .* many\n")
        self.assertEqual(run("mempool report many"), texts[False])
        self.assertEqual(run("mempool report many detailed"), texts[True])
        self.assertIn("is the block of a used record", run("mempool whois text"))
        self.assertLess(time.process_time() - begin, 5)

    def test_2_a_core_of_a_crash_is_read_like_the_program(self):
        run("continue")
        if gdb.selected_inferior().pid == 0:
            self.skipTest("a build with checks has ended the host")
        self.assertEqual(evaluate("$_siginfo.si_signo"), 11)
        live = run("mempool report overrun detailed")
        run(f"generate-core-file {TEST_DIR / 'core'}")
        run("kill")
        run(f"core-file {TEST_DIR / 'core'}")
        self.assertEqual(run("mempool report overrun detailed"), live)
        run("core-file")

    def test_3_without_symbols_it_says_so(self):
        library = pathlib.Path(os.environ["LIBRARY"])
        stripped = TEST_DIR / "stripped"
        stripped.mkdir(exist_ok=True)
        subprocess.run([os.environ["STRIP"], "--strip-all", "-o", stripped / library.name,
                        library], check=True)
        with self.assertRaisesRegex(gdb.error, "^There is no program"):
            run("info mempools")
        run(f"set environment LD_LIBRARY_PATH {stripped}")
        run("run")
        with self.assertRaisesRegex(gdb.error, "neither\ndebug information nor a symbol table"):
            run("info mempools")
        run("kill")


def main():
    """The exit status."""
    gdb.execute("set confirm off")
    try:
        gdb.execute("file /bin/true")
        gdb.execute("starti")
        gdb.execute("kill")
    except gdb.error as error:
        print(f"SKIPPED: gdb cannot run a program here ({error})")
        return 77
    gdb.execute(f"file {os.environ['HOST']}")
    result = unittest.main(argv=["GdbTest"], exit=False, verbosity=2).result
    return int(not result.wasSuccessful())


try:
    status = main()
except Exception:  # gdb itself would call this a success.
    traceback.print_exc()
    status = 1
gdb.execute(f"quit {status}")
