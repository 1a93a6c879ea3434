"""The text of a pool's report, exactly as the library writes it on a stream with default formatting.
All arithmetic is in 32 bits.

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


def u32(value):
    return value % 2**32


class Table:
    """Columns are (heading, width) or (heading, width, format of the values)."""

    def __init__(self, *columns, indent=6 * " ", end=" "):
        self.columns, self.indent, self.end = columns, indent, end

    def head(self):
        headings = "".join(f"{heading:<{width}} " for heading, width, *_ in self.columns)
        rule = "".join("=" * width + " " for _, width, *_ in self.columns)
        return f"{self.indent}{headings}\n{self.indent}{rule}\n"

    def row(self, *values):
        forms = (form[0] if form else f">{width}" for _, width, *form in self.columns)
        return self.indent + " ".join(map(format, values, forms)) + self.end + "\n"


def report(pool, detailed=False):
    figures = Figures(pool)
    yield f"MemPool::Mgr {name_text(pool.own_name)}\n"
    yield f"   Version     : {VERSION}\n"
    yield f"   Addr        : {pointer_text(pool.address)}\n"
    for label, value in (
            ("Sizeof", layout.POOL.size),
            ("Bucket Size", pool.bucketSize),
            ("Num Groups", pool.numGroups),
            ("Num Buckets", figures.num_buckets),
            ("   Empty", figures.empty_buckets),
            ("   Full", figures.full_buckets),
            ("Used Recs", figures.used_recs),
            ("Ext Recs", pool.numExtRecs),
            ("Free Recs", figures.free_recs),
            ("Free Bucks", figures.free_bucks),
            ("Free BucksM", figures.free_bucks_m),
            ("Enabled", pool.enabled),
            ("Max Ext Sz", layout.MAX_ALLOC_SIZE),
            ("Min Buck Sz", MIN_BUCKET_SIZE),
            ("Max Buck Sz", layout.MAX_BUCKET_SIZE),
            ("Min Rec Sz", pool.minRecordSize),
            ("Max Rec Sz", pool.maxRecordSize),
            ("Data Align", pool.dataAlignment),
            ("Sizeof Buck", layout.BUCKET.size),
            ("Sizeof Hdr", layout.REC_HDR.size),
            ("Sizeof Free", layout.REC_HDR.size),
            ("Sizeof Used", layout.REC_HDR.size)):
        yield f"   {label:12}: {value:16}\n"

    yield from used_data(figures.used_data_freq)
    yield from buckets(pool, figures.num_buckets)
    yield from free_buckets(pool, figures)
    yield from ext_recs(pool)
    if detailed:
        for number, bucket in enumerate(pool.buckets(), 1):
            yield from bucket_report(bucket, number)


class Figures:
    """The figures that a pool does not store."""

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
    """The number of used records of each data size: one size or none."""
    count = records.count_used()
    return Counter({records.bucket.data_size: count} if count else {})


def used_data(used_data_freq):
    """The bars are scaled: the longest has 51 to 100 asterisks if it stands for 50 blocks or more."""
    yield f"\n         USED DATA FREQ DIST HISTOGRAM ({len(used_data_freq)})\n"
    table = Table(("Id", 5), ("Size", 7), ("Freq", 9), ("Magnitude", 50, ""), end="")
    yield table.head()
    scale = max(max(used_data_freq.values(), default=0) // 50, 1)
    for row, (size, frequency) in enumerate(sorted(used_data_freq.items()), 1):
        yield table.row(row, size, frequency, "*" * (frequency // scale + 1))


def buckets(pool, num_buckets):
    yield f"\n   BUCKETS ({num_buckets})\n"
    table = Table(("Id", 5), ("Group", 5), ("Used", 5), ("Free", 5), ("Total", 5),
                  ("% Used", 8), ("Rec Size", 8), ("Addr", 16))
    yield table.head()
    rows = ((group, bucket) for group in pool.groups for bucket in group.buckets)
    for row, (group, bucket) in enumerate(rows, 1):
        total, used = bucket.total_recs, u32(bucket.used_recs)
        percentage = used * 100.0 / total if total else 0.0
        yield table.row(row, group.index, used, bucket.numFree, total, f"{percentage:.3f}%",
                        bucket.recSize, pointer_text(bucket.address))


def free_buckets(pool, figures):
    yield f"\n   FREE BUCKETS ({figures.free_bucks},{figures.free_bucks_m})\n"
    table = Table(("Id", 5), ("Group", 5), ("Size", 5), ("Count", 5), ("Off", 5), ("Buckets", 16),
                  end="")
    yield table.head()
    row = 0
    for group in pool.groups:
        listed = group.free_buckets
        row += bool(listed)
        for position, bucket in enumerate(listed):
            of_group = (row, group.index, bucket.data_size, len(listed)) if position == 0 else 4 * ("",)
            yield table.row(*of_group, position, pointer_text(bucket.address))
    yield "\n"


def ext_recs(pool):
    yield f"\n   EXT RECS ({pool.numExtRecs})\n"
    table = Table(("Id", 5), ("Length", 7), ("Data Ptr", 16), ("Heap Ptr", 16), ("Next", 16),
                  ("Prev", 16))
    yield table.head()
    for row, ext_rec in enumerate(pool.ext_rec_list, 1):
        yield table.row(row, ext_rec.length, *map(pointer_text, (
            ext_rec.data, ext_rec.address, ext_rec.next, ext_rec.prev)))
    yield "\n"


def bucket_report(bucket, number):
    title = f"   MemPool::Bucket #{number:03}"
    total = bucket.total_recs
    used = u32(bucket.used_recs)
    yield f"\n{title}\n"
    for label, text in (
            ("Addr", pointer_text(bucket.address)),
            ("Sizeof", layout.BUCKET.size),
            ("Parent", pointer_text(bucket.parent)),
            ("Next1", pointer_text(bucket.next1)),
            ("Prev1", pointer_text(bucket.prev1)),
            ("Next2", pointer_text(bucket.next2)),
            ("Prev2", pointer_text(bucket.prev2)),
            ("Recs Base", pointer_text(bucket.recs_base)),
            ("Recs Beg", pointer_text(bucket.recs_base + layout.FIRST_OFFSET)),
            ("Recs End", pointer_text(bucket.recs_base + bucket.size)),
            ("Recs Size", bucket.recSize),
            ("Size", bucket.size),
            ("Total Recs", total),
            ("Used Recs", used),
            ("Used Bytes", u32(bucket.data_size * used)),
            ("Free Recs", bucket.numFree),
            ("Free Bytes", u32(bucket.data_size * bucket.numFree)),
            ("Free Head", bucket.freeHead),
            ("Hdr Offset", layout.BUCKET.size)):
        yield f"      {label:12}: {text:>16}\n"

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
    table = Table(("Id", 5, "05"), ("Type", 4), ("Offset", 6), ("Size", 5), ("End", 5), ("DSize", 5),
                  ("Address", 18))
    yield table.head()
    rec_size, data_size = records.rec_size, records.bucket.data_size
    rows = 0
    for offset in records.offsets():
        rows += 1
        rec_type = records.type_at(offset)
        yield table.row(rows, layout.kind_name(rec_type), offset, rec_size, offset + rec_size,
                        data_size if rec_type == layout.TYPE_USED else 0,
                        pointer_text(records.base + offset))
        if rows > total:
            yield warning(2916, f"Exceeded the total number of recs {rows} > {total}")
    if rows < total:
        yield warning(2922, f"Did not reach the expected number of recs {rows} < {total}")


def used_histogram(records):
    """One asterisk per record, and a "+" where there are more than the column holds."""
    table = Table(("Id", 5, "05"), ("Size", 5), ("Freq", 5), ("Magnitude", 50, ""), end="")
    yield table.head()
    for row, (size, frequency) in enumerate(sorted(used_sizes(records).items()), 1):
        yield table.row(row, size, frequency, "*" * min(frequency, 50) + "+" * (frequency > 50))


def record_map(records, total):
    """The records as boxes, eight to a row: kinds, offsets, sizes, and the data size or the offset of
    the next free record. "+" marks the head of the free list."""
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
            return f"n={records.link_at(offset)}"
        return f"d={data_size}" if rec_type == layout.TYPE_USED else "u=0"

    def kind(offset):
        return layout.kind_name(records.type_at(offset)) + (" +" if offset == free_head else "")

    def line(head, texts):
        return f"{head}| " + "".join(f"{text:<8}| " for text in texts) + "\n"

    def row(first, end):
        boxes = offsets[first:end]
        yield line(margin, map(kind, boxes))
        yield line(margin, (f"o={offset}" for offset in boxes))
        yield line(f"{first:4} ", [f"s={rec_size}"] * len(boxes))
        yield line(margin, map(value, boxes))

    partial = total % BOXES_PER_ROW
    for first in range(0, total - partial, BOXES_PER_ROW):
        yield rule(BOXES_PER_ROW)
        yield from row(first, first + BOXES_PER_ROW)
    yield rule(min(len(offsets), BOXES_PER_ROW))
    if partial:
        yield from row(total - partial, total)
        yield rule(partial)


def free_list(records, total):
    table = Table(("Id", 5, "05"), ("Offset", 6), ("Next", 5), ("Size", 5), ("Address", 18),
                  ("Next Addr", 18))
    yield table.head()
    rows_before = 0
    offset = records.bucket.freeHead
    while records.has_record_at(offset):
        link = records.link_at(offset)
        yield table.row(rows_before + 1, offset, link, records.rec_size,
                        pointer_text(records.base + offset),
                        pointer_text(records.base + link if link else 0))
        if rows_before > total:
            yield warning(2970, "Exceeded the number of total number of recs "
                          f"{rows_before} > {total}")
            break
        rows_before += 1
        offset = link
