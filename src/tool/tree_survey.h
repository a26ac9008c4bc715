// Every node of a tree file at a glance: what it is and how full, in a few bytes each.
#pragma once

#include <vector>

#include "hfs/treehfs.h"

namespace VELK::tool {

enum class NodeState : u8 { kFree, kHeader, kMap, kIndex, kLeaf, kUnreadable };

struct NodeFacts {
    NodeState state = NodeState::kFree;
    u8 height = 0;
    u16 records = 0;
    u16 fillPermille = 0;  // part of the node's bytes in use, in thousandths
};

struct TreeSurvey {
    u32 fileId = 0;
    u32 nodeSize = 0;
    u32 depth = 0;
    u32 rootNode = 0;
    u32 leafRecords = 0;
    std::vector<NodeFacts> nodes;  // by number
    std::vector<u32> leaves;       // numbers in key order
    std::vector<u64> levelCounts;  // nodes of level i at [i]; [0] unused
};

// Reads the map, then each node that it says is in use, one a call. A node that cannot be read, or
// is of no kind a tree holds, is marked and passed over.
class TreeSurveyor {
public:
    explicit TreeSurveyor(CBTreeHfs* tree);
    u32 NodeCount() const { return static_cast<u32>(survey_.nodes.size()); }
    void Look(u32 nodeNum);
    TreeSurvey Finish();

private:
    bool IsUsed(u32 nodeNum) const;
    void FollowLeaves();

    CBTreeHfs* tree_;
    std::vector<u8> map_;
    std::vector<u32> next_;  // forward link by node, leaves only
    TreeSurvey survey_;
};

constexpr u32 kSurveyStride = 512;  // nodes between two calls of `trim`

// Looks at every node; `trim` is called now and then, to keep memory low and show progress.
template <typename Trim>
TreeSurvey SurveyTree(CBTreeHfs* tree, Trim trim) {
    TreeSurveyor surveyor(tree);
    for (u32 node = 0; node < surveyor.NodeCount(); ++node) {
        surveyor.Look(node);
        if (node % kSurveyStride == 0) {
            trim();
        }
    }
    return surveyor.Finish();
}

}  // namespace VELK::tool
