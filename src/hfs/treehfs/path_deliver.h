// Key and record at a position, delivered to a caller's buffers in host form.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Locates record `index` and its key in one piece, fit to be compared or converted.
int FetchKey(CBTreeHfs* tree, const HfsNode* node, int index, NodeKey* record,
             const BTreeKey** key);

// Converts the first `size` bytes of a record's data into `target`.
int DeliverData(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, void* target,
                u32 size);

// Converts the first `size` bytes of a key into `target`.
void DeliverKey(const CBTreeHfs* tree, const BTreeKey* key, void* target, u32 size);

}  // namespace VELK
