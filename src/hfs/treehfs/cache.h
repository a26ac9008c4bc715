// What the cache offers to the engine besides the public node operations.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// The node a link of the tree of cached nodes, or of the modified list, belongs to.
inline HfsNode* NodeOf(rb_node* link) {
    return reinterpret_cast<HfsNode*>(link);
}
inline HfsNode* NodeOfModified(list_head* link) {
    return reinterpret_cast<HfsNode*>(reinterpret_cast<u8*>(link) -
                                      offsetof(HfsNode, modifiedLink));
}

// Links `node` into the tree of cached nodes by its number. False: the number is there already.
bool LinkNode(CBTreeHfs* tree, HfsNode* node);

// Takes a node whose references are gone out of the cache: count, tree, modified list, blocks,
// heap. Unsaved changes are lost.
void DiscardNode(CBTreeHfs* tree, HfsNode* node);

// The full release: drops one reference and discards the node when none remains.
void DropNode(CBTreeHfs* tree, HfsNode* node);

bool HasDirtyBlock(const BTHeaderMem* hdr, const HfsNode* node);

}  // namespace VELK
