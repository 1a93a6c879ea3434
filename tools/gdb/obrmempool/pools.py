"""The library's objects in the program's memory, and the walks through them.

An object reads its bytes when they are first used, and keeps them: it lives for one command. A walk
ends in a Fault if a link leads to memory that cannot be read, or runs in a circle.
"""

import struct
from functools import cached_property

from . import layout, memory
from .memory import Fault


class Structure:
    """A struct at an address, with its fields."""

    form = None
    what = None

    def __init__(self, address):
        self.address = address

    @cached_property
    def row(self):
        return memory.read_row(self.form, self.address, self.what)

    def __getattr__(self, field):
        if field.startswith("_"):
            raise AttributeError(field)
        return getattr(self.row, field)

    @property
    def end(self):
        return self.address + self.form.size


def follow(front, kind, link, what):
    """The nodes of a list of that kind, from the front."""
    seen = set()
    address = front
    while address != 0:
        if address in seen:
            raise Fault(f"{what} runs in a circle: {address:#018x} comes a second time", address)
        seen.add(address)
        node = kind(address)
        address = getattr(node, link)
        yield node


class Bucket(Structure):
    form = layout.BUCKET
    what = "bucket"

    @property
    def total_recs(self):
        if self.recSize == 0 or self.size < layout.FIRST_OFFSET:
            return 0
        return (self.size - layout.FIRST_OFFSET) // self.recSize

    @property
    def used_recs(self):
        return self.total_recs - self.numFree

    @property
    def data_size(self):
        return (self.recSize - layout.REC_HDR.size) % 2**32

    @property
    def recs_base(self):
        return self.address + layout.BASE_DISTANCE

    @property
    def end(self):
        return self.recs_base + max(self.size, layout.FIRST_OFFSET)

    def records(self):
        """Its records, with their bytes, which are read now."""
        return Records(self, memory.read(self.recs_base, self.size, "the records of a bucket"))


class Records:
    """The bytes of a bucket from recsBase on. The last record may be incomplete if its header is whole;
    only the guard may be missing. A header outside of these bytes has an unknown type and no link."""

    def __init__(self, bucket, data):
        self.bucket = bucket
        self.data = data
        self.base = bucket.recs_base
        self.size = len(data)
        self.rec_size = bucket.recSize

    def has_header_at(self, offset):
        return offset + 3 <= self.size

    def has_record_at(self, offset):
        return (offset >= layout.FIRST_OFFSET and self.rec_size != 0
                and (offset - layout.FIRST_OFFSET) % self.rec_size == 0
                and self.has_header_at(offset))

    def type_at(self, offset):
        return self.data[offset + 2] if self.has_header_at(offset) else layout.TYPE_UNKNOWN

    def link_at(self, offset):
        return struct.unpack_from("<H", self.data, offset)[0] if self.has_header_at(offset) else 0

    def offsets(self):
        """The offsets of all records, in the order of memory. There is always at least one."""
        if self.rec_size == 0:
            return [layout.FIRST_OFFSET]
        return range(layout.FIRST_OFFSET, max(self.size, layout.FIRST_OFFSET + 1), self.rec_size)

    def count_used(self):
        """The number of records whose type is USED."""
        first_type = layout.FIRST_OFFSET + 2
        return self.data[first_type::self.rec_size or max(self.size, 1)].count(layout.TYPE_USED)

    def free_list(self):
        """The offsets on the free list. The last one may not be that of a record, or may be a repetition:
        the caller decides what that means."""
        seen = set()
        offset = self.bucket.freeHead
        while offset != 0:
            yield offset
            if offset in seen or not self.has_record_at(offset):
                return
            seen.add(offset)
            offset = self.link_at(offset)


class Group(Structure):
    form = layout.GROUP

    def __init__(self, address, index):
        super().__init__(address)
        self.index = index
        self.what = f"group {index}"

    def walk(self):
        """All buckets, one by one."""
        return follow(self.head, Bucket, "next1", f"{self.what}: the list of its buckets")

    def walk_free(self):
        """The buckets on the free-bucket list."""
        return follow(self.freeBuckets, Bucket, "next2", f"{self.what}: its free-bucket list")

    @cached_property
    def buckets(self):
        return list(self.walk())

    @cached_property
    def free_buckets(self):
        return list(self.walk_free())


class ExtRec(Structure):
    form = layout.EXT_REC
    what = "heap record"

    @property
    def data(self):
        return self.address + self.form.size

    @property
    def end(self):
        return self.data + self.length


class Pool(Structure):
    form = layout.POOL
    what = "pool"

    def __init__(self, address, registry=None, registered_name=None):
        super().__init__(address)
        self.registry = registry
        self.registered_name = registered_name

    @cached_property
    def own_name(self):
        return memory.read_string(self.row.name, "the pool's name")

    @property
    def title(self):
        """The name in the registry, or its own if it was not found there."""
        name = self.own_name if self.registered_name is None else self.registered_name
        return memory.name_text(name)

    @cached_property
    def groups(self):
        if self.numGroups > layout.MAX_BUCKET_SIZE:  # No settings give so many.
            raise Fault(f"{self.numGroups} places for groups", self.address)
        addresses = struct.unpack(f"<{self.numGroups}Q", memory.read(
            self.row.groups, 8 * self.numGroups, "the table of groups"))
        return [Group(address, index) for index, address in enumerate(addresses) if address != 0]

    def buckets(self):
        for group in self.groups:
            yield from group.buckets

    def walk_ext_recs(self):
        return follow(self.extRecs, ExtRec, "next", "the list of heap records")

    @cached_property
    def ext_rec_list(self):
        return list(self.walk_ext_recs())


class Registry(Structure):
    form = layout.REGISTRY
    what = "registry"

    def nodes(self):
        """The nodes of the tree in the order of the pools' names, each with its address."""
        above = []
        address, parent = self.root, self.address + layout.TREE_END
        while address != 0 or above:
            while address != 0:
                node = memory.read_row(layout.NODE, address, "a node of the registry's tree")
                if node.parent != parent:  # A circle ends here too: no node has two parents.
                    raise Fault(f"a node of the registry's tree at {address:#018x}: its parent is "
                                f"{node.parent:#018x}, not {parent:#018x}", address)
                above.append((address, node))
                address, parent = node.left, address
            parent, node = above.pop()
            yield parent, node
            address = node.right

    def pools(self):
        for _, node in self.nodes():
            yield Pool(node.pool, self, memory.read_string(node.name, "a name in the registry"))

    @cached_property
    def sharers(self):
        """The handles that were assigned to. Only they can have a pool that they did not build."""
        size = self.row.sharersEnd - self.row.sharers
        if size % 8 != 0 or not 0 <= size < 2**32:
            raise Fault(f"the registry at {self.address:#018x}: its list of handles has no valid end",
                        self.address)
        return struct.unpack(f"<{size // 8}Q",
                             memory.read(self.row.sharers, size, "the registry's handles"))


def all_pools():
    """All pools in the registries, and the Fault that ended the walk, or None."""
    pools = []
    try:
        for registry in memory.registry_addresses():
            pools.extend(Registry(registry).pools())
    except Fault as fault:
        return pools, fault
    return pools, None
