"""The text of a pool's report, to the character as the library writes it on a stream that nobody has
set up otherwise: what is strange here is strange there. All arithmetic is in 32 bits.

Every function yields pieces of the text in their order.
"""

from collections import Counter

from . import layout
from .memory import name_text

VERSION = "$Id: MemPool,v 1.2.52.4 2009/08/10 21:28:15 qvw Exp $"
MIN_BUCKET_SIZE = 128
BOXES_PER_ROW = 8


def pointer_text(address):
    return f"0x{address % 2**64:016x}" if address else "0" * 18


def warning(number, text):
    return f"WARNING:../s/MemPool: {number}: {text}\n"


def table_head(indent, *columns):
    yield indent + "".join(f"{heading:<{width}} " for heading, width in columns) + "\n"
    yield indent + "".join("=" * width + " " for _, width in columns) + "\n"


def u32(value):
    return value % 2**32


def report(pool, detailed=False):
    figures = Figures(pool)
    yield f"MemPool::Mgr {name_text(pool.own_name)}\n"
    yield f"   Version     : {VERSION}\n"
    yield f"   Addr        : {pointer_text(pool.address)}\n"
    for label, value in (
            ("Sizeof      ", layout.POOL.size),
            ("Bucket Size ", pool.bucketSize),
            ("Num Groups  ", pool.numGroups),
            ("Num Buckets ", figures.num_buckets),
            ("   Empty    ", figures.empty_buckets),
            ("   Full     ", figures.full_buckets),
            ("Used Recs   ", figures.used_recs),
            ("Ext Recs    ", pool.numExtRecs),
            ("Free Recs   ", figures.free_recs),
            ("Free Bucks  ", figures.free_bucks),
            ("Free BucksM ", figures.free_bucks_m),
            ("Enabled     ", pool.enabled),
            ("Max Ext Sz  ", layout.MAX_ALLOC_SIZE),
            ("Min Buck Sz ", MIN_BUCKET_SIZE),
            ("Max Buck Sz ", layout.MAX_BUCKET_SIZE),
            ("Min Rec Sz  ", pool.minRecordSize),
            ("Max Rec Sz  ", pool.maxRecordSize),
            ("Data Align  ", pool.dataAlignment),
            ("Sizeof Buck ", layout.BUCKET.size),
            ("Sizeof Hdr  ", layout.REC_HDR.size),
            ("Sizeof Free ", layout.REC_HDR.size),
            ("Sizeof Used ", layout.REC_HDR.size)):
        yield f"   {label}: {value:16}\n"

    yield from used_data(figures.used_data_freq)
    yield from buckets(pool, figures.num_buckets)
    yield from free_buckets(pool, figures)
    yield from ext_recs(pool)
    if detailed:
        for number, bucket in enumerate(pool.buckets(), 1):
            yield from bucket_report(bucket, number)


class Figures:
    """What a pool keeps no count of."""

    def __init__(self, pool):
        self.num_buckets = u32(sum(group.numBuckets for group in pool.groups))
        self.empty_buckets = self.full_buckets = self.used_recs = self.free_recs = 0
        self.free_bucks = u32(sum(group.numFreeBuckets for group in pool.groups))
        self.free_bucks_m = pool.groups[-1].recDataSize if pool.groups else 0
        self.used_data_freq = Counter()
        for bucket in pool.buckets():
            self.empty_buckets += bucket.numFree == bucket.total_recs
            self.full_buckets += bucket.numFree == 0
            self.used_recs = u32(self.used_recs + bucket.used_recs)
            self.free_recs = u32(self.free_recs + bucket.numFree)
            self.used_data_freq.update(used_sizes(bucket.records()))
        self.used_data_freq.update(ext_rec.length for ext_rec in pool.ext_rec_list)


def used_sizes(records):
    """How many used records of each data size: one size or none."""
    count = records.count_used()
    return Counter({records.bucket.data_size: count} if count else {})


def histogram_head(indent, size_width, freq_width):
    return table_head(indent, ("Id", 5), ("Size", size_width), ("Freq", freq_width),
                      ("Magnitude", 50))


def used_data(used_data_freq):
    """The bars are scaled so that the longest has 51 to 100 asterisks once it stands for 50."""
    yield f"\n         USED DATA FREQ DIST HISTOGRAM ({len(used_data_freq)})\n"
    yield from histogram_head(6 * " ", 7, 9)
    scale = max(max(used_data_freq.values(), default=0) // 50, 1)
    for row, (size, frequency) in enumerate(sorted(used_data_freq.items()), 1):
        yield f"      {row:5} {size:7} {frequency:9} {'*' * (frequency // scale + 1)}\n"


def buckets(pool, num_buckets):
    indent = 6 * " "
    yield f"\n   BUCKETS ({num_buckets})\n"
    yield from table_head(indent, ("Id", 5), ("Group", 5), ("Used", 5), ("Free", 5), ("Total", 5),
                          ("% Used", 8), ("Rec Size", 8), ("Addr", 16))
    row = 0
    for group in pool.groups:
        for bucket in group.buckets:
            row += 1
            total = bucket.total_recs
            used = u32(bucket.used_recs)
            percentage = used * 100.0 / total if total else 0.0
            yield (f"{indent}{row:5} {group.index:5} {used:5} {bucket.numFree:5} {total:5} "
                   f"{percentage:7.3f}% {bucket.recSize:8} {pointer_text(bucket.address)} \n")


def free_buckets(pool, figures):
    indent = 6 * " "
    yield f"\n   FREE BUCKETS ({figures.free_bucks},{figures.free_bucks_m})\n"
    yield from table_head(indent, ("Id", 5), ("Group", 5), ("Size", 5), ("Count", 5), ("Off", 5),
                          ("Buckets", 16))
    row = 0
    for group in pool.groups:
        listed = group.free_buckets
        row += bool(listed)
        for position, bucket in enumerate(listed):
            head = 4 * 6 * " "
            if position == 0:
                head = f"{row:5} {group.index:5} {bucket.data_size:5} {len(listed):5} "
            yield f"{indent}{head}{position:5} {pointer_text(bucket.address)}\n"
    yield "\n"


def ext_recs(pool):
    indent = 6 * " "
    yield f"\n   EXT RECS ({pool.numExtRecs})\n"
    yield from table_head(indent, ("Id", 5), ("Length", 7), ("Data Ptr", 16), ("Heap Ptr", 16),
                          ("Next", 16), ("Prev", 16))
    for row, ext_rec in enumerate(pool.ext_rec_list, 1):
        addresses = (ext_rec.data, ext_rec.address, ext_rec.next, ext_rec.prev)
        yield (f"{indent}{row:5} {ext_rec.length:7} "
               + "".join(pointer_text(address) + " " for address in addresses) + "\n")
    yield "\n"


def bucket_report(bucket, number):
    title = f"   MemPool::Bucket #{number:03}"
    total = bucket.total_recs
    used = u32(bucket.used_recs)
    yield f"\n{title}\n"
    for label, text in (
            ("Addr        ", pointer_text(bucket.address)),
            ("Sizeof      ", layout.BUCKET.size),
            ("Parent      ", pointer_text(bucket.parent)),
            ("Next1       ", pointer_text(bucket.next1)),
            ("Prev1       ", pointer_text(bucket.prev1)),
            ("Next2       ", pointer_text(bucket.next2)),
            ("Prev2       ", pointer_text(bucket.prev2)),
            ("Recs Base   ", pointer_text(bucket.recs_base)),
            ("Recs Beg    ", pointer_text(bucket.recs_base + layout.FIRST_OFFSET)),
            ("Recs End    ", pointer_text(bucket.recs_base + bucket.size)),
            ("Recs Size   ", bucket.recSize),
            ("Size        ", bucket.size),
            ("Total Recs  ", total),
            ("Used Recs   ", used),
            ("Used Bytes  ", u32(bucket.data_size * used)),
            ("Free Recs   ", bucket.numFree),
            ("Free Bytes  ", u32(bucket.data_size * bucket.numFree)),
            ("Free Head   ", bucket.freeHead),
            ("Hdr Offset  ", layout.BUCKET.size)):
        yield f"      {label}: {text:>16}\n"

    records = bucket.records()
    yield f"\n{title} ALL RECORDS ({total})\n"
    yield from all_records(records, total)
    yield f"\n{title} USED DATA FREQ DIST HISTOGRAM ({used})\n"
    yield from used_histogram(records)
    yield f"\n{title} ALL RECORDS MAP ({total})\n"
    yield from record_map(records, total)
    yield f"\n{title} FREE LIST ({bucket.numFree})\n"
    yield from free_list(records, total)
    yield "\n"


def all_records(records, total):
    indent = 6 * " "
    yield from table_head(indent, ("Id", 5), ("Type", 4), ("Offset", 6), ("Size", 5), ("End", 5),
                          ("DSize", 5), ("Address", 18))
    base, rec_size, data_size = records.base, records.rec_size, records.bucket.data_size
    rows = 0
    for offset in records.offsets():
        rows += 1
        rec_type = records.type_at(offset)
        yield (f"{indent}{rows:05} {layout.kind_name(rec_type):>4} {offset:6} {rec_size:5} "
               f"{offset + rec_size:5} {data_size if rec_type == layout.TYPE_USED else 0:5} "
               f"{pointer_text(base + offset)} \n")
        if rows > total:
            yield warning(2916, f"Exceeded the total number of recs {rows} > {total}")
    if rows < total:
        yield warning(2922, f"Did not reach the expected number of recs {rows} < {total}")


def used_histogram(records):
    """One asterisk a record, and a "+" where there are more than the column holds."""
    indent = 6 * " "
    yield from histogram_head(indent, 5, 5)
    for row, (size, frequency) in enumerate(sorted(used_sizes(records).items()), 1):
        bar = "*" * min(frequency, 50) + "+" * (frequency > 50)
        yield f"{indent}{row:05} {size:5} {frequency:5} {bar}\n"


def record_map(records, total):
    """The records as boxes, eight to a row: kinds, offsets, sizes, and the data size or the offset of
    the next free one. "+" stands where the free list begins."""
    rec_size, data_size = records.rec_size, records.bucket.data_size
    free_head = records.bucket.freeHead
    offsets = records.offsets()
    yield 6 * " " + "".join(f"    {number}     " for number in range(
        1, min(len(offsets), BOXES_PER_ROW) + 1)) + "\n"
    margin = 5 * " "

    def rule(boxes):
        return f"{margin}+{boxes * '---------+'}\n"

    def value(offset):
        rec_type = records.type_at(offset)
        if rec_type == layout.TYPE_FREE:
            return f"n={records.link_at(offset):<6}| "
        return f"d={data_size:<6}| " if rec_type == layout.TYPE_USED else "u=0     | "

    def row(first, end):
        boxes = offsets[first:end]
        kinds = (layout.kind_name(records.type_at(offset))
                 + (" +" if offset == free_head else "") for offset in boxes)
        yield f"{margin}| " + "".join(f"{kind:<8}| " for kind in kinds) + "\n"
        yield f"{margin}| " + "".join(f"o={offset:<6}| " for offset in boxes) + "\n"
        yield f"{first:4} | " + f"s={rec_size:<6}| " * len(boxes) + "\n"
        yield f"{margin}| " + "".join(map(value, boxes)) + "\n"

    partial = total % BOXES_PER_ROW
    for first in range(0, total - partial, BOXES_PER_ROW):
        yield rule(BOXES_PER_ROW)
        yield from row(first, first + BOXES_PER_ROW)
    yield rule(min(len(offsets), BOXES_PER_ROW))
    if partial:
        yield from row(total - partial, total)
        yield rule(partial)


def free_list(records, total):
    indent = 6 * " "
    yield from table_head(indent, ("Id", 5), ("Offset", 6), ("Next", 5), ("Size", 5),
                          ("Address", 18), ("Next Addr", 18))
    rows_before = 0
    offset = records.bucket.freeHead
    while records.has_record_at(offset):
        link = records.link_at(offset)
        next_address = records.base + link if link else 0
        yield (f"{indent}{rows_before + 1:05} {offset:6} {link:5} {records.rec_size:5} "
               f"{pointer_text(records.base + offset)} {pointer_text(next_address)} \n")
        if rows_before > total:
            yield warning(2970, "Exceeded the number of total number of recs "
                          f"{rows_before} > {total}")
            break
        rows_before += 1
        offset = link
