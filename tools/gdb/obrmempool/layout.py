"""The memory format, in one place: every size and offset that the other files rely on.

A Layout is a struct of the library. Its fields are told as (name, offset, code), the code as in the
module struct; all is little-endian and pointers have 64 bits. The std::string and the std::map are
those of libstdc++.
"""

import collections
import struct


class Layout:
    def __init__(self, cxx_name, size, *fields):
        form, at = "<", 0
        for _, offset, code in fields:
            form += f"{offset - at}x{code}"
            at = offset + struct.calcsize("<" + code)
        self.cxx_name = cxx_name
        self.fields = fields
        self.size = size
        self.form = struct.Struct(form + f"{size - at}x")
        self.row = collections.namedtuple("Row", [name for name, _, _ in fields])

    def parse(self, data):
        return self.row._make(self.form.unpack_from(data))


STRING = Layout("std::string", 32, ("text", 0, "Q"), ("length", 8, "Q"))

# The registry is a std::map of names to pools, then a std::vector of handles, the sharers. What is
# the map's is the end of its tree, a node without name and pool.
REGISTRY = Layout(
    "OBR::MemPool::MgrRegistry", 72,
    ("root", 16, "Q"),
    ("first", 24, "Q"),
    ("last", 32, "Q"),
    ("count", 40, "Q"),
    ("sharers", 48, "Q"),
    ("sharersEnd", 56, "Q"))
TREE_END = 8  # Where that node stands in the registry.

NODE = Layout(
    "a node of the tree", 72,
    ("parent", 8, "Q"),
    ("left", 16, "Q"),
    ("right", 24, "Q"),
    ("name", 32, "32s"),
    ("pool", 64, "Q"))

POOL = Layout(
    "OBR::MemPool::BucketMgr", 88,
    ("name", 0, "32s"),
    ("mgr", 32, "Q"),
    ("groups", 40, "Q"),
    ("extRecs", 48, "Q"),
    ("numGroups", 56, "I"),
    ("numExtRecs", 60, "I"),
    ("bucketSize", 64, "I"),
    ("dataAlignment", 68, "I"),
    ("maxRecordSize", 72, "I"),
    ("minRecordSize", 76, "I"),
    ("keepEmptyBuckets", 80, "B"),
    ("enabled", 81, "B"),
    ("fastMax", 82, "H"),
    ("skippedSteps", 84, "h"),
    ("alignmentShift", 86, "B"))

GROUP = Layout(
    "OBR::MemPool::Group", 48,
    ("parent", 0, "Q"),
    ("head", 8, "Q"),
    ("tail", 16, "Q"),
    ("freeBuckets", 24, "Q"),
    ("numBuckets", 32, "I"),
    ("numFreeBuckets", 36, "I"),
    ("recDataSize", 40, "H"),
    ("bucketSize", 42, "H"),
    ("totalRecs", 44, "H"),
    ("keepEmptyBuckets", 46, "B"))

BUCKET = Layout(
    "OBR::MemPool::Bucket", 48,
    ("parent", 0, "Q"),
    ("next1", 8, "Q"),
    ("prev1", 16, "Q"),
    ("next2", 24, "Q"),
    ("prev2", 32, "Q"),
    ("size", 40, "H"),
    ("recSize", 42, "H"),
    ("freeHead", 44, "H"),
    ("numFree", 46, "H"))

EXT_REC = Layout(
    "OBR::MemPool::ExtRec", 24,
    ("next", 0, "Q"),
    ("prev", 8, "Q"),
    ("length", 16, "I"),
    ("hdr", 20, "4s"))

REC_HDR = Layout(
    "OBR::MemPool::RecHdr", 4,
    ("link", 0, "H"),
    ("type", 2, "B"),
    ("guard", 3, "B"))

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
