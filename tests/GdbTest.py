"""Run by gdb on GdbHost: compares what the commands print with what the library and the host know.

The host is asked for the library's own report; nothing is called. Damage is written into the live
host and taken back. Environment: HOST; CRASH_SIGNAL, which ends it, empty under sanitizers; TEST_DIR
to write into; STRIP and LIBRARY for a copy of the library without symbols; CHECKED, the folder of the
checked library. The test is skipped where gdb cannot run programs.
"""

import itertools
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
    inferior = gdb.selected_inferior()
    for variable, value in (("askedName", os.fsencode(name) + b"\0"),
                            ("askedPath", os.fsencode(path) + b"\0"),
                            ("askedDetailed", bytes([detailed])), ("asked", b"\1")):
        inferior.write_memory(evaluate(f"(long) &{variable}"), value)
    go_on()
    return path.read_text()


def go_on():
    """To the next stop of the host, in its main."""
    run("continue")
    run("up")


class Poke:
    """Replaces bytes of the host for a while."""

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
        """The address of a field, and its code."""
        return next((thing.address + offset, code)
                    for field, offset, code in thing.form.fields if field == name)

    def poke(self, thing, name, value):
        address, code = self.field(thing, name)
        return Poke(address, struct.pack("<" + code, value))

    def printed(self, command):
        """What a command prints, its error included."""
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

    def test_rounds_as_the_library_does(self):
        for index, sizes in enumerate(((0, 4), (1, 4), (8, 4), (10, 3))):
            self.assertEqual(self.layout.round_up(*sizes), evaluate(f"roundedUp[{index}]"))

    def test_lists_the_pools(self):
        text = run("info mempools")
        rows = {line[66:].split("  ", 1)[1]: line.split() for line in text.splitlines()[1:]}
        self.assertEqual(list(rows), sorted(self.pools, key=os.fsencode))
        self.assertEqual(rows[LETTERS][:5], ["12", str(8 * 12 + 20 + 2038), "4",
                                             str(4 * 96 + 2038 + 3 * 24), "yes"])
        self.assertEqual(rows["off"][:5], ["0", "0", "0", "0", "no"])
        self.assertIn(f"{self.pools['off'].address:#018x}", rows["off"])
        with gdb.with_parameter("language", "pascal"):
            self.assertEqual(run("info mempools"), text)
        with Poke(self.pools["off"].registry.first + 8, bytes(8)):  # The first node's way up.
            self.assertRegex(run("info mempools"), "\nNot all pools are known: a node of the")
            self.assertIn("but not all pools are known", self.printed("mempool report off"))
        self.assertEqual(self.printed("info mempools off"), "Usage: info mempools")

    def test_reports_to_the_character(self):
        for name in self.pools.keys() - {"left"}:  # It has no handle that could report it.
            for words in ("", " detailed"):
                report = own_report(name, words != "")
                self.assertEqual(run(f"mempool report {name}{words}"), report)
                if not set(name) & set("\"'\\"):
                    self.assertEqual(run(f'mempool report "{name}"{words}'), report)
            self.assertRegex(run(f"mempool check {name} "), "^pool " + re.escape(name))
        self.assertEqual(run("mempool report fifteen letters detailed"), own_report(LETTERS, True))
        self.assertRegex(self.printed("mempool report"), "^Usage: mempool report NAME")
        self.assertRegex(self.printed("mempool report four short"), "^There is no pool four short")

    # What may befall a bucket of three records, at the offsets 2, 18 and 34, the first in use.
    def test_reports_and_checks_a_damaged_bucket(self):
        bucket = next(self.pools["three"].buckets())
        base = bucket.recs_base
        at = f"bucket at {bucket.address:#018x}"

        def record(number):
            offset = 16 * number - 14
            return f"{at}, record {number} at {base + offset:#018x}, offset {offset}"
        link = f"{record(3)}: the link of this free record "
        other = "which is not the offset of a record"
        for offset, code, value, fault in (
                (34, "H", 18, link + "leads back to offset 18: the free list runs in a circle"),
                (34, "H", 34, link + "leads back to offset 34: the free list runs in a circle"),
                (34, "H", 2, link + "leads to offset 2, a used record"),
                (34, "H", 50, link + "is 50, " + other),
                (34, "H", 19, link + "is 19, " + other),
                (34, "H", 1, link + "is 1, " + other),
                (-2, "H", 65522, f"{at}: freeHead is 65522, {other}"),
                (-2, "H", 17, f"{at}: freeHead is 17, {other}"),
                (-2, "H", 2, f"{at}: freeHead leads to offset 2, a used record"),
                (-2, "H", 0, f"{record(2)}: FREE, but not on the free list"),
                (18, "H", 0, f"{record(3)}: FREE, but not on the free list"),
                (0, "H", 9, f"{at}: 9 free records of 3"),
                (0, "H", 3, f"{at}: no record is in use, but it was not released"),
                (0, "H", 1, f"{at}: it counts 1 free records and lists 2"),
                (36, "B", 2, f"{record(3)}: its type is 0x02, neither FREE nor USED"),
                (20, "B", 7, f"{record(2)}: its type is 0x07, neither FREE nor USED"),
                (2, "H", 18, f"{record(1)}: USED, but its own offset is 18"),
                (-6, "H", 49, f"{at}: a size of 49, not 50"),
                (-6, "H", 37, f"{at}: a size of 37, not 50"),
                (-6, "H", 36, f"{at}: a size of 36, not 50"),
                (-6, "HH", (1, 1), f"{at}: a record size of 1, not 16"),
                (-6, "HHH", (47, 15, 1), f"{at}: a record size of 15, not 16"),
                (-4, "H", 0, f"{at}: a record size of 0, not 16")):
            values = value if isinstance(value, tuple) else (value,)
            with Poke(base + offset, struct.pack("<" + code, *values)):
                self.assertEqual(run("mempool check three"), f"pool three: {fault}\n")
                text = run("mempool report three detailed")
                self.assertEqual(text, own_report("three", True), fault)

    def test_checks_every_field(self):
        pool = self.pools[LETTERS]
        node = next(address for address, node in pool.registry.nodes() if node.pool == pool.address)
        group = pool.groups[0]
        free, full = group.buckets[:2]
        for form, address, unchecked in (
                (self.layout.REGISTRY, pool.registry.address, ()),
                (self.layout.NODE, node, ()),
                (self.layout.POOL, pool.address, ()),
                (self.layout.STRING, pool.address, ()),
                (self.layout.GROUP, group.address, ()),
                (self.layout.BUCKET, free.address, ()),
                (self.layout.BUCKET, full.address, ("next2",)),
                (self.layout.EXT_REC, pool.ext_rec_list[1].address, ()),
                (self.layout.REC_HDR, free.recs_base + 2, ("guard",)),
                (self.layout.REC_HDR, free.recs_base + 18, ("guard",))):
            for field, offset, _ in form.fields:
                if form is self.layout.EXT_REC and field == "length":
                    continue  # Most lengths can be.
                byte, = gdb.selected_inferior().read_memory(address + offset, 1)
                with Poke(address + offset, bytes([byte[0] ^ 0x80])):
                    text = self.printed(f'mempool check "{LETTERS}"')
                    self.assertEqual(text.startswith("pool fifteen letters: sound, "),
                                     field in unchecked, (form.cxx_name, field, text))
                    self.printed(f'mempool report "{LETTERS}" detailed')

    def test_checks_the_lists_and_totals(self):
        pool = self.fresh(LETTERS)
        group = pool.groups[0]
        first, second, last = group.buckets
        ext_recs = pool.ext_rec_list
        lower, higher = min(itertools.permutations(ext_recs, 2),
                            key=lambda pair: (pair[1].address - pair[0].address) % 2**64)
        wild = "bucket at 0x0000000000000010: cannot be read"
        name = f"group {group.index} at {group.address:#018x}"
        for thing, field, value, fault in (
                (first, "next1", 0x10, wild),
                (last, "next1", first.address, f"group {group.index}: the list of its buckets runs in "
                 f"a circle: {first.address:#018x} comes a second time"),
                (group, "freeBuckets", 0x10, wild),
                (group, "freeBuckets", 0, f"bucket at {first.address:#018x}: 1 free records, but not "
                 "on the free-bucket list"),
                (group, "numBuckets", 4, f"{name}: it counts 4 buckets and has 3"),
                (group, "numFreeBuckets", 2,
                 f"{name}: it counts 2 buckets with a free record and lists 1"),
                (second, "prev2", first.address,
                 f"bucket at {second.address:#018x}: full, but prev2 is not null"),
                (ext_recs[1], "hdr", b"\xAA\xBB\2\0", "heap record at "
                 f"{ext_recs[1].address:#018x}: its header is aa bb 02 00, not aa bb 02 cc"),
                (pool, "numExtRecs", 4, f"pool at {pool.address:#018x}: it counts 4 heap records "
                 "and has 3"),
                (ext_recs[1], "length", 36,
                 f"heap record at {ext_recs[1].address:#018x}: a length of 36 bytes"),
                (ext_recs[1], "length", 2**30, ": a length of 1073741824 bytes"),
                # A sanitizer has that much memory.
                (ext_recs[1], "length", 2**30 - 1 if os.environ["CRASH_SIGNAL"] else 2**30,
                 ": cannot be read" if os.environ["CRASH_SIGNAL"] else " bytes"),
                (lower, "length", higher.address - lower.address,
                 f"it begins inside the heap record at {lower.address:#018x}")):
            with self.poke(thing, field, value):
                self.assertTrue(run(f'mempool check "{LETTERS}"').endswith(fault + "\n"), fault)

        # A group inside a heap record, and a heap record whose block begins with the pool.
        inside = evaluate("(long) extBlocks[2]")
        forged = self.layout.GROUP.form.pack(pool.address, 0, 0, 0, 0, 0, 4, 50, 6, 0)
        with Poke(inside, forged), Poke(pool.row.groups, struct.pack("<Q", inside)):
            self.assertIn(f"group 0 at {inside:#018x}: it begins inside the heap record at ",
                          run(f'mempool check "{LETTERS}"'))
        before = pool.address - self.layout.EXT_REC.size
        forged = self.layout.EXT_REC.form.pack(0, 0, 37, self.layout.EXT_HDR)
        with Poke(before, forged), self.poke(pool, "extRecs", before), self.poke(pool, "numExtRecs", 1):
            self.assertIn(f"pool at {pool.address:#018x}: it begins inside the heap record at ",
                          run(f'mempool check "{LETTERS}"'))

        for offset, byte, fault in ((15, b"x", "no end after its 15 bytes"),
                                    (0, b"\xFF", r"its name is \xffifteen letters")):
            with Poke(pool.address + 16 + offset, byte):  # The string holds its text itself.
                self.assertTrue(run(f'mempool check "{LETTERS}"').endswith(fault + "\n"), fault)

    def test_states_the_rules_in_the_words_of_the_library(self):
        for field, value, problem in (("bucketSize", 43, "tooLarge"), ("minRecordSize", 44, "tooSmall")):
            with self.poke(self.pools["three"], field, value):
                text = gdb.parse_and_eval(f"{problem}._M_dataplus._M_p").string()
                self.assertTrue(run("mempool check three").endswith(f": {text}\n"), text)

    def test_checks_all_pools(self):
        lines = run("mempool check").splitlines()
        self.assertEqual([line.split(": sound, ")[0] for line in lines],
                         [f"pool {name}" for name in self.pools])
        with self.poke(self.pools["off"], "bucketSize", 0):
            self.assertEqual(len(run("mempool check").splitlines()), len(lines))
        self.assertEqual(lines[list(self.pools).index(LETTERS)], f"pool {LETTERS}: sound, 9 used and "
                         "2 free records in 4 buckets, 3 heap records")

    def whois(self, expression):
        return run("mempool whois " + expression)

    def test_describes_an_address(self):
        pool = self.pools[LETTERS]
        bucket = next(pool.buckets())
        head = (f"   Pool    : {LETTERS}, {pool.address:#018x}\n"
                f"   Bucket  : 1, {bucket.address:#018x}, group 2, 2 of 3 records used, 16 bytes each\n")
        records = [f"record {number + 1}, {bucket.recs_base + offset:#018x}, offset {offset}, {state}"
                   for number, (offset, state) in enumerate(
                       ((2, "USED"), (18, "FREE, 1 on the free list"), (34, "USED")))]
        block = evaluate("(long) blocks[7]")
        middle = (head + f"   Record  : {records[1]}\n   Block   : {block:#018x}, 12 bytes\n"
                  f"   Before  : {records[0]}\n   After   : {records[2]}\n")
        for offset, place in ((0, "is the block of"), (11, "lies 11 bytes into the block of"),
                              (-1, "lies 3 bytes into the header of")):
            self.assertEqual(self.whois(f"(char*) blocks[7] + {offset}"),
                             f"{block + offset:#018x} {place} a free record.\n" + middle)
        text = self.whois("blocks[6]")
        self.assertIn("is the block of a used record.\n" + head + f"   Record  : {records[0]}\n", text)
        self.assertIn(f"   Before  : the bucket's header, {bucket.address:#018x}\n", text)
        self.assertRegex(self.whois("blocks[8]"), r"After   : \d+ bytes? before .* at 0x")
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
        for offset, count in ((37, "0 bytes"), (38, "1 byte")):
            self.assertIn(f"in no pool's memory.\n   Before  : {count} after the end of heap record 2",
                          self.whois(f"(char*) extBlocks[1] + {offset}"))
        self.assertIn("lies in no pool's memory", self.whois("extBlocks"))
        self.assertIn("into the pool's table of groups", self.whois(str(pool.row.groups + 16)))
        self.assertIn("   Bucket  : 4, ", self.whois(str(list(pool.buckets())[3].recs_base + 6)))
        self.assertIn(f"lies 8 bytes into the pool itself.\n   Pool    : {LETTERS}",
                      self.whois(str(pool.address + 8)))
        self.assertIn("lies 0 bytes into the pool's handle.\n   Pool    : off", self.whois("off"))
        text = self.whois("16")
        count, start = re.fullmatch(r"""0x0000000000000010 lies in no pool's memory.
   After   : (\d+) bytes before .* at (0x\w+), pool .*
   Unknown .*\n""", text).groups()
        self.assertEqual(16 + int(count), int(start, 16))
        count, start = re.search(r"Before  : (\d+) bytes after the end of the pool's handle at (0x\w+)",
                                 self.whois("-1")).groups()
        self.assertEqual(int(start, 16) + 8 + int(count), 2**64 - 1)
        self.assertIn("the blocks of disabled pools (also off, off) are the heap's own", text)
        with self.assertRaisesRegex(gdb.error, "may-call-functions is off"):
            self.whois("letters.Alloc(12)")

        with self.poke(bucket, "freeHead", 0):
            self.assertIn("FREE, but not on the free list", self.whois("blocks[7]"))
        with Poke(block - 12 - 8, b"\3\0"):
            self.assertIn("offset 2, USED, but its own offset is 3", self.whois("blocks[6]"))
        with self.poke(bucket, "parent", 8):
            text = self.whois("blocks[6]")
            self.assertIn("lies in no pool's memory", text)
            self.assertIn(f"   Damaged : pool {LETTERS}: bucket at {bucket.address:#018x}", text)

    def test_prints_values(self):
        self.assertEqual(run("output letters"), f'pool "{LETTERS}", 12 blocks, 4 buckets')
        self.assertEqual(run("output off"), 'pool "off", disabled')
        with Poke(evaluate("(long) &off"), bytes(8)):
            self.assertEqual(run("output off"), "no pool")
        self.assertEqual(run("output numbers"), "OBR::vector of length 3, capacity 4 = {1, 2, 3}")
        text = run(f"output *(OBR::MemPool::BucketMgr*) {self.pools[LETTERS].address}")
        self.assertIn(f'pool "{LETTERS}", 12 blocks, 4 buckets = {{', text)
        self.assertRegex(text, "minRecordSize = 8,")


class NextHost(unittest.TestCase):
    """In the order of their names, from where the host stood before."""

    def test_1_is_quick_with_100000_blocks(self):
        go_on()
        texts = {detailed: own_report("many", detailed) for detailed in (False, True)}
        begin = time.process_time()
        self.assertRegex(run("info mempools"), r"\n    100000        1200000      800 .* many\n")
        self.assertRegex(run("mempool check"), "many: sound, 100000 used and 100000 free records")
        self.assertEqual(run("mempool report many"), texts[False])
        self.assertEqual(run("mempool report many detailed"), texts[True])
        self.assertIn("is the block of a used record", run("mempool whois text"))
        self.assertLess(time.process_time() - begin, 15)

    def test_2_a_core_of_a_crash_is_read_like_the_program(self):
        if not os.environ["CRASH_SIGNAL"]:
            run("kill")
            self.skipTest("a sanitizer's shadow memory, terabytes of it, would be in the core")
        run("continue")
        self.assertEqual(evaluate("$_siginfo.si_signo"), int(os.environ["CRASH_SIGNAL"]))
        live = run("mempool report overrun detailed")
        run(f"generate-core-file {TEST_DIR / 'core'}")
        run("kill")
        run(f"core-file {TEST_DIR / 'core'}")
        self.assertEqual(run("mempool report overrun detailed"), live)
        self.assertRegex(run("mempool check"), "(?m)^pool overrun: bucket at 0x[0-9a-f]+: freeHead "
                         "is 65535, which is not the offset of a record$")
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

    def test_4_buckets_of_one_record_are_sound_in_the_checked_library(self):
        if not os.environ["CHECKED"]:
            self.skipTest("a sanitizer's build has no checked library")
        run(f"set environment LD_LIBRARY_PATH {os.environ['CHECKED']}")
        run("tcatch load ObrMemPool")
        run("run")
        self.assertEqual(run("mempool check"), "")  # All is null before the library's start.
        run("continue")
        lines = run("mempool check").splitlines()
        self.assertEqual([line for line in lines if ": sound, " not in line], [])
        self.assertIn(f"pool {LETTERS}: sound, 9 used and 0 free records in 9 buckets, 3 heap records",
                      lines)
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
