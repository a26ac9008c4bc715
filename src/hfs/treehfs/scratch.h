// The tree's scratch buffer: nodeSize bytes, keys at `scratch`, data at its upper half.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Makes sure the buffer is there; a teardown in between may have freed it. kErrNoMemory,
// unreported.
int EnsureScratch(CBTreeHfs* tree);

// Where `size` bytes of data that straddle blocks are gathered: the upper half, or the whole buffer
// when they would not fit there (the key has left it by then). Null: longer than a node.
u8* DataScratch(CBTreeHfs* tree, u32 size);

// A copy of the key of a record in `scratch`. Statuses of GatherKey.
int CopyKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key);

// The key of a record in one piece: in place, or gathered into `scratch` (site 262). kErrNoMemory
// when there is no scratch buffer, kErrCorrupt (unreported) when the key does not fit it.
int GatherKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key);

// Fixed part of the keys a comparator reads, and where their ID and their name length stand (0: no
// name).
struct KeyShape {
    u32 fixed;
    u32 id;
    u32 nameLength;
};

// False: a comparator this engine does not know.
bool ShapeOf(CompareKeysFn compare, KeyShape* shape);

// Refuses a node key that a comparator or converter could not read safely: longer than any key,
// shorter than its kind's fixed part, or a name that runs past the key. Chosen by the tree's own
// comparator; keys of a foreign comparator pass. True: the key may be used.
bool NodeKeyIsSound(const CBTreeHfs* tree, const BTreeKey* key, u32 keySize);

}  // namespace VELK
