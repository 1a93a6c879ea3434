"""How gdb prints a pool's handle, a pool and an OBR::vector."""

import gdb
import gdb.printing

from . import pools
from .memory import Fault


def summary(address):
    """A pool in one line, as far as it can be read."""
    if address == 0:
        return "no pool"
    pool = pools.Pool(address)
    try:
        name = pool.title
        if not pool.enabled:
            return f'pool "{name}", disabled'
        buckets = list(pool.buckets())
        blocks = sum(bucket.used_recs for bucket in buckets) + pool.numExtRecs
        return f'pool "{name}", {blocks} blocks, {len(buckets)} buckets'
    except Fault as fault:
        return f"damaged pool ({fault})"


class MgrPrinter:
    def __init__(self, value):
        self.value = value

    def to_string(self):
        return summary(int(self.value["bucketMgr"]))


class BucketMgrPrinter:
    """The same line, and the fields from the library's debug information."""

    def __init__(self, value):
        self.value = value

    def to_string(self):
        return "no address" if self.value.address is None else summary(int(self.value.address))

    def children(self):
        for field in self.value.type.fields():
            yield field.name, self.value[field]


class VectorPrinter:
    def __init__(self, value):
        self.value = value
        self.size = int(value["size"])
        self.capacity = int(value["capacity"])

    def to_string(self):
        damage = ", damaged" * (self.size > self.capacity)
        return f"OBR::vector of length {self.size}, capacity {self.capacity}{damage}"

    def children(self):
        for index in range(min(self.size, self.capacity)):
            yield f"[{index}]", self.value["data"][index]

    def display_hint(self):
        return "array"


def register(objfile):
    """Registers the printers for one library, or for all programs if it is None."""
    printers = gdb.printing.RegexpCollectionPrettyPrinter("ObrMemPool")
    printers.add_printer("Mgr", "^OBR::MemPool::Mgr$", MgrPrinter)
    printers.add_printer("BucketMgr", "^OBR::MemPool::BucketMgr$", BucketMgrPrinter)
    printers.add_printer("vector", "^OBR::vector<.*>$", VectorPrinter)
    gdb.printing.register_pretty_printer(objfile, printers, replace=True)
