// On-disk numbers of HFS+ B-trees (HFS+ volume format), each stated once. Integers are big-endian.
//
// A node is nodeSize bytes (a power of two, 512 to 32768). Records grow up, their offset table
// grows down, free space lies between:
//
//   0              14                                                                     nodeSize
//   +--------------+----------+----------+---------------+-------+----------+----------+
//   | descriptor   | record 0 | record 1 |  free space   | free  | offset 1 | offset 0 |
//   +--------------+----------+----------+---------------+-------+----------+----------+
//                                                          ^ slot of record numRecords
//
// Slot i (2 bytes at nodeSize - 2(i + 1)) holds the start of record i; slot numRecords holds the
// start of free space. Record i is [slot i, slot i + 1). Record 0 starts at 14, so the last two
// bytes of a node in use are 00 0E.
//
// Node 0 is the header node:
//
//   0            14               120              248                nodeSize - 8       nodeSize
//   +------------+----------------+----------------+-------------------+---------------------+
//   | descriptor | header record  | user data      | map record        | 4 slots             |
//   +------------+----------------+----------------+-------------------+---------------------+
#pragma once

#include "platform/types.h"

namespace VELK {

// Node descriptor.
constexpr u32 kDescFLink = 0;        // u32: next node of the same level, 0 = none
constexpr u32 kDescBLink = 4;        // u32: previous node
constexpr u32 kDescKind = 8;         // s8: kBT...Node
constexpr u32 kDescHeight = 9;       // u8: 1 = leaf
constexpr u32 kDescNumRecords = 10;  // u16
constexpr u32 kDescReserved = 12;    // u16: 0
constexpr u32 kDescSize = 14;        // record 0 starts here
constexpr u32 kSlotSize = 2;         // one entry of the offset table

// Kinds of nodes, as the descriptor holds them.
constexpr s8 kBTLeafNode = -1;   // records: key and data
constexpr s8 kBTIndexNode = 0;   // records: key and child's node number
constexpr s8 kBTHeaderNode = 1;  // node 0
constexpr s8 kBTMapNode = 2;     // goes on with the map of node 0

// Header record (record 0 of node 0), as offsets in the node.
constexpr u32 kHeadTreeDepth = 14;       // u16
constexpr u32 kHeadRootNode = 16;        // u32
constexpr u32 kHeadLeafRecords = 20;     // u32
constexpr u32 kHeadFirstLeafNode = 24;   // u32
constexpr u32 kHeadLastLeafNode = 28;    // u32
constexpr u32 kHeadNodeSize = 32;        // u16
constexpr u32 kHeadMaxKeyLength = 34;    // u16
constexpr u32 kHeadTotalNodes = 36;      // u32
constexpr u32 kHeadFreeNodes = 40;       // u32
constexpr u32 kHeadReserved = 44;        // u16: 0
constexpr u32 kHeadClumpSize = 46;       // u32, not 4-aligned
constexpr u32 kHeadBtreeType = 50;       // u8
constexpr u32 kHeadKeyCompareType = 51;  // u8
constexpr u32 kHeadAttributes = 52;      // u32
constexpr u32 kHeadEnd = 120;            // the user data record starts here
constexpr u32 kHeadMapRecord = 248;      // the map record starts here
constexpr u32 kHeadMapIndex = 2;         // its record index in node 0
constexpr u32 kHeadSlotsSize = 8;        // offset table of node 0
constexpr u32 kHeadNumRecords = 3;       // records of node 0

static_assert(kHeadTreeDepth == kDescSize);
static_assert(kHeadMapRecord == kHeadEnd + 128);

// Map nodes: one record from 14 to nodeSize - 6.
constexpr u32 kMapNodeTail = 6;  // bytes behind it
constexpr u32 kHeadMapOverhead =
    kHeadMapRecord + kHeadSlotsSize;                        // bytes of node 0 that are no map
constexpr u32 kMapNodeOverhead = kDescSize + kMapNodeTail;  // bytes of a map node that are no map
static_assert(kHeadMapOverhead == 256 && kMapNodeOverhead == 20);

constexpr u32 kBTBigKeysMask = 2;            // key lengths are 16 bits wide
constexpr u32 kBTVariableIndexKeysMask = 4;  // index keys have their own length
constexpr u8 kKeyCompareBinary = 0xBC;       // names by their code units; HFSX only
constexpr u8 kKeyCompareFolding = 0xCF;      // names regardless of case

constexpr u32 kMinNodeShift = 9;    // log2 of the least node size, 512 bytes
constexpr u32 kMaxNodeShift = 15;   // log2 of the greatest node size, 32,768 bytes
constexpr u32 kMaxOpenDepth = 16;   // a header may claim this much and still opens
constexpr u32 kMaxPathDepth = 15;   // levels a search path can hold
constexpr u32 kMaxKeyLength = 520;  // of any key the engine accepts, without its length field
constexpr u32 kChildSize = 4;       // data of an index record: the child's node number

// Catalog node IDs of the special files.
constexpr u32 kExtentsFileId = 3;
constexpr u32 kCatalogFileId = 4;
constexpr u32 kBadBlockFileId = 5;
constexpr u32 kAllocationFileId = 6;
constexpr u32 kStartupFileId = 7;
constexpr u32 kAttributesFileId = 8;

// Versions in the volume header.
constexpr u16 kVersionHfsPlus = 4;
constexpr u16 kVersionHfsx = 5;

// Keys. The layout is the same in host order (search keys) and big-endian (keys in nodes); offsets
// count the key length field, which holds the number of bytes after itself.

constexpr u32 kKeyLengthSize = 2;  // bytes of that field, u16

// Catalog key: where its fields stand, and what they are.
constexpr u32 kCatKeyParentId = 2;    // u32
constexpr u32 kCatKeyNameLength = 6;  // u16: UTF-16 code units
constexpr u32 kCatKeyName = 8;        // u16[]: the name
constexpr u32 kCatKeyFixed = 6;       // least key length

// Extents key: where its fields stand, and what they are.
constexpr u32 kExtKeyForkType = 2;    // u8: 0 data, 0xFF resource
constexpr u32 kExtKeyPad = 3;         // u8
constexpr u32 kExtKeyFileId = 4;      // u32
constexpr u32 kExtKeyStartBlock = 8;  // u32
constexpr u32 kExtKeyFixed = 10;      // the one key length there is
constexpr u32 kExtKeySize = 12;       // with its length field

// Attributes key: where its fields stand, and what they are.
constexpr u32 kAttrKeyPad = 2;          // u16
constexpr u32 kAttrKeyFileId = 4;       // u32
constexpr u32 kAttrKeyStartBlock = 8;   // u32
constexpr u32 kAttrKeyNameLength = 12;  // u16
constexpr u32 kAttrKeyName = 14;        // u16[]: the name
constexpr u32 kAttrKeyFixed = 12;       // least key length

// Greatest key length of each tree, without the length field: what its header's maxKeyLength holds.
constexpr u32 kCatMaxKeyLength = 516;
constexpr u32 kExtMaxKeyLength = 10;
constexpr u32 kAttrMaxKeyLength = 266;

constexpr u32 kExtentCount = 8;        // descriptors of an extent record
constexpr u32 kExtentRecordSize = 64;  // bytes: start block and block count for each, u32
constexpr u8 kForkData = 0x00;         // fork type of an extents key: the data fork
constexpr u8 kForkResource = 0xFF;     // the resource fork

// A key as the comparators see it: bytes, the first two of which are the key length. Search keys
// are in host order and 4-byte aligned, node keys big-endian; only byte-wise access is made to
// either.
struct BTreeKey {
    u8 length[2];  // bytes that follow these two
};

// A catalog key in host order, with room for the longest name.
struct alignas(4) CatalogKey {
    u8 bytes[kKeyLengthSize + kCatMaxKeyLength + 2];  // fields at kCatKey...
};

}  // namespace VELK
