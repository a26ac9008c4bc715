// Ways to nodes. See way.h.
#include "hfs/treehfs/way.h"

#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK {

namespace {

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

// Number of the neighbour; 0: there is none.
u32 LinkOn(const HfsNode* node, Side side) {
    return side == Side::kRight ? FLink(node) : BLink(node);
}

}  // namespace

HintedWay WayBeside(const CBTreeHfs* tree, HfsNode* node, Side side) {
    HfsNode* parent = node->hintedBy;
    if (parent == nullptr) {
        return {};
    }
    const u32 own = Hints(tree, parent).IndexOf(node);
    if (side == Side::kLeft && own == 0) {
        return {};
    }
    return WayDown(tree, parent, side == Side::kLeft ? own - 1 : own + 1);
}

int FetchAndHint(CBTreeHfs* tree, HfsNode* parent, u32 index, u32 nodeNum, NodeUse use,
                 HfsNode** out) {
    if (parent == nullptr && nodeNum == tree->header.rootNode) {
        return FetchRoot(tree, use, out);
    }
    const int status = FetchNode(tree, nodeNum, use, out);
    if (status == kOk && parent != nullptr &&
        PlainChild(tree, parent, static_cast<s32>(index)) == nodeNum) {
        Hints(tree, parent).SetChild(index, *out);
    }
    return status;
}

int FetchSibling(CBTreeHfs* tree, HfsNode* node, Side side, HfsNode** out) {
    return FetchByWay(tree, WayBeside(tree, node, side), LinkOn(node, side), NodeUse::kRead, out);
}

void PrefetchLinks(const HfsNode* node) {
    __builtin_prefetch(node->link.Parent());
    __builtin_prefetch(node->link.left);
    __builtin_prefetch(node->link.right);
}

void PrefetchSibling(const CBTreeHfs* tree, HfsNode* node, Side side) {
    const HintedWay way = WayBeside(tree, node, side);
    if (way.node != nullptr) {
        __builtin_prefetch(way.node);
        __builtin_prefetch(&way.node->bufs[0]);
        __builtin_prefetch(way.data);
        PrefetchTail(tree->header, way.data, 1);
    }
}

}  // namespace VELK
