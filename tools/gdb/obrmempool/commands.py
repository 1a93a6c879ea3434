"""The commands and their help. Importing this defines them."""

import re

import gdb

from . import check, layout, memory, pools, report, whois
from .memory import Fault


def write(lines):
    """Writes the lines, and escapes characters that gdb's character set lacks."""
    text = "".join(lines)
    try:
        gdb.write(text)
    except UnicodeEncodeError:
        gdb.write(text.encode("ascii", "backslashreplace").decode("ascii"))


def pool_named(text):
    """The pool whose name is this text, or else the text without its quotes."""
    name = text.strip()
    found, fault = pools.all_pools()
    for candidate in (name, " ".join(gdb.string_to_argv(text))):
        for pool in found:
            if pool.title == candidate:
                return pool
    if fault is not None:
        raise gdb.GdbError(f"Pool {name} is not found, but not all pools are known: {fault}")
    raise gdb.GdbError(f"There is no pool {name}. \"info mempools\" lists them.")


class PoolCommand(gdb.Command):
    """A command whose first argument is the name of a pool."""

    def complete(self, text, word):
        try:
            names = [pool.title for pool in pools.all_pools()[0]]
        except gdb.GdbError:
            return []
        return [name for name in names if name.startswith(word)]


class InfoMempools(gdb.Command):
    """List the memory pools of libObrMemPool.
Usage: info mempools

Blocks and bytes are those in use, with the pool's rounding. Held are the bytes that the
pool has from the heap for buckets and heap records. Blocks of a disabled pool are the heap's own and
are not counted."""

    def __init__(self):
        super().__init__("info mempools", gdb.COMMAND_STATUS)

    def invoke(self, text, from_tty):
        if text:
            raise gdb.GdbError("Usage: info mempools")
        found, fault = pools.all_pools()
        if not found and fault is None:
            write("No pools.\n")
            return
        write(f"{'Blocks':>10} {'Bytes':>14} {'Buckets':>8} {'Held':>14}  Enabled  "
              f"{'Pool':18}  Name\n")
        for pool in found:
            write(self.row(pool) + f"  {pool.address:#018x}  {pool.title}\n")
        if fault is not None:
            write(f"Not all pools are known: {fault}\n")

    @staticmethod
    def row(pool):
        try:
            buckets = list(pool.buckets())
            ext_recs = pool.ext_rec_list
            enabled = "yes" if pool.enabled else "no"
        except Fault:
            return f"{'damaged: see mempool check':>57}"
        used = sum(bucket.used_recs for bucket in buckets)
        used_bytes = sum(bucket.used_recs * bucket.data_size for bucket in buckets)
        ext_bytes = sum(ext_rec.length for ext_rec in ext_recs)
        held = (sum(bucket.end - bucket.address for bucket in buckets)
                + ext_bytes + layout.EXT_REC.size * len(ext_recs))
        return (f"{used + len(ext_recs):10} {used_bytes + ext_bytes:14} {len(buckets):8} "
                f"{held:14}  {enabled:7}")


class Mempool(gdb.Command):
    """Look into the memory pools of libObrMemPool, in a program or a core, without running any code."""

    def __init__(self):
        super().__init__("mempool", gdb.COMMAND_DATA, prefix=True)


class MempoolReport(PoolCommand):
    """Print the report of a pool, as its Dbg does.
Usage: mempool report NAME [detailed]

"detailed" adds every bucket and record, as DbgDetailed does. Quote a name that ends in "detailed"."""

    def __init__(self):
        super().__init__("mempool report", gdb.COMMAND_DATA)

    def invoke(self, text, from_tty):
        words = gdb.string_to_argv(text)
        if not words:
            raise gdb.GdbError("Usage: mempool report NAME [detailed]")
        detailed = len(words) > 1 and re.search(r"\sdetailed\s*$", text) is not None
        pool = pool_named(re.sub(r"\sdetailed\s*$", "", text) if detailed else text)
        pieces = []
        try:
            for piece in report.report(pool, detailed):
                pieces.append(piece)
        except Fault as fault:
            raise gdb.GdbError(f"The report of {pool.title} ends: {fault}") from None
        finally:
            write(pieces)


class MempoolWhois(gdb.Command):
    """Show the pool, bucket and record that contain an address, used or free, and the neighbours.
Usage: mempool whois EXPRESSION

EXPRESSION is a pointer, a number, or an object in memory, whose address is used. It cannot call
functions of the program."""

    def __init__(self):
        super().__init__("mempool whois", gdb.COMMAND_DATA, gdb.COMPLETE_EXPRESSION)

    def invoke(self, text, from_tty):
        if not text.strip():
            raise gdb.GdbError("Usage: mempool whois EXPRESSION")
        write(line + "\n" for line in whois.whois(self.address(text)))

    @staticmethod
    def address(text):
        with gdb.with_parameter("may-call-functions", False):
            try:
                value = gdb.parse_and_eval(text)
                kind = value.type.strip_typedefs().code
                if kind in (gdb.TYPE_CODE_REF, gdb.TYPE_CODE_RVALUE_REF):
                    value = value.referenced_value()
                    kind = value.type.strip_typedefs().code
                if kind in (gdb.TYPE_CODE_STRUCT, gdb.TYPE_CODE_UNION, gdb.TYPE_CODE_ARRAY):
                    value = value.address
                return int(value) % 2**64
            except (gdb.error, TypeError, ValueError) as error:
                raise gdb.GdbError(f"{text}: {error}") from None


class MempoolCheck(PoolCommand):
    """Check every invariant of the memory of a pool, or of all pools and the registry.
Usage: mempool check [NAME]

The first broken one is reported with its address."""

    def __init__(self):
        super().__init__("mempool check", gdb.COMMAND_DATA)

    def invoke(self, text, from_tty):
        found = [pool_named(text)] if text.strip() else pools.all_pools()[0]
        for address in memory.registry_addresses():
            try:
                check.check_registry(pools.Registry(address))
            except Fault as fault:
                write(f"{fault}\n")
        for pool in found:
            try:
                write(f"pool {pool.title}: sound, {check.check_pool(pool)}\n")
            except Fault as fault:
                write(f"pool {pool.title}: {fault}\n")


for command in (InfoMempools, Mempool, MempoolReport, MempoolWhois, MempoolCheck):
    command()
