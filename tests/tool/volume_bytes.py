"""Small volumes, built byte by byte without the tool: what its answers are compared with, and what
is damaged on purpose."""

import struct

BLOCK = 4096
NODE = 4096
DATE = 0xE0000000  # 2023-02-01 11:39:44


def node(kind, height, records, flink=0, blink=0, size=NODE):
    """A node of whole records, in order."""
    out = bytearray(size)
    struct.pack_into(">IIbBHH", out, 0, flink, blink, kind, height, len(records), 0)
    at = 14
    for i, record in enumerate(records):
        struct.pack_into(">H", out, size - 2 * (i + 1), at)
        out[at:at + len(record)] = record
        at += len(record)
    struct.pack_into(">H", out, size - 2 * (len(records) + 1), at)
    return bytes(out)


def header_node(depth, root, records, first, last, total, used, size=NODE, max_key=516,
                attributes=6, compare=0xCF):
    head = struct.pack(">HIIIIHHIIHIBBI64x", depth, root, records, first, last, size, max_key,
                       total, total - used, 0, 4096, 0, compare, attributes)
    bits = bytearray(size - 256)
    for i in range(used):
        bits[i // 8] |= 0x80 >> i % 8
    return node(1, 0, [head, bytes(128), bytes(bits)], size=size)


def units(name):
    raw = name.encode("utf-16-be", "surrogatepass")
    return struct.pack(">H", len(raw) // 2) + raw


def catalog_key(parent, name):
    body = struct.pack(">I", parent) + units(name)
    return struct.pack(">H", len(body)) + body


def folder(parent, name, folder_id, valence):
    data = struct.pack(">HHII5I", 1, 0, valence, folder_id, DATE, DATE, DATE, DATE, 0)
    return catalog_key(parent, name) + data + bytes(88 - len(data))


def fork(size, extents):
    out = struct.pack(">QII", size, 0, sum(count for _, count in extents))
    for start, count in extents:
        out += struct.pack(">II", start, count)
    return out + bytes(80 - len(out))


def file(parent, name, file_id, size=0, extents=(), mode=0o100644, kind=b"", special=0):
    data = struct.pack(">HHII5I", 2, 2, 0, file_id, DATE, DATE, DATE, DATE, 0)
    data += struct.pack(">IIBBHI", 99, 99, 0, 0, mode, special)
    data += kind + bytes(32 - len(kind)) + bytes(8)
    return catalog_key(parent, name) + data + fork(size, extents) + fork(0, ())


def thread(item_id, parent, name, is_file=False):
    data = struct.pack(">HHI", 4 if is_file else 3, 0, parent) + units(name)
    return catalog_key(item_id, "") + data


def extents_record(file_id, fork_type, start, extents):
    key = struct.pack(">HBBII", 10, fork_type, 0, file_id, start)
    data = b"".join(struct.pack(">II", s, c) for s, c in extents)
    return key + data + bytes(64 - len(data))


def empty_tree(total=1, max_key=10, attributes=2, compare=0):
    return [header_node(0, 0, 0, 0, 0, total, 1, max_key=max_key, attributes=attributes,
                        compare=compare)] + [bytes(NODE)] * (total - 1)


def leaf_tree(leaves, total=None, max_key=516, attributes=6, compare=0xCF):
    """A tree whose leaves hold these lists of records; with an index node above several."""
    count = sum(len(records) for records in leaves)
    nodes = []
    last = len(leaves)
    for i, records in enumerate(leaves, 1):
        nodes.append(node(-1, 1, records, flink=i + 1 if i < last else 0, blink=i - 1))
    depth, root = 1, 1
    if last > 1:
        index = []
        for i, records in enumerate(leaves, 1):
            key_size = struct.unpack(">H", records[0][:2])[0] + 2
            index.append(records[0][:key_size] + struct.pack(">I", i))
        nodes.append(node(0, 2, index))
        depth, root = 2, last + 1
    used = len(nodes) + 1
    total = total or used
    head = header_node(depth, root, count, 1, last, total, used, max_key=max_key,
                       attributes=attributes, compare=compare)
    return [head] + nodes + [bytes(NODE)] * (total - used)


# The catalog of the small volume: (parent, name) in key order.
def plain_leaves():
    return [
        [folder(1, "Vol", 2, 4), thread(2, 1, "Vol"), file(2, "alpha", 16, 5, [(20, 1)]),
         folder(2, "beta", 17, 1), file(2, "gamma", 18, 70000, [(21, 18)]),
         file(2, "link", 19, 5, [(39, 1)], mode=0o120755, kind=b"slnkrhap")],
        [thread(16, 2, "alpha", True), thread(17, 2, "beta"), file(17, "inner", 20),
         thread(18, 2, "gamma", True), thread(19, 2, "link", True),
         thread(20, 17, "inner", True)],
    ]


CATALOG_BLOCK = 4
EXTENTS_BLOCK = 2
BLOCKS = 64


def volume(catalog=None, extents=None, blocks=BLOCKS, signature=b"H+", version=4,
           block_size=BLOCK, attributes=0x100, files=4, folders=1):
    """The bytes of a volume: header, bitmap, extents tree at block 2, catalog from block 4 on."""
    catalog = catalog or leaf_tree(plain_leaves())
    extents = extents or empty_tree()
    out = bytearray(blocks * BLOCK)
    head = struct.pack(">2sHI4sIIIII", signature, version, attributes, b"10.0", 0, DATE, DATE, 0,
                       0)
    head += struct.pack(">IIIII", files, folders, block_size, blocks, blocks - 40)
    head += struct.pack(">IIIIIQ", 0, 65536, 65536, 100, 1, 1) + bytes(32)
    head += fork(BLOCK, [(1, 1)])
    head += fork(len(extents) * NODE, [(EXTENTS_BLOCK, len(extents))])
    head += fork(len(catalog) * NODE, [(CATALOG_BLOCK, len(catalog))])
    head += fork(0, ()) + fork(0, ())
    assert len(head) == 512
    out[1024:1536] = head
    out[-1024:-512] = head
    for i in range(40):
        out[BLOCK + i // 8] |= 0x80 >> i % 8
    out[BLOCK + (blocks - 1) // 8] |= 0x80 >> (blocks - 1) % 8
    for i, piece in enumerate(extents):
        out[(EXTENTS_BLOCK + i) * BLOCK:(EXTENTS_BLOCK + i) * BLOCK + NODE] = piece
    for i, piece in enumerate(catalog):
        out[(CATALOG_BLOCK + i) * BLOCK:(CATALOG_BLOCK + i) * BLOCK + NODE] = piece
    return bytes(out)


def mbr(partitions, sectors):
    """A partition table of (first sector, sectors, type)."""
    out = bytearray(512)
    for i, (first, count, kind) in enumerate(partitions):
        struct.pack_into("<B3sB3sII", out, 446 + 16 * i, 0, b"\0\0\0", kind, b"\0\0\0", first,
                         count)
    out[510:512] = b"\x55\xaa"
    return bytes(out) + bytes(sectors * 512 - 512)
