// Ways to nodes. See way.h.
#include "hfs/treehfs/way.h"

#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/node_search.h"
#include "hfs/treehfs/prefetch.h"

namespace VELK {

namespace {

// What an index node remembers is searched first: asked for with the node itself, all that most
// nodes have. Where an index node's hints begin follows from where it lies itself.
[[gnu::always_inline]] inline void PrefetchHints(const CBTreeHfs* tree, const HfsNode* node) {
    constexpr u32 kUsualShare = 16;  // of the room, a sixteenth each
    constexpr u32 kUsual = 7;
    Prefetch(reinterpret_cast<const u8*>(node) + HintsOffset(tree),
             HintRoom(tree) * kUsual / kUsualShare * u32{sizeof(HfsHint)});
}

// A request met by a hint. What will be needed is asked for all at once, as each may be cold: the
// node's block entries, its descriptor, and its offset table or its hints.
void TakeHinted(CBTreeHfs* tree, const HintedWay& way, NodeUse use, HfsNode** out) {
    __builtin_prefetch(&way.node->bufs[0]);
    __builtin_prefetch(way.data);
    if (use == NodeUse::kReadIndex) {
        PrefetchHints(tree, way.node);
    } else {
        __builtin_prefetch(way.data + tree->header.blockSize - kCacheLine);
    }
    TakeCached(tree, way.node, out);
}

int FetchRoot(CBTreeHfs* tree, NodeUse use, HfsNode** out) {
    HfsNode* root = tree->rootHint;
    if (root != nullptr && root->nodeNum == tree->header.rootNode) {
        TakeCached(tree, root, out);
        return kOk;
    }
    const int status = FetchNode(tree, tree->header.rootNode, use, out);
    if (status == kOk) {
        tree->rootHint = *out;
    }
    return status;
}

// The way to record `index` of a node that has room for hints.
HintedWay WayBy(const CBTreeHfs* tree, HfsNode* parent, u32 index) {
    const Hints hints(tree, parent);
    HfsNode* child = hints.Child(index);
    return {parent, index, child, child != nullptr ? hints.Data(index) : nullptr};
}

// Number of the neighbour; 0: there is none.
u32 LinkOn(const HfsNode* node, Side side) {
    return side == Side::kRight ? FLink(node) : BLink(node);
}

}  // namespace

HintedWay WayDown(const CBTreeHfs* tree, HfsNode* parent, u32 index) {
    return parent->hints != nullptr ? WayBy(tree, parent, index) : HintedWay{};
}

HintedWay WayBeside(const CBTreeHfs* tree, HfsNode* node, Side side) {
    HfsNode* parent = node->hintedBy;
    if (parent == nullptr) {
        return {};
    }
    const u32 own = Hints(tree, parent).IndexOf(node);
    if (side == Side::kLeft && own == 0) {
        return {};
    }
    return WayBy(tree, parent, side == Side::kLeft ? own - 1 : own + 1);
}

int FetchByWay(CBTreeHfs* tree, const HintedWay& way, u32 nodeNum, NodeUse use, HfsNode** out) {
    if (way.node != nullptr && way.node->nodeNum == nodeNum) {
        TakeHinted(tree, way, use, out);
        return kOk;
    }
    if (way.parent == nullptr && nodeNum == tree->header.rootNode) {
        return FetchRoot(tree, use, out);
    }
    const int status = FetchNode(tree, nodeNum, use, out);
    if (status == kOk && way.parent != nullptr &&
        PlainChild(&tree->header, way.parent, static_cast<s32>(way.index)) == nodeNum) {
        Hints(tree, way.parent).SetChild(way.index, *out);
    }
    return status;
}

int FetchSibling(CBTreeHfs* tree, HfsNode* node, Side side, HfsNode** out) {
    return FetchByWay(tree, WayBeside(tree, node, side), LinkOn(node, side), NodeUse::kRead, out);
}

void PrefetchForStep(const CBTreeHfs* tree, HfsNode* node, Side side) {
    __builtin_prefetch(node->link.Parent());
    __builtin_prefetch(node->link.left);
    __builtin_prefetch(node->link.right);
    const HintedWay way = WayBeside(tree, node, side);
    if (way.node != nullptr) {
        __builtin_prefetch(way.node);
        __builtin_prefetch(&way.node->bufs[0]);
        __builtin_prefetch(way.data);
        __builtin_prefetch(way.data + tree->header.blockSize - kCacheLine);
    }
}

}  // namespace VELK
