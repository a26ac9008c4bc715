// How the engine comes to nodes: from an index node down to a child, or from a node to its
// neighbour, by a hint where there is one, else by the tree of cached nodes.
#pragma once

#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/prefetch.h"

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
inline HintedWay WayDown(const CBTreeHfs* tree, HfsNode* parent, u32 index) {
    if (parent->hints == nullptr) {
        return {};
    }
    const Hints hints(tree, parent);
    HfsNode* child = hints.Child(index);
    return {parent, index, child, child != nullptr ? hints.Data(index) : nullptr};
}
// The way to a neighbour of `node` that has the same parent, as far as a hint leads to `node`.
HintedWay WayBeside(const CBTreeHfs* tree, HfsNode* node, Side side);

// What an index node remembers is searched first: asked for with the node itself, all that most
// nodes have. Where an index node's hints begin follows from where it lies itself.
[[gnu::always_inline]] inline void PrefetchHints(const CBTreeHfs* tree, const HfsNode* node) {
    constexpr u32 kUsualShare = 16;  // of the room, a sixteenth each
    constexpr u32 kUsual = 7;
    Prefetch(reinterpret_cast<const u8*>(node) + HintsOffset(tree),
             HintRoom(tree) * kUsual / kUsualShare * u32{sizeof(HfsHint)});
}

// A request met by a hint. What will be needed is asked for all at once, as each may be cold: the
// node's block entries, its descriptor, its offset table, and its hints.
inline void TakeHinted(CBTreeHfs* tree, const HintedWay& way, NodeUse use, HfsNode** out) {
    __builtin_prefetch(&way.node->bufs[0]);
    __builtin_prefetch(way.data);
    if (use == NodeUse::kReadIndex) {
        PrefetchHints(tree, way.node);
        PrefetchTail(tree->header, way.data, 2);
    } else {
        PrefetchTail(tree->header, way.data, 1);
    }
    TakeCached(tree, way.node, out);
}

// Requests a node that no hint leads to, and makes record `index` of `parent`, if there is one,
// lead there from now on.
int FetchAndHint(CBTreeHfs* tree, HfsNode* parent, u32 index, u32 nodeNum, NodeUse use,
                 HfsNode** out);
// Requests node `nodeNum`, as FetchNode does. The way may turn out to lead elsewhere.
inline int FetchByWay(CBTreeHfs* tree, const HintedWay& way, u32 nodeNum, NodeUse use,
                      HfsNode** out) {
    if (HFS_LIKELY(way.node != nullptr && way.node->nodeNum == nodeNum)) {
        TakeHinted(tree, way, use, out);
        return kOk;
    }
    return FetchAndHint(tree, way.parent, way.index, nodeNum, use, out);
}
// Requests the node that `node` links to on one side. REQUIRES: there is such a link.
int FetchSibling(CBTreeHfs* tree, HfsNode* node, Side side, HfsNode** out);
// Asks for what the removal of `node` from the tree of cached nodes will meet first.
void PrefetchLinks(const HfsNode* node);
// Asks for the memory of the neighbour of `node`, if a hint leads there.
void PrefetchSibling(const CBTreeHfs* tree, HfsNode* node, Side side);

}  // namespace VELK
