// Builds whole valid tree files, header node, map nodes and all, without the engine.
//
// Node numbers: 0 header, then the leaves from left to right, then each index level from left to
// right up to the root, then the map nodes, then the free nodes.
#pragma once

#include "image_bytes.h"
#include "node_image.h"

namespace VELK::test {

struct TreeRecord {
    Bytes key;  // disk form, length field included, without the pad byte
    Bytes data;
};

struct TreeShape {
    u32 fileId = kCatalogFileId;
    u32 nodeSize = 512;
    u32 recordsPerLeaf = 0;    // 0: as many as fit
    u32 childrenPerIndex = 0;  // 0: as many as fit; 1 only above a single node
    u32 minDepth = 0;          // index nodes of one record are put above the root to get there
    u32 freeNodes = 8;         // free nodes at the end of the file
    u32 mapNodes = 0;          // more map nodes than the file needs
    u8 btreeType = 0;
    u8 keyCompareType = 0;
    u32 clumpSize = 0;
    u8 stale = 0;  // content of free nodes
};

struct TreeImage {
    TreeShape shape;
    Bytes bytes;
    u32 rootNode = 0;
    u32 depth = 0;
    u32 leafRecords = 0;
    u32 totalNodes = 0;
    u32 freeNodes = 0;
    std::vector<std::vector<u32>> levels;  // node numbers by level; levels[1]: leaves
    std::vector<u32> mapNodes;

    Bytes Node(u32 nodeNum) const;
    void SetNode(u32 nodeNum, const Bytes& node);
    // Overwrites big-endian numbers of one node.
    void Patch16(u32 nodeNum, u32 offset, u32 value);
    void Patch32(u32 nodeNum, u32 offset, u32 value);
    void Patch8(u32 nodeNum, u32 offset, u32 value);
};

// A tree of `records`, which are in ascending order. No records: an empty tree.
TreeImage BuildTree(const TreeShape& shape, const std::vector<TreeRecord>& records);

// `count` records with the keys NthDiskKey(fileId, 0 ..) and `dataSize` bytes of Pattern(n).
std::vector<TreeRecord> NthRecords(u32 fileId, u32 count, u32 dataSize);

// Bits of a map: nodes 0 .. used - 1 in use.
Bytes MapBits(u32 bytes, u32 firstNode, u32 usedNodes);

}  // namespace VELK::test
