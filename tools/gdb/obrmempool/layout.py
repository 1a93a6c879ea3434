"""The memory format: every size and offset that the other files rely on.

A Layout is a struct of the library. It lists the fields in the order of memory as "name:code", with
codes of the module struct. A gap has only a code. Everything is little-endian, and pointers have 64
bits. std::string, std::map and std::vector are those of libstdc++.
"""

import collections
import struct


class Layout:
    def __init__(self, cxx_name, description):
        self.cxx_name = cxx_name
        self.fields = []  # (name, offset, code)
        form = "<"
        for word in description.split():
            name, _, code = word.rpartition(":")
            if name:
                self.fields.append((name, struct.calcsize(form), code))
            form += code
        self.form = struct.Struct(form)
        self.size = self.form.size
        self.row = collections.namedtuple("Row", [name for name, _, _ in self.fields])

    def parse(self, data):
        return self.row._make(self.form.unpack_from(data))


STRING = Layout("std::string", "text:Q length:Q 16x")

# A std::map from names to pools, then a std::vector of handles, the sharers. `root`, `first` and `last`
# are in the end node of the tree, which has neither a name nor a pool.
REGISTRY = Layout("OBR::MemPool::MgrRegistry",
                  "16x root:Q first:Q last:Q count:Q sharers:Q sharersEnd:Q 8x")
TREE_END = 8  # The offset of that node.

NODE = Layout("a node of the tree", "8x parent:Q left:Q right:Q name:32s pool:Q")

POOL = Layout("OBR::MemPool::BucketMgr",
              "name:32s mgr:Q groups:Q extRecs:Q numGroups:I numExtRecs:I bucketSize:I "
              "dataAlignment:I maxRecordSize:I minRecordSize:I keepEmptyBuckets:B enabled:B fastMax:H "
              "skippedSteps:h alignmentShift:B x")

GROUP = Layout("OBR::MemPool::Group",
               "parent:Q head:Q tail:Q freeBuckets:Q numBuckets:I numFreeBuckets:I recDataSize:H "
               "bucketSize:H totalRecs:H keepEmptyBuckets:B x")

BUCKET = Layout("OBR::MemPool::Bucket",
                "parent:Q next1:Q prev1:Q next2:Q prev2:Q size:H recSize:H freeHead:H numFree:H")

EXT_REC = Layout("OBR::MemPool::ExtRec", "next:Q prev:Q length:I hdr:4s")

REC_HDR = Layout("OBR::MemPool::RecHdr", "link:H type:B guard:B")

BASE_DISTANCE = 46  # From a bucket's address to recsBase, from which offsets count.
FIRST_OFFSET = 2  # Of a bucket's first record.
MAX_BUCKET_SIZE = 65535
MAX_ALLOC_SIZE = 0x3FFFFFFF

TYPE_FREE, TYPE_USED, TYPE_EXT, TYPE_UNKNOWN = 0, 1, 2, 0xFF
KIND_NAMES = {TYPE_FREE: "FREE", TYPE_USED: "USED", TYPE_EXT: "EXT"}
EXT_HDR = bytes([0xAA, 0xBB, TYPE_EXT, 0xCC])


def kind_name(rec_type):
    return KIND_NAMES.get(rec_type, "UNKN")


def round_up(value, multiple):
    """The smallest multiple that is at least `value`, but never 0."""
    return (max(value, 1) + multiple - 1) // multiple * multiple
