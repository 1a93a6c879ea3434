"""Describes an address: the pool, the bucket and the record that contain it, and their neighbours.

A place is a range of memory that is known: a pool, its handle, its table, a group, a bucket or a heap
record. Those of all pools are listed first, since the bytes before an address may be damaged.
"""

import collections

from . import layout
from .memory import Fault
from .pools import Bucket, all_pools

Place = collections.namedtuple("Place", "start end name pool thing")


def whois(address):
    """The lines that describe `address`."""
    pools, fault = all_pools()
    faults = [str(fault)] if fault else []
    places = [place for pool in pools for place in places_of(pool, faults)]

    # A host can keep a handle in a block of another pool, so the smallest place comes first.
    inside = [place for place in places if place.start <= address < place.end]
    for place in sorted(inside, key=lambda place: place.end - place.start):
        before, after = neighbours(places, place.start, place.end)
        if isinstance(place.thing, Bucket):
            yield from describe_bucket(address, place, before, after)
        else:
            yield from describe(address, place)
            yield from before + after
    if not inside:
        yield f"{address:#018x} lies in no pool's memory."
        before, after = neighbours(places, address, address)
        yield from before + after
        disabled = [pool.title for pool in pools if is_disabled(pool)]
        if disabled:
            yield ("   Unknown : the blocks of disabled pools "
                   f"({', '.join(disabled)}) are the heap's own")
    for fault in faults:
        yield f"   Damaged : {fault}; what the pool has beyond that is unknown"


def is_disabled(pool):
    try:
        return not pool.enabled
    except Fault:
        return False


def places_of(pool, faults):
    """All places of a pool. A list is followed as long as its nodes belong to the pool."""
    def place(start, end, name, thing=None):
        return Place(start, end, name, pool, thing)

    try:
        yield place(pool.address, pool.end, "the pool itself")
        if pool.mgr != 0:
            yield place(pool.mgr, pool.mgr + 8, "the pool's handle")
        table = pool.row.groups
        yield place(table, table + 8 * pool.numGroups, "the pool's table of groups")
        groups = pool.groups
    except Fault as fault:
        faults.append(f"pool {pool.title}: {fault}")
        return
    number = 0
    for group in groups:
        try:
            if group.parent != pool.address:
                raise Fault(f"{group.what} at {group.address:#018x}: it has another pool", group.address)
            yield place(group.address, group.end, f"the pool's {group.what}")
            for bucket in group.walk():
                if bucket.parent != group.address:
                    raise Fault(f"bucket at {bucket.address:#018x}: it has another group than "
                                f"{group.index}, on whose list it is", bucket.address)
                number += 1
                yield place(bucket.address, bucket.end, f"bucket {number}", bucket)
        except Fault as fault:
            faults.append(f"pool {pool.title}: {fault}")
    try:
        for number, ext_rec in enumerate(pool.walk_ext_recs(), 1):
            if ext_rec.hdr != layout.EXT_HDR:
                raise Fault(f"heap record at {ext_rec.address:#018x}: it has no valid header",
                            ext_rec.address)
            yield place(ext_rec.address, max(ext_rec.end, ext_rec.data + 1), f"heap record {number}",
                        ext_rec)
    except Fault as fault:
        faults.append(f"pool {pool.title}: {fault}")


def neighbours(places, start, end):
    """A line for the last place before a range of bytes, and one for the first after it, if any."""
    before = max((place for place in places if place.end <= start),
                 key=lambda place: place.end, default=None)
    after = min((place for place in places if place.start >= end),
                key=lambda place: place.start, default=None)
    return ([] if before is None else
            [f"   Before  : {distance(start - before.end)} after the end of {before.name} at "
             f"{before.start:#018x}, pool {before.pool.title}"],
            [] if after is None else
            [f"   After   : {distance(after.start - end)} before {after.name} at "
             f"{after.start:#018x}, pool {after.pool.title}"])


def distance(count):
    return f"{count} byte" + "s" * (count != 1)


def pool_line(place):
    return f"   Pool    : {place.pool.title}, {place.pool.address:#018x}"


def describe(address, place):
    """The lines about an address inside a place, unless that is a bucket."""
    ext_rec = place.thing
    if ext_rec is None:
        yield f"{address:#018x} lies {distance(address - place.start)} into {place.name}."
        yield pool_line(place)
        return
    yield position(address, ext_rec.data, ext_rec.address, "a heap record")
    yield pool_line(place)
    yield f"   Record  : {place.name} of {place.pool.numExtRecs}, {ext_rec.address:#018x}, EXT"
    yield f"   Block   : {ext_rec.data:#018x}, {distance(ext_rec.length)}"


def position(address, data, header, name):
    if address == data:
        return f"{address:#018x} is the block of {name}."
    if address > data:
        return f"{address:#018x} lies {distance(address - data)} into the block of {name}."
    return f"{address:#018x} lies {distance(address - header)} into the header of {name}."


def describe_bucket(address, place, before, after):
    """The lines about an address inside a bucket, which has `before` and `after` beside it."""
    bucket = place.thing
    try:
        records = bucket.records()
    except Fault as fault:
        yield f"{address:#018x} lies {distance(address - bucket.address)} into a bucket: {fault}"
        yield pool_line(place)
        return
    total = bucket.total_recs
    offset = address - bucket.recs_base - layout.FIRST_OFFSET
    index = offset // bucket.recSize if bucket.recSize and offset >= 0 else -1
    is_record = 0 <= index < total
    if is_record:
        offset = layout.FIRST_OFFSET + index * bucket.recSize
        data = bucket.recs_base + offset + layout.REC_HDR.size
        state = {layout.TYPE_FREE: "a free record", layout.TYPE_USED: "a used record"}.get(
            records.type_at(offset), "a damaged record")
        yield position(address, data, bucket.recs_base + offset, state)
    elif offset < 0:
        yield f"{address:#018x} lies {distance(address - bucket.address)} into a bucket's header."
    else:
        yield f"{address:#018x} lies after the last record of a bucket."
    yield pool_line(place)
    group, = (group for group in place.pool.groups if group.address == bucket.parent)
    yield (f"   Bucket  : {place.name.split()[1]}, {bucket.address:#018x}, {group.what}, "
           f"{bucket.used_recs} of {total} records used, {bucket.recSize} bytes each")

    free_list = list(records.free_list())

    def record_line(label, number):
        at = layout.FIRST_OFFSET + number * bucket.recSize
        return (f"   {label:8}: record {number + 1}, {bucket.recs_base + at:#018x}, "
                f"offset {at}, {state_of(records, at, free_list)}")

    if is_record:
        yield record_line("Record", index)
        yield f"   Block   : {data:#018x}, {distance(bucket.data_size)}"
    if 0 < index and total > 0:
        yield record_line("Before", min(index, total) - 1)
    elif index == 0:
        yield f"   Before  : the bucket's header, {bucket.address:#018x}"
    else:
        yield from before
    if index + 1 < total:
        yield record_line("After", index + 1)
    else:
        yield from after


def state_of(records, offset, free_list):
    """Whether a record is used or free. Its header and the free list must agree."""
    rec_type, link = records.type_at(offset), records.link_at(offset)
    kind = layout.kind_name(rec_type)
    if rec_type == layout.TYPE_FREE and offset in free_list:
        return f"{kind}, {free_list.index(offset) + 1} on the free list"
    if rec_type == layout.TYPE_FREE:
        return f"{kind}, but not on the free list"
    if offset in free_list:
        return f"{kind}, but on the free list"
    if rec_type == layout.TYPE_USED and link != offset:
        return f"{kind}, but its own offset is {link}"
    return kind if rec_type == layout.TYPE_USED else f"{kind}, type {rec_type:#04x}"
