"""What an address is: the pool, the bucket and the record that it lies in, and what lies beside it.

A place is a range of memory that is known: a pool with its handle, its table and its groups, a
bucket, a heap record. They are all listed, whichever pool they are of, since the address tells
nothing: the bytes ahead of it may be damaged.
"""

import collections

from . import layout
from .memory import Fault
from .pools import ExtRec, all_pools

Place = collections.namedtuple("Place", "start end name pool thing number")


def whois(address):
    """The lines that tell of `address`."""
    pools, fault = all_pools()
    faults = [str(fault)] if fault else []
    places = []
    for pool in pools:
        places.extend(places_of(pool, faults))

    # A host can keep a handle in a block of another pool: the smallest place comes first.
    inside = [place for place in places if place.start <= address < place.end]
    for place in sorted(inside, key=lambda place: place.end - place.start):
        yield from tell(address, place, list(neighbours(places, place.start, place.end)))
    if not inside:
        yield f"{address:#018x} lies in no pool's memory."
        yield from neighbours(places, address, address)
        disabled = [pool.title for pool in pools if is_disabled(pool)]
        if disabled:
            yield ("   Unknown : the blocks of disabled pools "
                   f"({', '.join(disabled)}) are the heap's own")
    for fault in faults:
        yield f"   Damaged : {fault}; what the pool has beyond that is not known"


def is_disabled(pool):
    try:
        return not pool.enabled
    except Fault:
        return False


def places_of(pool, faults):
    """All that is known of a pool. A list is followed as long as it leads to the pool's own."""
    def place(start, size, name, thing=None, number=0):
        return Place(start, start + size, name, pool, thing, number)

    try:
        yield place(pool.address, pool.form.size, "the pool itself")
        if pool.mgr != 0:
            yield place(pool.mgr, 8, "the pool's handle")
        yield place(pool.row.groups, 8 * pool.numGroups, "the pool's table of groups")
        groups = pool.groups
    except Fault as fault:
        faults.append(f"pool {pool.title}: {fault}")
        return
    number = 0
    for group in groups:
        try:
            if group.parent != pool.address:
                raise Fault(f"group {group.index} at {group.address:#018x}: its pool is another",
                            group.address)
            yield place(group.address, group.form.size, f"the pool's group {group.index}", group)
            for bucket in group.walk():
                if bucket.parent != group.address:
                    raise Fault(f"bucket at {bucket.address:#018x}: its group is another than "
                                f"{group.index}, on whose list it stands", bucket.address)
                number += 1
                yield place(bucket.address, bucket.end - bucket.address,
                            f"bucket {number}", (group, bucket), number)
        except Fault as fault:
            faults.append(f"pool {pool.title}: {fault}")
    try:
        for number, ext_rec in enumerate(pool.walk_ext_recs(), 1):
            if ext_rec.hdr != layout.EXT_HDR:
                raise Fault(f"heap record at {ext_rec.address:#018x}: its header is none",
                            ext_rec.address)
            yield place(ext_rec.address, ext_rec.form.size + max(ext_rec.length, 1),
                        f"heap record {number}", ext_rec, number)
    except Fault as fault:
        faults.append(f"pool {pool.title}: {fault}")


def neighbours(places, start, end):
    """The two places that lie next to a range of bytes."""
    ahead = max((place for place in places if place.end <= start),
                key=lambda place: place.end, default=None)
    if ahead is not None:
        yield (f"   Ahead   : {distance(start - ahead.end)} behind the end of {ahead.name} at "
               f"{ahead.start:#018x}, pool {ahead.pool.title}")
    behind = min((place for place in places if place.start >= end),
                 key=lambda place: place.start, default=None)
    if behind is not None:
        yield (f"   Behind  : {distance(behind.start - end)} ahead of {behind.name} at "
               f"{behind.start:#018x}, pool {behind.pool.title}")


def distance(count):
    return f"{count} byte" + "s" * (count != 1)


def tell(address, place, beside):
    """The lines about an address inside of `place`, of which `beside` tells what lies around it."""
    pool = f"   Pool    : {place.pool.title}, {place.pool.address:#018x}"
    if isinstance(place.thing, tuple):
        yield from tell_bucket(address, place, pool, beside)
    elif isinstance(place.thing, ExtRec):
        ext_rec = place.thing
        yield position(address, ext_rec.data, ext_rec.address, "a heap record")
        yield pool
        yield (f"   Record  : heap record {place.number} of {place.pool.numExtRecs}, "
               f"{ext_rec.address:#018x}, EXT")
        yield f"   Block   : {ext_rec.data:#018x}, {distance(ext_rec.length)}"
        yield from beside
    else:
        yield f"{address:#018x} lies {distance(address - place.start)} into {place.name}."
        yield pool
        yield from beside


def position(address, data, header, name):
    if address == data:
        return f"{address:#018x} is the block of {name}."
    if address > data:
        return f"{address:#018x} lies {distance(address - data)} into the block of {name}."
    return f"{address:#018x} lies {distance(address - header)} into the header of {name}."


def tell_bucket(address, place, pool_line, beside):
    group, bucket = place.thing
    try:
        records = bucket.records()
    except Fault as fault:
        yield f"{address:#018x} lies {distance(address - bucket.address)} into a bucket: {fault}"
        yield pool_line
        return
    total = bucket.total_recs
    offset = address - bucket.recs_base - layout.FIRST_OFFSET
    index = offset // bucket.recSize if bucket.recSize and offset >= 0 else -1
    if 0 <= index < total:
        offset = layout.FIRST_OFFSET + index * bucket.recSize
        header = bucket.recs_base + offset
        data = header + layout.REC_HDR.size
        state = {layout.TYPE_FREE: "a free record", layout.TYPE_USED: "a used record"}.get(
            records.type_at(offset), "a damaged record")
        yield position(address, data, header, state)
    elif offset < 0:
        yield f"{address:#018x} lies {distance(address - bucket.address)} into a bucket's header."
    else:
        yield f"{address:#018x} lies behind the last record of a bucket."
    yield pool_line
    yield (f"   Bucket  : {place.number}, {bucket.address:#018x}, group {group.index}, "
           f"{bucket.used_recs} of {total} records used, {bucket.recSize} bytes each")

    free_list = list(records.free_list())

    def record_line(label, number):
        at = layout.FIRST_OFFSET + number * bucket.recSize
        return (f"   {label:8}: record {number + 1}, {bucket.recs_base + at:#018x}, "
                f"offset {at}, {state_of(records, at, free_list)}")

    if 0 <= index < total:
        yield record_line("Record", index)
        yield f"   Block   : {data:#018x}, {distance(bucket.data_size)}"
    first_ahead = index - 1 if index < total else total - 1
    if 0 <= first_ahead < total:
        yield record_line("Ahead", first_ahead)
    elif index == 0:
        yield f"   Ahead   : the bucket's header, {bucket.address:#018x}"
    else:
        yield from (line for line in beside if line.startswith("   Ahead"))
    if index + 1 < total:
        yield record_line("Behind", index + 1)
    else:
        yield from (line for line in beside if line.startswith("   Behind"))


def state_of(records, offset, free_list):
    """Whether a record is used or free, as its header and the free list say, which must agree."""
    rec_type, link = records.type_at(offset), records.link_at(offset)
    kind = layout.kind_name(rec_type)
    if rec_type == layout.TYPE_FREE and offset in free_list:
        return f"{kind}, {free_list.index(offset) + 1} on the free list"
    if rec_type == layout.TYPE_FREE:
        return f"{kind}, but not found on the free list"
    if offset in free_list:
        return f"{kind}, but on the free list"
    if rec_type == layout.TYPE_USED and link != offset:
        return f"{kind}, but its own offset reads {link}"
    return kind if rec_type == layout.TYPE_USED else f"{kind}, type {rec_type:#04x}"
