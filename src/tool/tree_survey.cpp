// See tree_survey.h.
#include "tool/tree_survey.h"

#include <algorithm>

#include "tool/node_reader.h"

namespace VELK::tool {

namespace {

// Appends the bytes of the map record of `node` (record 2 of node 0, record 0 of a map node).
void AppendMapRecord(const CBTreeHfs& tree, const HeldNode& node, std::vector<u8>* map) {
    const u32 from = node.Number() == 0 ? kHeadMapRecord : kDescSize;
    const u32 to = tree.header.nodeSize - (node.Number() == 0 ? kHeadSlotsSize : kMapNodeTail);
    const std::size_t before = map->size();
    map->resize(before + (to - from));
    node.Bytes().CopyOut(map->data() + before, from, to - from);
}

NodeState StateOf(const HeldNode& node) {
    switch (node.Kind()) {
        case kBTLeafNode:
            return NodeState::kLeaf;
        case kBTIndexNode:
            return NodeState::kIndex;
        case kBTHeaderNode:
            return NodeState::kHeader;
        case kBTMapNode:
            return NodeState::kMap;
        default:
            return NodeState::kUnreadable;
    }
}

}  // namespace

TreeSurveyor::TreeSurveyor(CBTreeHfs* tree) : tree_(tree) {
    survey_.fileId = tree->fileId;
    survey_.nodeSize = tree->header.nodeSize;
    survey_.depth = tree->header.treeDepth;
    survey_.rootNode = tree->header.rootNode;
    survey_.leafRecords = tree->header.leafRecords;
    survey_.nodes.resize(tree->header.totalNodes);
    survey_.levelCounts.resize(kMaxOpenDepth + 1);
    next_.resize(tree->header.totalNodes);
    HeldNode node(tree);
    if (node.Open(0) == 0) {
        AppendMapRecord(*tree, node, &map_);
    }
    for (const u32 number : MapNodes(tree)) {
        if (node.Open(number) == 0) {
            AppendMapRecord(*tree, node, &map_);
        }
    }
}

bool TreeSurveyor::IsUsed(u32 nodeNum) const {
    return nodeNum / 8 < map_.size() && (map_[nodeNum / 8] & (0x80 >> nodeNum % 8)) != 0;
}

void TreeSurveyor::Look(u32 nodeNum) {
    NodeFacts* facts = &survey_.nodes[nodeNum];
    if (!IsUsed(nodeNum)) {
        return;
    }
    HeldNode node(tree_);
    if (node.Open(nodeNum) != 0) {
        facts->state = NodeState::kUnreadable;
        return;
    }
    facts->state = StateOf(node);
    facts->height = static_cast<u8>(std::min<u32>(node.Height(), kMaxOpenDepth));
    facts->records = static_cast<u16>(node.RecordCount());
    const u32 used = tree_->header.nodeSize - std::min(node.FreeBytes(), tree_->header.nodeSize);
    facts->fillPermille = static_cast<u16>(u64{used} * 1000 / tree_->header.nodeSize);
    if (facts->state == NodeState::kLeaf || facts->state == NodeState::kIndex) {
        survey_.levelCounts[facts->height] += 1;
        next_[nodeNum] = node.FLink();
    }
}

// The chain of leaves, as far as it leads over leaves not met before.
void TreeSurveyor::FollowLeaves() {
    std::vector<bool> met(survey_.nodes.size());
    u32 number = tree_->header.firstLeafNode;
    while (number != 0 && number < survey_.nodes.size() && !met[number] &&
           survey_.nodes[number].state == NodeState::kLeaf) {
        met[number] = true;
        survey_.leaves.push_back(number);
        number = next_[number];
    }
}

TreeSurvey TreeSurveyor::Finish() {
    FollowLeaves();
    return std::move(survey_);
}

}  // namespace VELK::tool
