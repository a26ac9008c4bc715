// Reads a tree file as it lies on disk, without the engine, and says whether it is sound: every
// node reached once from the root, links, heights, separators, order of slots and keys, header
// counters and map bits.
#pragma once

#include <gtest/gtest.h>

#include <vector>

#include "tree_image.h"

namespace VELK::test {

struct FlatNode {
    u32 number = 0;
    u32 fLink = 0;
    u32 bLink = 0;
    s8 kind = 0;
    u32 height = 0;
    std::vector<Bytes> keys;  // without pad byte
    std::vector<Bytes> data;
};

struct FlatTree {
    u32 nodeSize = 0;
    u32 depth = 0;
    u32 root = 0;
    u32 leafRecords = 0;
    u32 firstLeaf = 0;
    u32 lastLeaf = 0;
    u32 totalNodes = 0;
    u32 freeNodes = 0;
    std::vector<std::vector<FlatNode>> levels;  // levels[1]: leaves from left to right
    std::vector<TreeRecord> records;            // of the leaves, in order
    std::string trouble;                        // empty: sound
};

FlatTree ReadFlat(const Bytes& file);
FlatNode ReadFlatNode(const Bytes& node, u32 number);

// Numbers of the nodes of one level, from left to right.
std::vector<u32> NumbersOf(const FlatTree& tree, u32 level);

inline ::testing::AssertionResult IsSound(const FlatTree& tree) {
    return tree.trouble.empty() ? ::testing::AssertionSuccess()
                                : ::testing::AssertionFailure() << tree.trouble;
}

inline bool operator==(const TreeRecord& a, const TreeRecord& b) {
    return a.key == b.key && a.data == b.data;
}

}  // namespace VELK::test
