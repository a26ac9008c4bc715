// What the cache offers to the engine besides the public node operations.
#pragma once

#include "hfs/treehfs.h"
#include "hfs/treehfs/report.h"

namespace VELK {

// The node a link of the tree of cached nodes, or of the modified list, belongs to.
inline HfsNode* NodeOf(rb_node* link) {
    return reinterpret_cast<HfsNode*>(link);
}
inline HfsNode* NodeOfModified(list_head* link) {
    return reinterpret_cast<HfsNode*>(reinterpret_cast<u8*>(link) -
                                      offsetof(HfsNode, modifiedLink));
}

// Takes one more reference on a cached node that a request met.
inline void CountHit(CBTreeHfs* tree, HfsNode* node) {
    tree->hitCount += 1;
    HFS_ASSERT(node->refCount <= 2, 2610);
}
inline void TakeReference(HfsNode* node) {
    node->refCount = node->refCount > 0 ? node->refCount + 1 : 1;
}

// A request met by a node known to be cached.
inline void TakeCached(CBTreeHfs* tree, HfsNode* node, HfsNode** out) {
    CountHit(tree, node);
    TakeReference(node);
    *out = node;
}

// What a node is requested for. An index node gets room for hints in its heap block, which has to
// be known before the node is read.
enum class NodeUse {
    kRead,
    kReadIndex,
    kEmpty,  // to be built from scratch
    kEmptyIndex,
};
int FetchNode(CBTreeHfs* tree, u32 nodeNum, NodeUse use, HfsNode** out);

// Links `node` into the tree of cached nodes by its number. False: the number is there already.
bool LinkNode(CBTreeHfs* tree, HfsNode* node);
// Takes a linked node out of it.
void UnlinkNode(CBTreeHfs* tree, HfsNode* node);
// Takes `node` out of the tree of cached nodes and puts it back under its number, which decides in
// what order a volume gets blocks back in the end. False: another node stands there and this one
// stays out.
bool RelinkNode(CBTreeHfs* tree, HfsNode* node);

// Takes a node whose references are gone out of the cache: count, tree, modified list, blocks,
// heap. Unsaved changes are lost.
void DiscardNode(CBTreeHfs* tree, HfsNode* node);

// The full release: drops one reference and discards the node when none remains.
void DropNode(CBTreeHfs* tree, HfsNode* node);

bool HasDirtyBlock(const BTHeaderMem* hdr, const HfsNode* node);

// Whether marking these bytes would change nothing: the node lies in one block, is marked, and is
// the last that was. A change marks its node several times in a row.
inline bool IsMarkedLast(const CBTreeHfs* tree, const HfsNode* node, u32 offset, u32 length) {
    return tree->header.blocksPerNode == 1 && offset < tree->header.blockSize &&
           static_cast<u64>(offset) + length <= tree->header.blockSize && node->bufs[0].dirty &&
           tree->modifiedList.prev == &node->modifiedLink;
}
// What SetDirty does for the engine's own changes: it keeps the books of what nodes remember
// itself.
int MarkBytes(CBTreeHfs* tree, HfsNode* node, u32 offset, u32 length);
// The same without a call where there is nothing to do.
inline int MarkDirty(CBTreeHfs* tree, HfsNode* node, u32 offset, u32 length) {
    return IsMarkedLast(tree, node, offset, length) ? kOk : MarkBytes(tree, node, offset, length);
}
inline int MarkDirty(CBTreeHfs* tree, HfsNode* node, u32 offset) {
    return MarkDirty(tree, node, offset, 0);
}

}  // namespace VELK
