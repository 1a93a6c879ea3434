"""Checks every invariant of the memory format, in the order in which a pool refers to its memory, so
that nothing is followed before it is checked. The first broken invariant raises a Fault.

A list is sound if each link back leads to the previous node, and the list ends.
"""

import struct
from itertools import chain, pairwise

from . import layout, memory
from .memory import Fault


def require(holds, thing, text):
    if not holds:
        raise Fault(f"{thing.what} at {thing.address:#018x}: {text}", thing.address)


def check_registry(registry):
    """The order of the pools by name, the ends of the tree, and the list of handles."""
    for pool, following in pairwise(registry.pools()):
        require(pool.registered_name < following.registered_name, registry,
                f"pool {following.title} is in the wrong place of the tree")
    nodes = [address for address, _ in registry.nodes()] or [registry.address + layout.TREE_END]
    count = len(nodes) if registry.root else 0
    require(registry.count == count, registry,
            f"it counts {registry.count} pools and leads to {count}")
    ends = (registry.first, registry.last)
    is_made = ends != (0, 0) or count > 0  # All of it is null until the library is initialised.
    require(not is_made or ends == (nodes[0], nodes[-1]), registry,
            "the ends of its tree are not its first and last pool")
    for handle in registry.sharers:
        memory.read(handle, 8, "a handle that the registry knows")


def check_pool(pool):
    """Returns what a sound pool holds, in words."""
    require(pool.own_name == pool.registered_name, pool,
            f"its name is {memory.name_text(pool.own_name)}")
    check_settings(pool)
    if pool.mgr != 0 and pool.mgr not in pool.registry.sharers:
        handled, = struct.unpack("<Q", memory.read(pool.mgr, 8, "the pool's handle"))
        require(handled == pool.address, pool, f"its handle leads to {handled:#018x}")
    buckets = []
    for group in pool.groups:
        require(pool.enabled, group, "a disabled pool has no group")
        buckets.extend(check_group(pool, group))
    ext_recs = check_ext_recs(pool)
    check_overlaps(chain([pool], pool.groups, buckets, ext_recs))
    for bucket in buckets:
        check_records(bucket)
    return (f"{sum(bucket.used_recs for bucket in buckets)} used and "
            f"{sum(bucket.numFree for bucket in buckets)} free records in {len(buckets)} buckets, "
            f"{len(ext_recs)} heap records")


def check_settings(pool):
    """The settings, as a pool rounds them, and the values that it derives from them. The two rules for
    record sizes have the same words as PoolSizes::Problem."""
    align, low, high = pool.dataAlignment, pool.minRecordSize, pool.maxRecordSize
    hdr = layout.REC_HDR.size
    require(pool.bucketSize <= layout.MAX_BUCKET_SIZE, pool, f"a bucket size of {pool.bucketSize}")
    require(0 < align < 2**16, pool, f"a data alignment of {align}")
    require(low % align == 0 and high % align == 0, pool,
            f"record sizes from {low} to {high} are not multiples of {align}")
    require(high + hdr <= pool.bucketSize, pool, f"a maximum record size of {high} needs a bucket size "
            f"of at least {high + hdr}, not {pool.bucketSize}")
    require(low <= high, pool, f"a minimum record size of {low} is above the maximum of {high}, "
            f"both rounded to the data alignment of {align}")
    require(pool.numGroups == (high - low) // align + 1, pool,
            f"{pool.numGroups} places for groups, {(high - low) // align + 1} size classes")
    require(pool.keepEmptyBuckets < 2 and pool.enabled < 2, pool, "a flag that is not 0 or 1")

    fast_path = (0, 0, 0)
    if pool.enabled and align & (align - 1) == 0 and low < 2**15 and high >= align + hdr:
        shift = align.bit_length() - 1
        fast_path = ((high - hdr) >> shift << shift, (low >> shift) - 1 - (hdr >> shift), shift)
    require((pool.fastMax, pool.skippedSteps, pool.alignmentShift) == fast_path, pool,
            "the rule of its fast path is not that of its settings")


def rec_data_size(pool, index):
    """The data size of a group: the largest that has its index."""
    largest = min(pool.minRecordSize + (index + 1) * pool.dataAlignment - 1, pool.maxRecordSize)
    return (largest - layout.REC_HDR.size) // pool.dataAlignment * pool.dataAlignment


def check_group(pool, group):
    """Returns the buckets, whose headers are sound."""
    require(group.parent == pool.address, group, f"its pool is {group.parent:#018x}")
    expected = rec_data_size(pool, group.index)
    require(group.recDataSize == expected, group, f"a data size of {group.recDataSize}, not {expected}")
    rec_size = expected + layout.REC_HDR.size
    total = (pool.bucketSize - layout.FIRST_OFFSET) // rec_size
    ordinary = (pool.bucketSize, total, pool.keepEmptyBuckets)
    checked = (layout.FIRST_OFFSET + rec_size, 1, False)  # In the checked library.
    require((group.bucketSize, group.totalRecs, group.keepEmptyBuckets) in (ordinary, checked), group,
            "its buckets do not match the pool's settings")

    buckets = []
    for bucket in check_list(group.walk(), "prev1"):
        check_header(group, bucket)
        buckets.append(bucket)
    require(group.numBuckets == len(buckets), group,
            f"it counts {group.numBuckets} buckets and has {len(buckets)}")
    last = buckets[-1].address if buckets else 0
    require(group.tail == last, group, f"its last bucket is {group.tail:#018x}, not {last:#018x}")
    check_free_buckets(group, buckets)
    return buckets


def check_list(nodes, link_back):
    """The nodes of a list, as long as it is sound."""
    before = 0
    for node in nodes:
        back = getattr(node, link_back)
        require(back == before, node, f"{link_back} is {back:#018x}, not {before:#018x}")
        before = node.address
        yield node


def check_header(group, bucket):
    require(bucket.parent == group.address, bucket,
            f"its group is {bucket.parent:#018x}, but it is on the list of {group.what}")
    expected = group.recDataSize + layout.REC_HDR.size
    require(bucket.recSize == expected, bucket, f"a record size of {bucket.recSize}, not {expected}")
    size = layout.FIRST_OFFSET + group.totalRecs * expected
    require(bucket.size == size, bucket, f"a size of {bucket.size}, not {size}")
    require(bucket.numFree <= group.totalRecs, bucket,
            f"{bucket.numFree} free records of {group.totalRecs}")
    require(group.keepEmptyBuckets or bucket.numFree < group.totalRecs, bucket,
            "no record is in use, but it was not released")


def check_free_buckets(group, buckets):
    """A bucket is on the free-bucket list exactly while it has a free record. It leaves the list from
    the front when it has none."""
    free = {bucket.address for bucket in buckets if bucket.numFree > 0}
    listed = set()
    for bucket in check_list(group.walk_free(), "prev2"):
        require(bucket.address in free, bucket, f"it is on the free-bucket list of {group.what}, but is "
                "none of its buckets with a free record")
        listed.add(bucket.address)
    for bucket in buckets:
        require(bucket.numFree == 0 or bucket.address in listed, bucket,
                f"{bucket.numFree} free records, but not on the free-bucket list")
        require(bucket.numFree > 0 or bucket.prev2 == 0, bucket, "full, but prev2 is not null")
    require(group.numFreeBuckets == len(listed), group,
            f"it counts {group.numFreeBuckets} buckets with a free record and lists {len(listed)}")


def check_ext_recs(pool):
    ext_recs = []
    for ext_rec in check_list(pool.walk_ext_recs(), "prev"):
        require(pool.enabled, ext_rec, "a disabled pool has no heap record")
        require(ext_rec.hdr == layout.EXT_HDR, ext_rec,
                f"its header is {ext_rec.hdr.hex(' ')}, not {layout.EXT_HDR.hex(' ')}")
        rec_size = layout.round_up(ext_rec.length, pool.dataAlignment) + layout.REC_HDR.size
        require(pool.maxRecordSize < rec_size and ext_rec.length <= layout.MAX_ALLOC_SIZE, ext_rec,
                f"a length of {ext_rec.length} bytes")
        memory.read(ext_rec.end - 1, 1, "the last byte of a heap record")
        ext_recs.append(ext_rec)
    require(pool.numExtRecs == len(ext_recs), pool,
            f"it counts {pool.numExtRecs} heap records and has {len(ext_recs)}")
    return ext_recs


def check_overlaps(blocks):
    """No two blocks of the heap share a byte."""
    for block, following in pairwise(sorted(blocks, key=lambda block: block.address)):
        require(block.end <= following.address, following,
                f"it begins inside the {block.what} at {block.address:#018x}")


def check_records(bucket):
    """The free list holds each free record once, and all others are used."""
    def at(offset):
        return (f"bucket at {bucket.address:#018x}, record {offset // bucket.recSize + 1} "
                f"at {bucket.recs_base + offset:#018x}, offset {offset}")

    records = bucket.records()
    free = set()
    for offset in records.offsets():
        rec_type = records.type_at(offset)
        if rec_type == layout.TYPE_FREE:
            free.add(offset)
        elif rec_type != layout.TYPE_USED:
            raise Fault(f"{at(offset)}: its type is {rec_type:#04x}, neither FREE nor USED",
                        bucket.recs_base + offset)
        elif records.link_at(offset) != offset:
            raise Fault(f"{at(offset)}: USED, but its own offset is {records.link_at(offset)}",
                        bucket.recs_base + offset)

    listed = set()
    before = None  # The record whose link is followed; none for the head of the list.
    for offset in records.free_list():
        holder = bucket.address if before is None else bucket.recs_base + before
        link = (f"bucket at {bucket.address:#018x}: freeHead" if before is None
                else f"{at(before)}: the link of this free record")
        if not records.has_record_at(offset):
            raise Fault(f"{link} is {offset}, which is not the offset of a record", holder)
        if offset not in free:
            raise Fault(f"{link} leads to offset {offset}, a used record", holder)
        if offset in listed:
            raise Fault(f"{link} leads back to offset {offset}: the free list runs in a circle", holder)
        listed.add(offset)
        before = offset
    for offset in sorted(free - listed):
        raise Fault(f"{at(offset)}: FREE, but not on the free list", bucket.recs_base + offset)
    require(len(listed) == bucket.numFree, bucket,
            f"it counts {bucket.numFree} free records and lists {len(listed)}")
