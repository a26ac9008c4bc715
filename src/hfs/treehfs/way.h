// How the engine comes to nodes: from an index node down to a child, or from a node to its
// neighbour, by a hint where there is one, else by the tree of cached nodes.
#pragma once

#include "hfs/treehfs/cache.h"

namespace VELK {

// Neighbours in the chain of a level.
enum class Side { kLeft, kRight };

// Which record of which index node leads to a node, and the node if that is hinted at.
struct HintedWay {
    HfsNode* parent = nullptr;  // null: no record is known to
    u32 index = 0;
    HfsNode* node = nullptr;
    const u8* data = nullptr;  // its first block
};

// The way down by record `index` of `parent`.
HintedWay WayDown(const CBTreeHfs* tree, HfsNode* parent, u32 index);
// The way to a neighbour of `node` that has the same parent, as far as a hint leads to `node`.
HintedWay WayBeside(const CBTreeHfs* tree, HfsNode* node, Side side);

// Requests node `nodeNum`, as FetchNode does. The way may turn out to lead elsewhere.
int FetchByWay(CBTreeHfs* tree, const HintedWay& way, u32 nodeNum, NodeUse use, HfsNode** out);
// Requests the node that `node` links to on one side. REQUIRES: there is such a link.
int FetchSibling(CBTreeHfs* tree, HfsNode* node, Side side, HfsNode** out);
// Asks for the memory of the neighbour of `node`, if a hint leads there, and for what the removal
// of `node` from the tree of cached nodes will meet first.
void PrefetchForStep(const CBTreeHfs* tree, HfsNode* node, Side side);

}  // namespace VELK
