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

}  // namespace VELK
