// Hall: the header record of a tree.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"node0-zeroed", "The header node of the catalog is all zeros.",
     [](Specimen& s) { s.catalog.Header().Fill(0); }},
    {"node0-ones", "The header node of the catalog is all ones.",
     [](Specimen& s) { s.catalog.Header().Fill(0xFF); }},
    {"node0-kind", "The header node says that it is a leaf.",
     [](Specimen& s) { s.catalog.Header().Set8(kDescKind, 0xFF); }},
    {"node0-height", "The header node has height 1.",
     [](Specimen& s) { s.catalog.Header().Set8(kDescHeight, 1); }},
    {"node0-two-records", "The header node has two records.",
     [](Specimen& s) { s.catalog.Header().Set16(kDescNumRecords, 2); }},
    {"node0-header-slot", "The header record starts 2 bytes late.",
     [](Specimen& s) { s.catalog.Header().SetSlot(0, 16); }},
    {"depth-zero", "The depth is 0 though there is a root.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 0); }},
    {"depth-too-small", "The depth is one less than the height of the root.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 2); }},
    {"depth-too-large", "The depth is one more than the height of the root.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 4); }},
    {"depth-15", "The depth is 15, the most a path holds.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 15); }},
    {"depth-16", "The depth is 16: it opens, and cannot be searched.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 16); }},
    {"depth-17", "The depth is 17.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 17); }},
    {"depth-65535", "The depth is 65,535.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadTreeDepth, 65535); }},
    {"root-zero", "The root is node 0.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadRootNode, 0); }},
    {"root-is-leaf", "The root is the first leaf.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadRootNode, s.catalog.LeafNumber(0)); }},
    {"root-free", "The root is a free node.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadRootNode, s.catalog.FreeNumber()); }},
    {"root-behind-last", "The root is the number of nodes.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadRootNode, s.catalog.Image().totalNodes); }},
    {"root-largest", "The root is node 2^32 - 1.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadRootNode, 0xFFFFFFFF); }},
    {"leaf-records-zero", "The header counts no records, the tree has 22.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadLeafRecords, 0); }},
    {"leaf-records-one", "The header counts one record, the tree has 22.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadLeafRecords, 1); }},
    {"leaf-records-largest", "The header counts 2^32 - 1 records.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadLeafRecords, 0xFFFFFFFF); }},
    {"first-leaf-zero", "The first leaf is node 0.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFirstLeafNode, 0); }},
    {"first-leaf-second", "The first leaf is the second one.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFirstLeafNode, s.catalog.LeafNumber(1)); }},
    {"first-leaf-is-index", "The first leaf is an index node.",
     [](Specimen& s) {
         s.catalog.Header().Set32(kHeadFirstLeafNode, s.catalog.IndexNumber(2, 0));
     }},
    {"first-leaf-behind-last", "The first leaf is the number of nodes.",
     [](Specimen& s) {
         s.catalog.Header().Set32(kHeadFirstLeafNode, s.catalog.Image().totalNodes);
     }},
    {"last-leaf-zero", "The last leaf is node 0.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadLastLeafNode, 0); }},
    {"last-leaf-first", "The last leaf is the first one.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadLastLeafNode, s.catalog.LeafNumber(0)); }},
    {"last-leaf-behind-last", "The last leaf is the number of nodes.",
     [](Specimen& s) {
         s.catalog.Header().Set32(kHeadLastLeafNode, s.catalog.Image().totalNodes);
     }},
    {"node-size-zero", "The nodes have 0 bytes.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 0); }},
    {"node-size-256", "The nodes are smaller than the smallest node.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 256); }},
    {"node-size-doubled", "The nodes are said to have twice their size.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 1024); }},
    {"node-size-1536", "The node size is no power of two, but three blocks.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 1536); }},
    {"node-size-3000", "The node size is no whole number of blocks.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 3000); }},
    {"node-size-65535", "The node size is 65,535.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadNodeSize, 65535); }},
    {"max-key-zero", "The longest key of the catalog has 0 bytes.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadMaxKeyLength, 0); }},
    {"max-key-65535", "The longest key of the catalog has 65,535 bytes.",
     [](Specimen& s) { s.catalog.Header().Set16(kHeadMaxKeyLength, 65535); }},
    {"extents-max-key-9", "Index keys of the extents tree are said to have 9 bytes.",
     [](Specimen& s) { s.extents.Header().Set16(kHeadMaxKeyLength, 9); }},
    {"extents-max-key-65535", "Index keys of the extents tree are said to have 65,535 bytes.",
     [](Specimen& s) { s.extents.Header().Set16(kHeadMaxKeyLength, 65535); }},
    {"total-nodes-zero", "The tree has 0 nodes.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadTotalNodes, 0); }},
    {"total-nodes-too-few", "The tree has fewer nodes than are in use.",
     [](Specimen& s) {
         s.catalog.Header().Set32(kHeadTotalNodes, 10);
         s.catalog.Header().Set32(kHeadFreeNodes, 0);
     }},
    {"total-nodes-beyond-file", "The tree has one node more than fit into its file.",
     [](Specimen& s) {
         s.catalog.Header().Set32(kHeadTotalNodes, s.catalog.Image().totalNodes + 1);
     }},
    {"total-nodes-largest", "The tree has 2^32 - 1 nodes.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadTotalNodes, 0xFFFFFFFF); }},
    {"free-nodes-all", "All nodes are free.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFreeNodes, s.catalog.Image().totalNodes); }},
    {"free-nodes-zero", "No node is free, eight bits of the map are clear.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFreeNodes, 0); }},
    {"free-nodes-too-many", "Nine nodes are free, eight bits of the map are clear.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFreeNodes, 9); }},
    {"free-nodes-largest", "2^32 - 1 nodes are free.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadFreeNodes, 0xFFFFFFFF); }},
    {"type-unknown", "The type of the tree is 0x42.",
     [](Specimen& s) { s.catalog.Header().Set8(kHeadBtreeType, 0x42); }},
    {"key-compare-binary", "A volume of version 4 whose catalog names binary order.",
     [](Specimen& s) { s.catalog.Header().Set8(kHeadKeyCompareType, kKeyCompareBinary); }},
    {"big-keys-missing", "The catalog lacks the bit for 16-bit key lengths.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadAttributes, 4); }},
    {"variable-keys-missing", "The catalog lacks the bit for index keys of their own length.",
     [](Specimen& s) { s.catalog.Header().Set32(kHeadAttributes, 2); }},
    {"attributes-tree-masks", "The attributes tree lacks both key bits.",
     [](Specimen& s) { s.attributes.Header().Set32(kHeadAttributes, 0); }},
    {"extents-root-largest", "The root of the extents tree is node 2^32 - 1.",
     [](Specimen& s) { s.extents.Header().Set32(kHeadRootNode, 0xFFFFFFFF); }},
    {"attributes-node-size", "The nodes of the attributes tree are said to have half their size.",
     [](Specimen& s) { s.attributes.Header().Set16(kHeadNodeSize, 512); }},
};

}  // namespace

Hall TreeHeaderHall() {
    return {"Tree headers", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
